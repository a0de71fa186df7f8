#pragma once
// SpeechRecording: everything the speech engine played, as one mono 16-bit track at the
// synthesis rate: each text's audio with the silences of its blocking bookmarks, and the
// silences between texts. Silences are kept as lengths, not samples. Thread-safe.

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

namespace robotsim {

class SpeechRecording {
 public:
  explicit SpeechRecording(int sampleRate) : fSampleRate(sampleRate) {}

  int sampleRate() const noexcept { return fSampleRate; }

  // A played text: its first `length` samples of `audio` (silence past the end of the
  // audio), with `holds` (position, silence length) inserted at their positions.
  void appendText(const std::vector<std::int16_t>& audio, std::uint64_t length,
                  const std::vector<std::pair<std::uint64_t, std::uint64_t>>& holds);
  void appendSilence(std::uint64_t length);
  std::uint64_t length() const;
  // When the first sample played: the player sets it as the first text begins (later
  // calls change nothing until clear).
  void setStart(std::chrono::steady_clock::time_point start);
  std::optional<std::chrono::steady_clock::time_point> start() const;
  // Every sample, the silences written out.
  std::vector<std::int16_t> samples() const;
  void clear();
  // Raises std::runtime_error with libsndfile's reason when the file cannot be written.
  void writeWav(const std::filesystem::path& path) const;

 private:
  struct Segment {
    std::vector<std::int16_t> audio;  // empty: a silence
    std::uint64_t silence = 0;
  };
  void xAppendSilence(std::uint64_t length);

  const int fSampleRate;
  mutable std::mutex fMutex;
  std::vector<Segment> fSegments;
  std::uint64_t fLength = 0;
  std::optional<std::chrono::steady_clock::time_point> fStart;
};

}  // namespace robotsim
