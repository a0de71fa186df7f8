#pragma once
// DirectorTask: the last stage of the say pipeline. It hands the speech text of a job to
// the speech engine, then executes the job's actions strictly in list order, each when the
// speech engine reports its bookmark: animations through the behaviour manager, sounds
// through the audio player, calls of other services, body language modes, memory events.
// It drives the body talk around the animations and stops what still runs at the end.
//
// Threads. `process` runs in the thread of the say caller, one text at a time (the module's
// director lock). The speech engine's notifications arrive on the memory service's delivery
// threads (xOnBookmark, xOnSpeechStatus) and on the thread that serves its blocking
// "mrkpause" call (xBookmarkReached with blocking set); the behaviour manager's
// "behaviorStopped" signal on its delivery thread; `stop` on any thread, the module calling
// it with its text register's mutex held, so `stop` never waits for that mutex nor for the
// text to end.
//
// Locks, in the order they may be taken: the text register's mutex (the module's, around
// `stop`); `animationsMutex`; the job's `mutex`; the speech lock (`ttsMutex`, shared by the
// notifications, which leave it before they take a job's mutex); `soundsMutex` alone. The director
// takes the register's mutex (isMKIDStopped) only while it holds none of its own. A blocking
// "mrkpause" caller waits on its action's condition until the action has been executed, skipped or
// dropped by a stop; nothing else ends its wait.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <set>
#include <shared_mutex>
#include <string>
#include <vector>

#include <boost/signals2/signal.hpp>

#include "ko/session.hpp"
#include "ko/signal.hpp"
#include "mokuto/mktaskaction.h"
#include "mokuto/mktaskinstruction.h"

namespace ZU {

class MKIDRegister;
class MokutoTimeChecker;
class ZUBroker;
class ZURobotBodyTalk;
class ZUValue;
class ZUTextToSpeechProxy;
class ZUBehaviorManagerProxy;
class ZUAudioPlayerProxy;
class ZUMemoryProxy;
class ZUMotionProxy;
class ZUAutonomousMovesProxy;

// What became of one action of a text: the sync telemetry of the director.
struct DirectorActionReport {
  enum class Outcome {
    Executed,  // its bookmark came and the director ran it
    Skipped,   // its bookmark did not come in time (400 ms after the speech or a later one)
    Dropped,   // the text was stopped before the director ran it
  };

  MKID textId = 0;
  std::uint32_t bookmark = 0;
  // The type the action had when the director took it up ("^run" reads RUN here).
  MKTaskActionType type = UNKNOWN;
  Outcome outcome = Outcome::Executed;
  // ko::os::ustime() microseconds; -1 for what did not happen. For a skipped or dropped
  // action, endUs is when the director gave it up and beginUs is -1.
  std::int64_t bookmarkUs = -1;  // its bookmark arrived (the first report of it)
  std::int64_t beginUs = -1;     // the director took it up
  std::int64_t endUs = -1;       // its execution returned
  // The action itself, as the loader left it (its text carries an error code in front).
  std::shared_ptr<const MKTaskAction> action;
};

// Hears every action of every text, once, in list order. Called in the director's thread
// (the say caller's) outside every lock of the director; executed and skipped actions as
// they are dealt with, dropped ones when the text's list is over.
class DirectorObserver {
 public:
  virtual ~DirectorObserver() = default;
  virtual void onAction(const DirectorActionReport& report) = 0;
};

// The time in which the director waits for bookmarks: its rounds while the speech runs and
// the give-up of a missing bookmark. The real clock; tests put in a clock that they drive.
// Called in the director's thread with the job's mutex held by `lock`.
class DirectorClock {
 public:
  virtual ~DirectorClock() = default;
  // Waits on `condition` until it is notified or `duration` has passed on this clock
  // (std::cv_status::timeout); a spurious wake-up may count as a notification.
  virtual std::cv_status waitFor(std::condition_variable& condition,
                                 std::unique_lock<std::mutex>& lock,
                                 std::chrono::milliseconds duration);
};

class DirectorTask {
 public:
  // `bodyTalk` and `mkidRegister` belong to the module and outlive the director. Raises
  // ZUError (ZUMokuto::Constructor) "Module ZUTextToSpeech not found" without a speech
  // engine; the other services are reported and their calls fail (logged) later.
  DirectorTask(const std::shared_ptr<ZUBroker>& broker, ZURobotBodyTalk* bodyTalk,
               MKIDRegister& mkidRegister);
  ~DirectorTask();
  DirectorTask(const DirectorTask&) = delete;
  DirectorTask& operator=(const DirectorTask&) = delete;

  // The module "ZUMokuto" receives the speech engine's bookmark and status events, and the
  // director the behaviour manager's "behaviorStopped". Each failure is logged.
  void subscribeToEvents();
  // The reverse. Not to be called from one of those callbacks.
  void unsubscribeToEvents();

  // Speaks the job and executes its actions; returns when the speech is over and every
  // action was executed, skipped or dropped, after the end-of-text steps.
  void process(const std::shared_ptr<MKTaskInstruction>& instruction);
  // Stops the text `id` (-1: whatever text is spoken): its speech, its remaining actions
  // (a blocked "mrkpause" call returns), its animations and sounds. With another id, stops
  // only the running animations. Returns without waiting for the text to end.
  void stop(MKID id);

