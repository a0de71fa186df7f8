#pragma once
// ZURobotBodyTalk: the body talk, the automatic head and arm movements that keep the robot
// gently moving while it speaks (or listens). One controller per process, shared through
// getInstance/releaseInstance (the module holds a ZURobotBodyTalkInstance). It owns the
// posture watcher, four body parts (a head and arms for speaking, a head and arms for
// listening) and two workers, one driving a head and one driving arms, and switches the
// workers between the speaking and the listening parts.
//
// The director starts, prepares, pauses, resumes and stops it around each text and
// forwards the behaviour manager's "behaviorStopped" notifications; the loader hands in
// the arms' animation lists; the module reads the posture family through it.
//
// Threads: every operation may be called from any thread (the director's, the loader's,
// the module's, the notification thread). start, prepare, pause, resume, stop,
// onBehaviorStopped and the destruction are serialised by the controller lock and wait
// for a worker's iteration in progress to end (a stop ends the gesture in progress
// first); the other operations take no controller lock. The workers run on the threads of
// an event loop of their own (two threads), the arms' preloads on the process-wide loop.
// getInstance and releaseInstance guard the instance with one global mutex.

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "ko/eventloop.hpp"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "zu/enums.h"

namespace ZU {

class ZUBroker;
class ZURobotModelProxy;
class ZURobotBodyTalkThread;
class ZURobotBodyTalkHeadSpeaking;
class ZURobotBodyTalkHeadListening;
class ZURobotBodyTalkArms;

// Which workers start: every caller of this program passes both.
struct ZURobotBodyTalkParts {
  bool arms = true;
  bool head = true;
};

struct ZURobotBodyTalkOptions {
  // Multiplies every rest, wait and limit of the body talk: 1.0 on the robot, smaller to
  // run it faster (the head moves and the animations keep their own durations).
  double timeScale = 1.0;
  // The loop the two workers run on; a loop of their own with two threads when null. Each
  // worker holds a thread of it for a whole gesture: with fewer than two, one waits for the
  // other.
  std::shared_ptr<ko::EventLoop> eventLoop;
};

class ZURobotBodyTalk {
 public:
  using Mode = std::int32_t;
  static constexpr Mode kSpeaking = 0;
  static constexpr Mode kListening = 1;

  // Counts one more user of the process's controller, creating it on the first call with
  // that broker and those options (later calls ignore theirs).
  static ZURobotBodyTalk* getInstance(const std::shared_ptr<ZUBroker>& broker,
                                      const ZURobotBodyTalkOptions& options = {});
  // Counts one user less; the last one destroys the controller (stopping it first). A
  // release without a user is logged and changes nothing.
  static void releaseInstance();
  // The number of users of the process's controller; 0 when there is none.
  static int getInstanceCount();

  ZURobotBodyTalk(const ZURobotBodyTalk&) = delete;
  ZURobotBodyTalk& operator=(const ZURobotBodyTalk&) = delete;

  // Starts the workers of the mode's parts (kSpeaking or kListening; another mode keeps
  // the parts attached) that `parts` enables, the head at once when speaking. While it
  // runs, only a `restart` stops it and starts it again; otherwise nothing changes.
  void start(Mode mode, ZURobotBodyTalkParts parts, bool restart);
  // As start, but leaves the workers stopped and the body talk paused: resume starts them.
  void prepare(Mode mode, ZURobotBodyTalkParts parts, bool restart);
  // Stops the workers, to be resumed; nothing when not running.
  void pause();
  // Starts the paused workers again, with the same mode and parts, in the posture the
  // robot now has; nothing unless paused.
  void resume();
  // Stops the workers; neither running nor paused afterwards.
  void stop();
  bool isRunning() const noexcept { return fRunning.load(); }
  bool isPaused() const noexcept { return fPaused.load(); }
  Mode getMode() const noexcept { return fMode.load(); }

  // A behaviour has stopped: while running, the arms waiting for it go on.
  void onBehaviorStopped(const std::string& name);

  // Replace the arms' animation list of a posture family (preloading them, at most 1 s each).
  void setSpeakingAnimations(PostureFamily postureFamily, const std::vector<std::string>& names);
  void setListeningAnimations(PostureFamily postureFamily, const std::vector<std::string>& names);
  // The arms' animation list of a posture family, in its current (shuffled) order.
  std::vector<std::string> getSpeakingAnimations(PostureFamily postureFamily) const;
  std::vector<std::string> getListeningAnimations(PostureFamily postureFamily) const;

  // The posture watcher (never null): init()/exit() start and end the watching, and the
  // module's posture callback feeds setPostureFamily().
  const std::shared_ptr<ZURobotBodyTalkPosture>& getPosture() const noexcept { return fPosture; }
  // The latest posture family reported.
  PostureFamily getPostureFamily() const noexcept { return fPosture->getPostureFamily(); }
  // The posture family the parts move in, taken at the last start or resume.
  PostureFamily getActivePostureFamily() const noexcept {
    return fPosture->getActivePostureFamily();
  }

  double getTimeScale() const noexcept { return fTimeScale; }
  // Whether neither worker's task runs (for diagnosis and tests).
  bool areWorkersStopped() const;

 private:
  ZURobotBodyTalk(const std::shared_ptr<ZUBroker>& broker, const ZURobotBodyTalkOptions& options);
  ~ZURobotBodyTalk();

  // With the controller lock held.
  void xStopWorkers();
  void xAttachParts(Mode mode);
  void xStartWorkers();

  const double fTimeScale;
  const std::shared_ptr<ko::EventLoop> fLoop;
  const std::shared_ptr<ZURobotBodyTalkPosture> fPosture;
  std::shared_ptr<ZURobotModelProxy> fRobotModel;
  // The parts before the workers, which hold them: the workers go first.
  std::unique_ptr<ZURobotBodyTalkHeadSpeaking> fHeadSpeaking;
  std::unique_ptr<ZURobotBodyTalkArms> fArmsSpeaking;
  std::unique_ptr<ZURobotBodyTalkHeadListening> fHeadListening;
  std::unique_ptr<ZURobotBodyTalkArms> fArmsListening;
  std::unique_ptr<ZURobotBodyTalkThread> fHeadThread;
  std::unique_ptr<ZURobotBodyTalkThread> fArmsThread;

  mutable std::mutex fMutex;
  std::atomic<bool> fRunning{false};
  std::atomic<bool> fPaused{false};
  std::atomic<Mode> fMode{kSpeaking};
  ZURobotBodyTalkParts fParts;  // under fMutex
};

// The module's handle on the process's controller: made, it counts one user; destroyed,
// it releases it.
struct ZURobotBodyTalkInstance {
  explicit ZURobotBodyTalkInstance(const std::shared_ptr<ZUBroker>& broker,
                                   const ZURobotBodyTalkOptions& options = {});
  ~ZURobotBodyTalkInstance();
  ZURobotBodyTalkInstance(const ZURobotBodyTalkInstance&) = delete;
  ZURobotBodyTalkInstance& operator=(const ZURobotBodyTalkInstance&) = delete;

  ZURobotBodyTalk* const bodyTalk;
};

}  // namespace ZU
