#pragma once
// Sound sets on disk: a sound set is a folder of WAV files under the sounds root
// ("bells/ding.wav" is the file "ding" of the set "bells"). Durations are read from the
// files themselves.
//
// Pure functions over the file system; any thread.

#include <filesystem>
#include <map>
#include <stdexcept>
#include <string>

namespace robotsim {

class SoundFileError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The playing time of a sound file in seconds; raises SoundFileError when the file cannot
// be read as sound.
double soundFileDuration(const std::filesystem::path& file);

struct SoundFile {
  std::filesystem::path path;
  double duration = 0;  // seconds
};

struct SoundSet {
  std::map<std::string, SoundFile> files;       // name without ".wav" -> file
  std::map<std::string, std::string> rejected;  // file name -> reason
};

// The WAV files of a set folder (extension ".wav" in any case); raises SoundFileError when
// the folder does not exist.
SoundSet readSoundSet(const std::filesystem::path& folder);

}  // namespace robotsim
