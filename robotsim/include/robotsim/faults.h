#pragma once
// Faults of the simulated robot's services, for the tests of their callers and for
// `mokuto say --faults`: an operation that fails, never answers or answers late, bookmarks
// of the speech engine lost, repeated, swapped or late, a behaviour manager that never
// reports a stop. The faults strike at the services' own entry, before a service sees the
// call, so their callers meet them as they would meet a broken robot, in the robot's
// process or from another one.
//
// A plan is written as faults separated by ";" (blanks around a fault are ignored):
//
//   SERVICE.OPERATION:throw            the call fails: ZUError SERVICE::OPERATION "injected fault"
//   SERVICE.OPERATION:hang             the call does not answer until the plan is lifted; a
//                                      posted call also ends when its task is asked to stop
//   SERVICE.OPERATION:delay=DURATION   the call answers DURATION late ("300ms", "2s")
//   ZUTextToSpeech.bookmarks:drop[=N,...]        the bookmarks N (without a list, every one)
//                                                are never reported
//   ZUTextToSpeech.bookmarks:duplicate[=N,...]   reported twice
//   ZUTextToSpeech.bookmarks:reorder[=N,...]     reported after the next mark (or the end)
//   ZUTextToSpeech.bookmarks:delay=DURATION[@N,...]   reported DURATION late (not at all
//                                                     if the plan is lifted meanwhile)
//   ZUBehaviorManager.behaviorStopped:never      the signal "behaviorStopped" never comes
//
// SERVICE is one of the robot's services, OPERATION one of its published methods, the
// built-in ones included ("wait", "stop", ...). A bookmark fault applies to the events of
// "mrk" bookmarks and, but for reorder, to the blocking calls of "mrkpause" ones. Each
// strike is logged in the category "robotsim.faults" at warning level, as
// "<SERVICE>.<OPERATION>: <what happens>".
//
// Threads: a plan is shared by the robot's services and its owner; every member may be
// called from any thread. One mutex guards the faults and the counts; a hanging call waits
// on a condition variable of the plan, which lift() wakes.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/future.hpp"
#include "zu/zumodulecore.h"

namespace robotsim {

// A plan that cannot be read; its message names the fault and what is wrong with it.
class FaultSpecError : public std::invalid_argument {
 public:
  using std::invalid_argument::invalid_argument;
};

struct Fault {
  enum class Action { Throw, Hang, Delay, Drop, Duplicate, Reorder, Never };

  std::string service;
  std::string operation;
  Action action = Action::Throw;
  std::chrono::milliseconds delay{0};   // Delay
  std::vector<std::int32_t> bookmarks;  // the bookmark faults' numbers; empty: every one
};

// The faults of a plan; raises FaultSpecError.
std::vector<Fault> parseFaults(std::string_view spec);
// The operations that a fault may name on one of the robot's services: its published
// methods but the built-in ones; empty for a name that is no service of the robot.
std::vector<std::string> faultOperations(std::string_view service);

// What becomes of one bookmark of the speech engine.
struct BookmarkFate {
  bool drop = false;
  bool duplicate = false;
  bool reorder = false;
  std::chrono::steady_clock::duration delay{};
};

class FaultPlan {
 public:
  // `timeScale` multiplies every delay: 1 for the robot, smaller in tests that run it faster.
  explicit FaultPlan(std::vector<Fault> faults = {}, double timeScale = 1.0);
  // Raises FaultSpecError.
  explicit FaultPlan(std::string_view spec, double timeScale = 1.0);
  FaultPlan(const FaultPlan&) = delete;
  FaultPlan& operator=(const FaultPlan&) = delete;

  // Replaces the faults; calls that hang go on hanging until lift().
  void set(std::vector<Fault> faults);
  // Removes every fault and releases every call that hangs.
  void lift();

  // At the entry of SERVICE.OPERATION: raises ZU::ZUError, hangs or waits as the faults
  // say. `task`: the posted call being run, null for a direct call.
  void strike(const std::string& service, const std::string& operation,
              const std::shared_ptr<ZU::ZUPCallTask>& task);
  // The speech engine's bookmark `number`; `blocking` for a "mrkpause" one.
  BookmarkFate bookmarkFate(std::int32_t number, bool blocking);
  // Whether the behaviour manager keeps the stop of `behavior` to itself.
  bool hidesStop(const std::string& behavior);

  // How often the faults of SERVICE.OPERATION ("bookmarks" and "behaviorStopped" too) struck.
  std::size_t strikes(const std::string& service, const std::string& operation) const;
  // Waits at most `bound` until they struck `count` times in all.
  bool waitForStrikes(const std::string& service, const std::string& operation, std::size_t count,
                      std::chrono::milliseconds bound) const;
  // The calls that hang now.
  std::size_t hanging() const;
  // How often the plan was lifted: a bookmark held back under one plan is not reported
  // once it is lifted.
  std::uint64_t lifts() const;

 private:
  std::chrono::steady_clock::duration xScaled(std::chrono::milliseconds delay) const;
  void xCount(const std::string& service, const std::string& operation);

  const double fTimeScale;
  mutable std::mutex fMutex;
  mutable std::condition_variable fChanged;  // a strike, a lift
  std::vector<Fault> fFaults;
  std::map<std::string, std::size_t> fStrikes;  // "SERVICE.OPERATION"
  std::uint64_t fLifts = 0;
  std::size_t fHanging = 0;
};

// A service of the robot whose published methods meet the plan's faults first: every call
// by method id, direct or posted (the module runs its posted calls through metaCall too).
template <class Service>
class WithFaults : public Service {
 public:
  template <class... A>
  WithFaults(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
             std::shared_ptr<FaultPlan> plan, A&&... args)
      : Service(broker, name, std::forward<A>(args)...), fPlan(std::move(plan)) {}

  ko::Future<ko::AnyValue> metaCall(unsigned methodId, const std::vector<ko::AnyValue>& args,
                                    ko::MetaCallType callType) override {
    if (const ko::MetaMethod* method = this->metaObject().method(methodId); method && fPlan) {
      try {
        fPlan->strike(this->getName(), method->name, this->currentTask());
      } catch (const std::exception& e) {
        return ko::makeFutureError<ko::AnyValue>(e.what());
      }
    }
    return Service::metaCall(methodId, args, callType);
  }

 private:
  const std::shared_ptr<FaultPlan> fPlan;
};

}  // namespace robotsim
