#pragma once
// ZUBehaviorManager: the behaviour manager of the simulated robot. Behaviours are the
// folders of an animation library on disk (see behaviorlibrary.h); starting one plays its
// keyframes through ZUMotion in real time.
//
// Calls arrive on ko threads, several at once; posted calls run on the module's own event
// loop. The end of a behaviour is learnt from ZUMotion's "moveEnded" signal (in the thread
// that ended the move); a delivery thread of the module then records it and triggers the
// signal "behaviorStopped"(path), one behaviour at a time in the order of the ends. The
// library, the running behaviours and the delivery queue are guarded by one mutex, which is
// never held while another service is called or a signal is triggered. The module's
// threads find services through the session, never holding the broker.
//
// A run's stop is never heard after a later start of the same behaviour has returned: a
// stop not yet signalled when the behaviour starts again is recorded on the timeline but
// not signalled (one being signalled at that moment may still be running its subscribers).
//
// exit() and the destructor stop every behaviour, signal the stops still queued, join the
// delivery thread (exit from a subscriber of the signal leaves that to the destructor) and
// disconnect from ZUMotion; exit then unregisters.
//
// Installing and removing behaviours (installBehavior, removeBehavior, rescan) raises
// "ZUBehaviorManager/BehaviorsAdded" or "ZUBehaviorManager/BehaviorsRemoved" through
// ZUMemory with the list of paths.

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/signal.hpp"
#include "robotsim/behaviorlibrary.h"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"

namespace robotsim {

class FaultPlan;

class ZUBehaviorManager : public ZU::ZUModule {
 public:
  // `root`: the library folder; empty for the data folder "zefoko/behaviors". `timeline` may
  // be null. The library is scanned here. A stop that `faults` hides is recorded on the
  // timeline but never signalled.
  ZUBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                    std::shared_ptr<Timeline> timeline = nullptr, std::string root = "",
                    std::shared_ptr<FaultPlan> faults = nullptr);
  ~ZUBehaviorManager() override;

  // See above.
  void exit() override;
  // Stops the posted call `id`; a posted runBehavior stops its behaviour.
  void stop(int id) override;

  const std::filesystem::path& libraryRoot() const noexcept { return fRoot; }

  // ---- bound methods ----
  std::vector<std::string> getInstalledBehaviors();
  // Raises ZUError for a behaviour that is not installed.
  std::vector<std::string> getBehaviorTags(const std::string& behavior);
  // The installed path itself; else the only installed path ending with "/" + name; else "".
  std::string resolveBehaviorName(const std::string& name);
  // Reads the descriptor again if its file changed and keeps it ready; raises ZUError for
  // a behaviour that is not installed or whose descriptor became malformed.
  bool preloadBehavior(const std::string& behavior);
  // Starts the behaviour and returns at once; raises ZUError when it is not installed,
  // already runs or cannot move the body.
  void startBehavior(const std::string& behavior);
  // Starts the behaviour and returns at its end.
  void runBehavior(const std::string& behavior);
  // Stops the behaviour if it runs; "behaviorStopped" follows.
  void stopBehavior(const std::string& behavior);
  void stopAllBehaviors();
  bool isBehaviorRunning(const std::string& behavior);
  std::vector<std::string> getRunningBehaviors();
  // Writes `descriptor` (the JSON text of behavior.json) into the library under that path,
  // replacing a behaviour installed there; raises ZUError for a bad path or descriptor.
  void installBehavior(const std::string& behavior, const std::string& descriptor);
  // Stops and deletes the behaviour; false when it was not installed.
  bool removeBehavior(const std::string& behavior);
  // Reads the library folder again and announces what appeared, changed or went away.
  void rescan();

 private:
  struct Installed {
    BehaviorDescriptor descriptor;
    std::filesystem::file_time_type modified;
  };
  struct Running {
    std::uint64_t serial = 0;
    int moveId = 0;  // 0 while the move is being started
    bool stopRequested = false;
  };
  struct Delivery {
    std::string behavior;
    bool started = false;  // else stopped
    bool interrupted = false;
    bool superseded = false;    // a later run started before the stop was signalled
    std::int64_t startUs = -1;  // a start: when its move began, on the timeline's clock
  };

  void xBindMethods();
  // Logs what a scan rejected.
  void xLogRejected(const std::map<std::string, std::string>& rejected);
  std::filesystem::file_time_type xModified(const std::string& behavior) const;
  // Starts the behaviour; answers the serial of this run.
  std::uint64_t xStart(const std::string& method, const std::string& behavior);
  // The ZUMotion service, connected to its "moveEnded" signal; raises ZUError when absent.
  ko::AnyObject xMotion(const std::string& method);
  void xOnMoveEnded(int moveId, bool interrupted);
  // With fMutex held: the behaviour's run is over. Takes a copy of the name, which may
  // come from the tables that it clears.
  void xFinish(std::string behavior, bool interrupted);
  void xDeliver();
  void xRaise(const std::string& key, const std::vector<std::string>& behaviors);
  void xRecord(const std::string& operation, ko::AnyValue arguments, ko::AnyValue result = {});
  void xDisconnectMotion();
  // Stops the behaviours and the delivery thread; exit and the destructor.
  void xShutdown();

  const std::shared_ptr<Timeline> fTimeline;
  const std::filesystem::path fRoot;
  const std::shared_ptr<FaultPlan> fFaults;
  ko::Signal<std::string>* fBehaviorStopped = nullptr;

  std::mutex fMotionMutex;  // the motion handle and its signal link
  ko::AnyObject fMotion;
  ko::SignalLink fMotionLink = ko::kInvalidSignalLink;

  std::mutex fMutex;
  std::condition_variable fRunEnded;  // a run has ended
  std::condition_variable fDeliveryWake;
  std::map<std::string, Installed> fInstalled;
  std::map<std::string, Running> fRunning;
  std::map<int, std::string> fMoves;     // move id -> behaviour
  std::map<int, bool> fEarlyEnds;        // moves that ended before their start was recorded
  std::map<int, std::string> fTaskRuns;  // posted runBehavior id -> behaviour
  std::uint64_t fNextSerial = 1;
  std::deque<Delivery> fDeliveries;
  bool fQuit = false;
  std::mutex fJoinMutex;  // the join of the delivery thread
  std::thread fDeliveryThread;
};

}  // namespace robotsim
