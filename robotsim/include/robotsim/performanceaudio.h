#pragma once
// The whole audio of a performance, as a listener next to the robot heard it: what the
// speech engine played and every sound of the audio player, mixed at the times they
// played on the robot's timeline. Sounds are resampled to the speech's rate, stopped
// sounds cut where they stopped, and the sum is clipped to the sample range.
//
// Plain values and pure functions (they read the sound files): any thread.

#include <cstdint>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace robotsim {

class Robot;

class PerformanceAudioError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// One track to mix, its times in microseconds on the timeline.
struct PerformanceSpeech {
  int sampleRate = 0;
  std::vector<std::int16_t> samples;
  std::optional<std::int64_t> startUs;  // nothing: no speech was played
};

struct PerformanceSound {
  std::filesystem::path file;
  double position = 0;  // seconds into the file
  double volume = 1;
  bool loop = false;
  std::int64_t startUs = 0;
  std::optional<std::int64_t> endUs;  // nothing while it plays
};

struct PerformanceAudio {
  int sampleRate = 0;
  std::vector<std::int16_t> samples;  // mono
  double seconds() const {
    return sampleRate > 0 ? static_cast<double>(samples.size()) / sampleRate : 0.0;
  }
};

// The audio from `fromUs` to the end of the last thing heard, and at least to `toUs`. A
// sound still playing lasts its file's length (a loop, to `toUs`). A sound file that
// cannot be read is left out and named in `skipped` (when given).
PerformanceAudio mixPerformanceAudio(const PerformanceSpeech& speech,
                                     const std::vector<PerformanceSound>& sounds,
                                     std::int64_t fromUs, std::int64_t toUs,
                                     std::vector<std::string>* skipped = nullptr);

// The same from the robot's speech engine and audio player, on its timeline.
PerformanceAudio mixPerformanceAudio(const Robot& robot, std::int64_t fromUs, std::int64_t toUs,
                                     std::vector<std::string>* skipped = nullptr);

// The audio as a WAV file (16-bit PCM, mono), or its bytes; raises PerformanceAudioError.
void writeWav(const PerformanceAudio& audio, const std::filesystem::path& path);
std::string wavBytes(const PerformanceAudio& audio);

}  // namespace robotsim
