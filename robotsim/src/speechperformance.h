#pragma once
// SpeechPerformance: one text of the speech engine as its synthesis produces it and its
// playback consumes it: the audio so far, the position of each bookmark, the end, and
// the stop request. The synthesis thread writes; the player thread waits on it; the
// thread that stops a text cancels it; the thread that ends a blocking-bookmark call
// releases the hold. One mutex and one condition variable guard it all.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace robotsim {

class SpeechPerformance {
 public:
  SpeechPerformance(std::size_t markCount, int sampleRate, bool keepAudio);

  std::size_t markCount() const noexcept { return fMarkCount; }
  int sampleRate() const noexcept { return fSampleRate; }

  // ---- synthesis ----
  bool isCancelled() const;
  void appendAudio(const std::int16_t* samples, std::size_t count);
  // Mark `index` lies at `sample`. Marks come in order; a mark that was skipped takes
  // the position of the next one reported, and a position never goes back.
  void reportMark(std::size_t index, std::uint64_t sample);
  // The text is `totalSamples` long; marks never reported lie at the end.
  void finish(std::uint64_t totalSamples);
  void fail(std::string error);
  // The marks that synthesis did not report itself (placed by reportMark or finish).
  std::vector<std::size_t> placedMarks() const;
  // A word begins at `sample`: bytes [offset, offset + length) of the caller's text.
  void reportWord(std::size_t offset, std::size_t length, std::uint64_t sample);
  struct Word {
    std::size_t offset = 0;
    std::size_t length = 0;
    std::uint64_t sample = 0;
  };
  // The words reported so far, in order.
  std::vector<Word> words() const;

  // ---- playback ----
  // Stops the text: wakes every wait and makes the synthesis give up.
  void cancel();
  // The position of mark `index` once known; nothing when the text is cancelled or its
  // synthesis failed first.
  std::optional<std::uint64_t> waitForMark(std::size_t index);
  // Waits until `samples` of audio are synthesised (or synthesis ended); answers how many
  // are, nothing when the text was cancelled first.
  std::optional<std::uint64_t> waitForAudio(std::uint64_t samples);
  // How much audio is synthesised so far (all of it once synthesis is done).
  std::uint64_t producedSamples() const;
  // The length of the text once synthesis is done; nothing as above.
  std::optional<std::uint64_t> waitForEnd();
  // Waits until `deadline`; false when the text was cancelled first.
  bool waitUntil(std::chrono::steady_clock::time_point deadline);
  // A hold at a blocking bookmark: begin it, release it from any thread, and wait for
  // the release (false when the text was cancelled first).
  std::uint64_t beginHold();
  void releaseHold(std::uint64_t hold);
  bool waitForRelease(std::uint64_t hold);

  std::string error() const;
  // The audio produced so far.
  std::vector<std::int16_t> audio() const;

 private:
  void xPlaceMarksUpTo(std::size_t end, std::uint64_t sample);

  const std::size_t fMarkCount;
  const int fSampleRate;
  const bool fKeepAudio;

  mutable std::mutex fMutex;
  std::condition_variable fChanged;
  bool fCancelled = false;
  bool fFinished = false;
  std::string fError;
  std::uint64_t fTotal = 0;
  std::uint64_t fProduced = 0;
  std::vector<std::uint64_t> fMarks;  // positions of the marks known so far, in order
  std::vector<std::size_t> fPlaced;
  std::vector<Word> fWords;
  std::vector<std::int16_t> fAudio;
  std::uint64_t fHolds = 0;
  std::uint64_t fReleased = 0;
};

}  // namespace robotsim
