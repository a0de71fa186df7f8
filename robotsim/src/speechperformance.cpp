#include "speechperformance.h"

#include <algorithm>
#include <utility>

namespace robotsim {

SpeechPerformance::SpeechPerformance(std::size_t markCount, int sampleRate, bool keepAudio)
    : fMarkCount(markCount), fSampleRate(sampleRate), fKeepAudio(keepAudio) {
  fMarks.reserve(markCount);
}

bool SpeechPerformance::isCancelled() const {
  std::lock_guard lock(fMutex);
  return fCancelled;
}

void SpeechPerformance::appendAudio(const std::int16_t* samples, std::size_t count) {
  if (count == 0)
    return;
  {
    std::lock_guard lock(fMutex);
    fProduced += count;
    if (fKeepAudio)
      fAudio.insert(fAudio.end(), samples, samples + count);
  }
  fChanged.notify_all();
}

void SpeechPerformance::xPlaceMarksUpTo(std::size_t end, std::uint64_t sample) {
  while (fMarks.size() < end && fMarks.size() < fMarkCount) {
    fPlaced.push_back(fMarks.size());
    fMarks.push_back(sample);
  }
}

void SpeechPerformance::reportMark(std::size_t index, std::uint64_t sample) {
  {
    std::lock_guard lock(fMutex);
    if (index < fMarks.size() || index >= fMarkCount || fFinished)
      return;
    if (!fMarks.empty())
      sample = std::max(sample, fMarks.back());
    xPlaceMarksUpTo(index, sample);
    fMarks.push_back(sample);
  }
  fChanged.notify_all();
}

void SpeechPerformance::finish(std::uint64_t totalSamples) {
  {
    std::lock_guard lock(fMutex);
    if (fFinished)
      return;
    if (!fMarks.empty())
      totalSamples = std::max(totalSamples, fMarks.back());
    xPlaceMarksUpTo(fMarkCount, totalSamples);
    fTotal = totalSamples;
    fProduced = std::max(fProduced, totalSamples);
    fFinished = true;
  }
  fChanged.notify_all();
}

void SpeechPerformance::fail(std::string error) {
  {
    std::lock_guard lock(fMutex);
    if (fFinished)
      return;
    fError = std::move(error);
    fFinished = true;
  }
  fChanged.notify_all();
}

std::vector<std::size_t> SpeechPerformance::placedMarks() const {
  std::lock_guard lock(fMutex);
  return fPlaced;
}

void SpeechPerformance::reportWord(std::size_t offset, std::size_t length, std::uint64_t sample) {
  std::lock_guard lock(fMutex);
  fWords.push_back(Word{offset, length, sample});
}

std::vector<SpeechPerformance::Word> SpeechPerformance::words() const {
  std::lock_guard lock(fMutex);
  return fWords;
}

void SpeechPerformance::cancel() {
  {
    std::lock_guard lock(fMutex);
    fCancelled = true;
  }
  fChanged.notify_all();
}

std::optional<std::uint64_t> SpeechPerformance::waitForMark(std::size_t index) {
  std::unique_lock lock(fMutex);
  fChanged.wait(lock, [&] { return fCancelled || fMarks.size() > index || fFinished; });
  if (fCancelled || index >= fMarks.size())
    return std::nullopt;
  return fMarks[index];
}

std::optional<std::uint64_t> SpeechPerformance::waitForAudio(std::uint64_t samples) {
  std::unique_lock lock(fMutex);
  fChanged.wait(lock, [&] { return fCancelled || fFinished || fProduced >= samples; });
  if (fCancelled)
    return std::nullopt;
  return fProduced;
}

std::uint64_t SpeechPerformance::producedSamples() const {
  std::lock_guard lock(fMutex);
  return fProduced;
}

std::optional<std::uint64_t> SpeechPerformance::waitForEnd() {
  std::unique_lock lock(fMutex);
  fChanged.wait(lock, [&] { return fCancelled || fFinished; });
  if (fCancelled || !fError.empty())
    return std::nullopt;
  return fTotal;
}

bool SpeechPerformance::waitUntil(std::chrono::steady_clock::time_point deadline) {
  std::unique_lock lock(fMutex);
  return !fChanged.wait_until(lock, deadline, [&] { return fCancelled; });
}

std::uint64_t SpeechPerformance::beginHold() {
  std::lock_guard lock(fMutex);
  return ++fHolds;
}

void SpeechPerformance::releaseHold(std::uint64_t hold) {
  {
    std::lock_guard lock(fMutex);
    fReleased = std::max(fReleased, hold);
  }
  fChanged.notify_all();
}

bool SpeechPerformance::waitForRelease(std::uint64_t hold) {
  std::unique_lock lock(fMutex);
  fChanged.wait(lock, [&] { return fCancelled || fReleased >= hold; });
  return fReleased >= hold;
}

std::string SpeechPerformance::error() const {
  std::lock_guard lock(fMutex);
  return fError;
}

std::vector<std::int16_t> SpeechPerformance::audio() const {
  std::lock_guard lock(fMutex);
  return fAudio;
}

}  // namespace robotsim
