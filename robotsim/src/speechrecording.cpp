#include "speechrecording.h"

#include <sndfile.h>

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>

namespace robotsim {

void SpeechRecording::xAppendSilence(std::uint64_t length) {
  if (length == 0)
    return;
  if (!fSegments.empty() && fSegments.back().audio.empty())
    fSegments.back().silence += length;
  else
    fSegments.push_back(Segment{{}, length});
  fLength += length;
}

void SpeechRecording::appendText(
    const std::vector<std::int16_t>& audio, std::uint64_t length,
    const std::vector<std::pair<std::uint64_t, std::uint64_t>>& holds) {
  std::lock_guard lock(fMutex);
  std::uint64_t at = 0;
  auto appendAudio = [&](std::uint64_t end) {
    end = std::min(end, length);
    if (end <= at)
      return;
    const std::uint64_t available = std::min<std::uint64_t>(end, audio.size());
    if (available > at) {
      fSegments.push_back(
          Segment{std::vector<std::int16_t>(audio.begin() + static_cast<std::ptrdiff_t>(at),
                                            audio.begin() + static_cast<std::ptrdiff_t>(available)),
                  0});
      fLength += available - at;
    }
    if (end > std::max(available, at))
      xAppendSilence(end - std::max(available, at));
    at = end;
  };
  for (const auto& [position, silence] : holds) {
    appendAudio(position);
    xAppendSilence(silence);
  }
  appendAudio(length);
}

void SpeechRecording::appendSilence(std::uint64_t length) {
  std::lock_guard lock(fMutex);
  xAppendSilence(length);
}

std::uint64_t SpeechRecording::length() const {
  std::lock_guard lock(fMutex);
  return fLength;
}

void SpeechRecording::setStart(std::chrono::steady_clock::time_point start) {
  std::lock_guard lock(fMutex);
  if (!fStart)
    fStart = start;
}

std::optional<std::chrono::steady_clock::time_point> SpeechRecording::start() const {
  std::lock_guard lock(fMutex);
  return fStart;
}

std::vector<std::int16_t> SpeechRecording::samples() const {
  std::lock_guard lock(fMutex);
  std::vector<std::int16_t> out;
  out.reserve(fLength);
  for (const auto& segment : fSegments) {
    if (segment.audio.empty())
      out.insert(out.end(), segment.silence, 0);
    else
      out.insert(out.end(), segment.audio.begin(), segment.audio.end());
  }
  return out;
}

void SpeechRecording::clear() {
  std::lock_guard lock(fMutex);
  fSegments.clear();
  fLength = 0;
  fStart.reset();
}

void SpeechRecording::writeWav(const std::filesystem::path& path) const {
  SF_INFO info{};
  info.samplerate = fSampleRate;
  info.channels = 1;
  info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
  std::unique_ptr<SNDFILE, int (*)(SNDFILE*)> file(sf_open(path.c_str(), SFM_WRITE, &info),
                                                   &sf_close);
  if (!file)
    throw std::runtime_error("cannot write " + path.string() + ": " + sf_strerror(nullptr));
  const std::vector<std::int16_t> zeros(4096, 0);
  std::lock_guard lock(fMutex);
  for (const auto& segment : fSegments) {
    if (!segment.audio.empty()) {
      sf_write_short(file.get(), segment.audio.data(),
                     static_cast<sf_count_t>(segment.audio.size()));
      continue;
    }
    for (std::uint64_t left = segment.silence; left > 0;) {
      const std::uint64_t n = std::min<std::uint64_t>(left, zeros.size());
      sf_write_short(file.get(), zeros.data(), static_cast<sf_count_t>(n));
      left -= n;
    }
  }
}

}  // namespace robotsim