  // For the module's "_speechBookMarkCallback": the value of "ZUTextToSpeech/CurrentBookMark".
  void xOnBookmark(const ZUValue& value);
  // For the module's "_mrkpauseCallback" (blocking: returns once the action is done with)
  // and for xOnBookmark.
  void xBookmarkReached(std::int32_t id, bool blocking);
  // For the module's "_speechStatusCallback": the value of "ZUTextToSpeech/Status".
  void xOnSpeechStatus(const ZUValue& value);

  // Whether the speech engine is speaking the director's text (for the diagnosis).
  bool isTextToSpeechRunning();
  const std::shared_ptr<MokutoTimeChecker>& getTimeChecker() const noexcept { return timeChecker; }
  // Replaces the sync observer (null: none); a text keeps the one it began with.
  void setObserver(std::shared_ptr<DirectorObserver> observer);
  // Replaces the clock of the bookmark waits (null: the real one); a text keeps the one it
  // began with.
  void setClock(std::shared_ptr<DirectorClock> clock);

  // The path of every animation that this director started and that stopped; the module
  // connects the loader's onBehaviorStopped here.
  boost::signals2::signal<void(const std::string&)> behaviorStoppedSignal;

 private:
  struct Text;
  struct AnimationOrder {
    bool operator()(const MKAnimationAction& a, const MKAnimationAction& b) const noexcept;
  };
  struct RunningSound {
    MKSoundAction action;
    int playId = -1;
  };
  using AnimationLock = std::unique_lock<std::mutex>;

  std::shared_ptr<Text> xCurrentText() const;
  void xSetCurrentText(std::shared_ptr<Text> text);
  void xBookmarkReached(const std::shared_ptr<Text>& text, std::int32_t id, bool blocking);
  // Marks every action from the current one as dropped; with the job's mutex held.
  void xDropRemainingActions(Text& text);
  void xReport(Text& text, std::size_t index);
  void xReportDropped(Text& text);
  // isRunning(postId) under the shared speech lock; false when it fails.
  bool xIsSpeechRunning();
  void xEndOfText(Text& text);

  // ---- action execution ----
  void xDoAction(Text& text, const std::shared_ptr<MKTaskAction>& action);
  void xCall(const MKCallAction& call);
  void xSpeechStarted(const std::shared_ptr<Text>& text);
  void xStartAnimation(Text& text, const MKAnimationAction& action);
  // The waits and removals below are made with `animationsMutex` held by `lock`.
  // limitMs < 0: no limit (checked with isBehaviorRunning every 5 s).
  void xWaitAnimation(AnimationLock& lock, const std::string& path, MKTaskActionType type,
                      int limitMs);
  void xStopAnimation(AnimationLock& lock, const MKAnimationAction& entry);
  void xStopAnimationsBelow(AnimationLock& lock, MKTaskActionType limit);
  void xWaitTag(const std::string& tag);
  void xStopAllAnimations();
  void xOnBehaviorStopped(const std::string& path);
  bool xRemoveRunningAnimation(AnimationLock& lock, const std::string& path);
  void xPostStopBehavior(const std::string& path);
  void xSetMode(Text& text, BodyLanguageMode mode);
  void xDisableArmsBreathing();
  bool xArmsBreathingEnabled();
  void xPlayASound(const MKSoundAction& action);
  void xStopASound(const MKSoundAction& action);
  void xWaitASound(const MKSoundAction& action);
  void xStopAllSounds();
  void xNotifyAutonomousMoves(const std::string& tag);

  MKIDRegister& mkidRegister;
  ZURobotBodyTalk* const bodyTalk;
  const std::shared_ptr<ko::Session> fSession;

  std::shared_ptr<ZUTextToSpeechProxy> tts;
  std::shared_ptr<ZUBehaviorManagerProxy> behaviorManager;
  std::shared_ptr<ZUAudioPlayerProxy> audioPlayer;
  std::shared_ptr<ZUMemoryProxy> memory;
  std::shared_ptr<ZUMotionProxy> motion;
  std::shared_ptr<ZUAutonomousMovesProxy> autonomousMoves;  // the say caller's thread only
  ko::AnyObject behaviorManagerService;
  std::shared_ptr<MokutoTimeChecker> timeChecker;

  std::mutex fLinkMutex;
  ko::SignalLink fBehaviorStoppedLink = ko::kInvalidSignalLink;  // under fLinkMutex

  // The text being spoken (an empty one between texts); the pointer under fCurrentMutex,
  // which is taken alone.
  mutable std::mutex fCurrentMutex;
  std::shared_ptr<Text> currentText;

  std::shared_mutex ttsMutex;
  std::int32_t postId = -1;  // the posted say; exclusive ttsMutex to write, shared to read

  std::mutex fObserverMutex;
  std::shared_ptr<DirectorObserver> fObserver;  // under fObserverMutex
  std::shared_ptr<DirectorClock> fClock;        // under fObserverMutex, never null

  std::mutex animationsMutex;
  std::condition_variable animationsCondition;
  std::set<MKAnimationAction, AnimationOrder> runningAnimations;  // under animationsMutex

  std::mutex soundsMutex;
  std::vector<RunningSound> runningSounds;  // in start order, under soundsMutex

  std::mutex fBreathMutex;
  bool armsBreathingDisabled = false;  // under fBreathMutex
};

}  // namespace ZU
