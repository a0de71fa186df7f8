#include "speechplayer.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <optional>
#include <utility>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"

namespace robotsim {

namespace {

using SteadyClock = std::chrono::steady_clock;

std::int64_t microseconds(SteadyClock::duration d) {
  return std::chrono::duration_cast<std::chrono::microseconds>(d).count();
}

}  // namespace

SpeechPlayer::SpeechPlayer(SpeechPlayerListener& listener, double playbackRate,
                           std::shared_ptr<SpeechRecording> recording)
    : fListener(listener),
      fRate(std::isfinite(playbackRate) && playbackRate > 0 ? playbackRate : 0.0),
      fRecording(std::move(recording)),
      fNotifier([this] { xRunNotifier(); }),
      fThread([this] { xRun(); }) {}

SpeechPlayer::~SpeechPlayer() {
  shutdown();
}

void SpeechPlayer::shutdown() {
  std::lock_guard shutdownLock(fShutdownMutex);
  {
    std::lock_guard lock(fMutex);
    fQuit = true;
  }
  stopAll();
  fQueued.notify_all();
  if (fThread.joinable())
    fThread.join();
  // The notifier tells what is left, then leaves; later news is told by whoever has it.
  {
    std::lock_guard lock(fNotifyMutex);
    fNotifyQuit = true;
  }
  fNotifyQueued.notify_all();
  if (fNotifier.joinable())
    fNotifier.join();
}

void SpeechPlayer::xNotify(std::function<void()> job) {
  {
    std::lock_guard lock(fNotifyMutex);
    if (!fNotifierGone) {
      fNotifications.push_back(std::move(job));
      job = nullptr;
    }
  }
  if (job)
    xRunNotification(job);
  else
    fNotifyQueued.notify_one();
}

void SpeechPlayer::xNotifyNow(std::function<void()> job) {
  {
    std::lock_guard lock(fNotifyMutex);
    if (!fNotifierGone) {
      if (fNotifying || !fNotifications.empty()) {
        fNotifications.push_back(std::move(job));
        fNotifyQueued.notify_one();
        return;
      }
      fNotifying = true;
    }
  }
  xRunNotification(job);
  {
    std::lock_guard lock(fNotifyMutex);
    fNotifying = false;
  }
  // News queued meanwhile waits for the notifier.
  fNotifyQueued.notify_one();
}

void SpeechPlayer::xRunNotification(const std::function<void()>& job) noexcept {
  try {
    job();
  } catch (const std::exception& e) {
    KO_LOG_ERROR("robotsim.texttospeech") << "A speech listener threw: " << e.what();
  } catch (...) {
    KO_LOG_ERROR("robotsim.texttospeech") << "A speech listener threw an unknown exception";
  }
}

void SpeechPlayer::xRunNotifier() {
  const ko::FrameworkThreadScope framework;
  const ko::os::RealtimeScope realtime;
  for (;;) {
    std::function<void()> job;
    {
      std::unique_lock lock(fNotifyMutex);
      fNotifyQueued.wait(
          lock, [this] { return !fNotifying && (fNotifyQuit || !fNotifications.empty()); });
      if (fNotifications.empty()) {
        fNotifierGone = true;
        return;
      }
      job = std::move(fNotifications.front());
      fNotifications.pop_front();
      fNotifying = true;
    }
    xRunNotification(job);
    std::lock_guard lock(fNotifyMutex);
    fNotifying = false;
  }
}

void SpeechPlayer::enqueue(std::shared_ptr<SpeechUtterance> utterance) {
  {
    std::lock_guard lock(fMutex);
    if (!fQuit) {
      fQueue.push_back(std::move(utterance));
      utterance.reset();
    }
  }
  if (utterance) {
    utterance->performance->cancel();
    xEnd(utterance, true, 0, {});
    return;
  }
  fQueued.notify_one();
}

bool SpeechPlayer::stop(int id) {
  std::shared_ptr<SpeechUtterance> queued;
  {
    std::lock_guard lock(fMutex);
    if (fCurrent && fCurrent->id == id) {
      fCurrent->performance->cancel();
      return true;
    }
    const auto it =
        std::find_if(fQueue.begin(), fQueue.end(), [id](const auto& u) { return u->id == id; });
    if (it == fQueue.end())
      return false;
    queued = std::move(*it);
    fQueue.erase(it);
  }
  queued->performance->cancel();
  xEnd(queued, true, 0, {});
  return true;
}

void SpeechPlayer::stopAll() {
  std::deque<std::shared_ptr<SpeechUtterance>> queued;
  {
    std::lock_guard lock(fMutex);
    if (fCurrent)
      fCurrent->performance->cancel();
    queued.swap(fQueue);
  }
  for (const auto& u : queued) {
    u->performance->cancel();
    xEnd(u, true, 0, {});
  }
}

void SpeechPlayer::xRun() {
  const ko::FrameworkThreadScope framework;
  // An audio thread: a busy machine delays its bookmarks as little as it may.
  const ko::os::RealtimeScope realtime;
  for (;;) {
    std::shared_ptr<SpeechUtterance> utterance;
    {
      std::unique_lock lock(fMutex);
      fQueued.wait(lock, [this] { return fQuit || !fQueue.empty(); });
      if (fQueue.empty())
        return;
      utterance = fQueue.front();
      fQueue.pop_front();
      fCurrent = utterance;
    }
    if (utterance->performance->isCancelled())
      xEnd(utterance, true, 0, {});
    else
      xPlay(utterance);
    std::lock_guard lock(fMutex);
    fCurrent.reset();
  }
}

void SpeechPlayer::xPlay(const std::shared_ptr<SpeechUtterance>& shared) {
  SpeechUtterance& utterance = *shared;
  SpeechPerformance& performance = *utterance.performance;
  const std::int64_t hz = performance.sampleRate();
  const bool realTime = fRate > 0;
  auto audioUs = [hz](std::uint64_t sample) {
    return static_cast<std::int64_t>(sample) * 1'000'000 / hz;
  };
  auto samplesOf = [hz](std::int64_t us) {
    return static_cast<std::uint64_t>(std::max<std::int64_t>(us, 0) * hz / 1'000'000);
  };
  auto deadline = [this](SteadyClock::time_point origin, std::int64_t us) {
    return origin +
           std::chrono::microseconds(static_cast<std::int64_t>(static_cast<double>(us) / fRate));
  };
  auto clockUs = [this](SteadyClock::time_point origin) {
    return static_cast<std::int64_t>(
        static_cast<double>(microseconds(SteadyClock::now() - origin)) * fRate);
  };

  if (fRecording && realTime && fLastEnd != SteadyClock::time_point{})
    fRecording->appendSilence(samplesOf(clockUs(fLastEnd)));

  // Like a sound card, playback begins once some audio is there, and its clock stands
  // still whenever synthesis falls behind it.
  if (!performance.waitForAudio(static_cast<std::uint64_t>(hz) / 10)) {
    xEnd(shared, true, 0, {});
    return;
  }
  xNotify([this, shared] { fListener.onStarted(*shared); });
  SteadyClock::time_point origin = SteadyClock::now();
  if (fRecording)
    fRecording->setStart(origin);
  std::vector<std::pair<std::uint64_t, std::uint64_t>> holds;
  bool stopped = false;
  std::string error;
  // Tells the words that begin before `sample` (all of them for none), each when playback
  // reaches it; false when the text was stopped meanwhile.
  std::size_t wordsTold = 0;
  auto playWordsBefore = [&](std::optional<std::uint64_t> sample) {
    const auto words = performance.words();
    for (; wordsTold < words.size(); ++wordsTold) {
      const SpeechPerformance::Word& word = words[wordsTold];
      if (sample && word.sample >= *sample)
        break;
      const std::int64_t wordUs = audioUs(word.sample);
      if (realTime && !performance.waitUntil(deadline(origin, wordUs)))
        return false;
      const std::int64_t playbackUs = realTime ? clockUs(origin) : wordUs;
      xNotify([this, shared, word, wordUs, playbackUs] {
        fListener.onWord(*shared, word, wordUs, playbackUs);
      });
    }
    return true;
  };

  for (std::size_t i = 0; i < utterance.script.marks.size(); ++i) {
    const SpeechMark& mark = utterance.script.marks[i];
    const std::int64_t audioBefore = audioUs(performance.producedSamples());
    const std::int64_t clockBefore = clockUs(origin);
    const auto position = performance.waitForMark(i);
    if (realTime) {
      const std::int64_t stall = clockUs(origin) - std::max(audioBefore, clockBefore);
      if (stall > 0 && clockUs(origin) > audioBefore)
        origin += std::chrono::microseconds(
            static_cast<std::int64_t>(static_cast<double>(stall) / fRate));
    }
    if (!position) {
      stopped = performance.isCancelled();
      if (!stopped)
        error = performance.error();
      break;
    }
    SpeechMarkRecord record{mark.number, mark.blocking, audioUs(*position), 0, 0};
    if (!playWordsBefore(*position)) {
      stopped = true;
      break;
    }
    if (realTime) {
      record.dueUs = microseconds(deadline(origin, record.audioUs).time_since_epoch());
      if (!performance.waitUntil(deadline(origin, record.audioUs))) {
        stopped = true;
        break;
      }
      record.playbackUs = clockUs(origin);
    } else {
      record.playbackUs = record.audioUs;
    }

    bool released = true;
    if (mark.blocking) {
      const std::uint64_t hold = performance.beginHold();
      const auto holdStart = SteadyClock::now();
      xNotify([this, shared, hold, number = mark.number] {
        fListener.onBlockingBookmark(*shared, number)
            .then([synthesis = shared->performance, hold](const ko::Future<void>&) {
              synthesis->releaseHold(hold);
            });
      });
      released = performance.waitForRelease(hold);
      const auto held = SteadyClock::now() - holdStart;
      record.heldUs = microseconds(held);
      if (realTime)
        origin += held;
      holds.emplace_back(*position, samplesOf(record.heldUs));
    } else {
      xNotifyNow([this, shared, number = mark.number] { fListener.onBookmark(*shared, number); });
    }
    utterance.marks.push_back(record);
    xNotify([this, shared, record] { fListener.onMarkDone(*shared, record); });
    if (!released) {
      stopped = true;
      break;
    }
  }

  std::int64_t totalUs = -1;
  if (!stopped && error.empty()) {
    if (const auto total = performance.waitForEnd()) {
      totalUs = audioUs(*total);
      if (!playWordsBefore(std::nullopt) ||
          (realTime && !performance.waitUntil(deadline(origin, totalUs))))
        stopped = true;
    } else if (performance.isCancelled()) {
      stopped = true;
    } else {
      error = performance.error();
    }
  }
  std::int64_t playedUs = realTime ? clockUs(origin) : std::max<std::int64_t>(totalUs, 0);
  if (totalUs >= 0)
    playedUs = std::min(playedUs, totalUs);

  if (fRecording)
    fRecording->appendText(performance.audio(), samplesOf(playedUs), holds);
  xEnd(shared, stopped, playedUs, error);
  fLastEnd = SteadyClock::now();
}

void SpeechPlayer::xEnd(const std::shared_ptr<SpeechUtterance>& utterance, bool stopped,
                        std::int64_t playedUs, const std::string& error) {
  xNotify([this, utterance, stopped, playedUs, error] {
    // The text ends for its caller whatever the listener does.
    xRunNotification([&] { fListener.onEnded(*utterance, stopped, playedUs, error); });
    if (error.empty())
      utterance->ended.trySetValue(stopped);
    else
      utterance->ended.trySetError(error);
  });
}

}  // namespace robotsim
