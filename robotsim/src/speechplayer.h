#pragma once
// SpeechPlayer: plays the speech engine's texts one after the other on a silent output,
// with a real-time playback clock, and reaches each bookmark at its audio time.
//
// One thread of its own plays; it sleeps until each mark's deadline on the steady clock,
// then hands the news to a second thread, the notifier, which tells the listener in
// order, so that the time of the next mark never waits for a listener. A bookmark passed,
// whose news is awaited the most and which the listener only queues as an event, the
// player tells itself when the notifier has nothing before it: one thread less between
// the audio and the bookmark's event, in the same order. At a blocking mark the player
// stops its clock until the notifier's hold is released. Both threads run at the
// framework's real-time priority (ko/os.hpp), and are framework threads (ko/reaper.hpp).
// A listener that throws
// is logged; the notifier goes on. Any thread may queue a text or stop one; a text queued
// after the shutdown ends at once, stopped, and is told in the queuing thread.

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "ko/future.hpp"
#include "robotsim/speechscript.h"
#include "speechperformance.h"
#include "speechrecording.h"

namespace robotsim {

// One text queued for playback.
struct SpeechUtterance {
  SpeechUtterance(int textId, std::string spoken, SpeechScript parsed,
                  std::shared_ptr<SpeechPerformance> synthesis)
      : id(textId),
        text(std::move(spoken)),
        script(std::move(parsed)),
        performance(std::move(synthesis)) {}

  const int id;
  const std::string text;
  const SpeechScript script;
  const std::shared_ptr<SpeechPerformance> performance;
  // Set by the player when the text ends: whether it was stopped, or the synthesis error.
  ko::Promise<bool> ended;
  // Written by the player before `ended` is set.
  std::vector<SpeechMarkRecord> marks;
};

// What the player tells, in order, from its notifier thread.
class SpeechPlayerListener {
 public:
  virtual ~SpeechPlayerListener() = default;
  virtual void onStarted(const SpeechUtterance& utterance) = 0;
  // A "mrk" mark is reached.
  virtual void onBookmark(const SpeechUtterance& utterance, std::int32_t number) = 0;
  // A "mrkpause" mark is reached: starts the blocking call; the speech holds until the
  // future finishes or the text is stopped.
  virtual ko::Future<void> onBlockingBookmark(const SpeechUtterance& utterance,
                                              std::int32_t number) = 0;
  // After each mark is dealt with (after the hold of a blocking one).
  virtual void onMarkDone(const SpeechUtterance& utterance, const SpeechMarkRecord& record) = 0;
  // Playback reached a word: its audio time and the playback clock's time.
  virtual void onWord(const SpeechUtterance& utterance, const SpeechPerformance::Word& word,
                      std::int64_t audioUs, std::int64_t playbackUs) = 0;
  virtual void onEnded(const SpeechUtterance& utterance, bool stopped, std::int64_t playedUs,
                       const std::string& error) = 0;
};

class SpeechPlayer {
 public:
  // `playbackRate`: 1 real time, 2 twice as fast; infinite (or 0) plays without waiting.
  // `recording` may be null.
  SpeechPlayer(SpeechPlayerListener& listener, double playbackRate,
               std::shared_ptr<SpeechRecording> recording);
  // As shutdown().
  ~SpeechPlayer();
  SpeechPlayer(const SpeechPlayer&) = delete;
  SpeechPlayer& operator=(const SpeechPlayer&) = delete;

  void enqueue(std::shared_ptr<SpeechUtterance> utterance);
  // Stops the text `id`, playing or queued; false when there is none.
  bool stop(int id);
  void stopAll();
  // Stops every text, tells what is left and joins both threads. Idempotent; not from a
  // listener.
  void shutdown();

 private:
  void xRun();
  void xRunNotifier();
  void xNotify(std::function<void()> job);
  // In this thread when no news is queued or being told, else as xNotify.
  void xNotifyNow(std::function<void()> job);
  static void xRunNotification(const std::function<void()>& job) noexcept;
  void xPlay(const std::shared_ptr<SpeechUtterance>& utterance);
  void xEnd(const std::shared_ptr<SpeechUtterance>& utterance, bool stopped, std::int64_t playedUs,
            const std::string& error);

  SpeechPlayerListener& fListener;
  const double fRate;  // 0: as fast as possible
  const std::shared_ptr<SpeechRecording> fRecording;

  std::mutex fMutex;
  std::condition_variable fQueued;
  std::deque<std::shared_ptr<SpeechUtterance>> fQueue;
  std::shared_ptr<SpeechUtterance> fCurrent;
  bool fQuit = false;
  // The player thread's only: when the last text ended, for the silence between texts.
  std::chrono::steady_clock::time_point fLastEnd{};

  std::mutex fNotifyMutex;
  std::condition_variable fNotifyQueued;
  std::deque<std::function<void()>> fNotifications;
  bool fNotifyQuit = false;
  bool fNotifierGone = false;
  bool fNotifying = false;  // news is being told, by the notifier or by xNotifyNow
  std::mutex fShutdownMutex;
  std::thread fNotifier;
  std::thread fThread;
};

}  // namespace robotsim
