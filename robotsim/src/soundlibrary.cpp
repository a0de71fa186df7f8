#include "robotsim/soundlibrary.h"

#include <algorithm>
#include <cctype>
#include <memory>
#include <system_error>

#include <sndfile.h>

namespace robotsim {

namespace fs = std::filesystem;

namespace {
bool isWav(const fs::path& file) {
  std::string extension = file.extension().string();
  std::transform(extension.begin(), extension.end(), extension.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return extension == ".wav";
}
}  // namespace

double soundFileDuration(const fs::path& file) {
  SF_INFO info{};
  std::unique_ptr<SNDFILE, int (*)(SNDFILE*)> sound(sf_open(file.c_str(), SFM_READ, &info),
                                                    &sf_close);
  if (!sound)
    throw SoundFileError(file.string() + ": " + sf_strerror(nullptr));
  if (info.samplerate <= 0 || info.frames < 0)
    throw SoundFileError(file.string() + ": no sample rate");
  return static_cast<double>(info.frames) / static_cast<double>(info.samplerate);
}

SoundSet readSoundSet(const fs::path& folder) {
  std::error_code ec;
  if (!fs::is_directory(folder, ec))
    throw SoundFileError(folder.string() + " is not a folder");
  SoundSet set;
  for (fs::directory_iterator it(folder, ec), end; !ec && it != end; it.increment(ec)) {
    if (!isWav(it->path()) || !it->is_regular_file(ec))
      continue;
    try {
      set.files[it->path().stem().string()] = SoundFile{it->path(), soundFileDuration(it->path())};
    } catch (const SoundFileError& e) {
      set.rejected[it->path().filename().string()] = e.what();
    }
  }
  return set;
}

}  // namespace robotsim
