#pragma once
// ServiceRig: the service "ZUMokuto" on the whole simulated robot, for the tests that
// speak through the module itself (faults, stress). The robot has the timing speech engine
// playing as fast as possible, the gesture library of the director's rig, the "bells"
// sound set loaded and a fault plan (empty until a test sets it, its delays scaled as the
// service's clock); the module has the driven clock, a fast body talk, and reports each
// text entering each stage to a hook that the test may set.
//
// Built and destroyed by one thread; say, stop and the hook's callers on any.

#include <cstddef>
#include <functional>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "driven_clock.h"
#include "ko_test_helpers.hpp"
#include "mokuto/zumokuto.h"
#include "robotsim/faults.h"
#include "robotsim/robot.h"
#include "support/timeline_waiter.h"
#include "zu/zuvalue.h"

namespace mokutotest {

class ServiceRig {
 public:
  // `scale`: the real length of the service's limits and of the faults' delays, against
  // the robot's.
  explicit ServiceRig(double scale = 0.2);
  ~ServiceRig();
  ServiceRig(const ServiceRig&) = delete;
  ServiceRig& operator=(const ServiceRig&) = delete;

  // mokuto->say(text, configuration) on a thread of its own.
  std::future<void> sayAsync(const std::string& text, const ZU::ZUValue& configuration = {});
  // The end events raised with that text id so far.
  std::size_t endEvents(ZU::MKID id) const;
  // The memory events of that key raised so far.
  std::size_t events(const std::string& key) const;
  // Waits (bounded) until `count` entries of that service's operation are on the timeline.
  bool waitForTimeline(const std::string& service, const std::string& operation,
                       std::size_t count) const;
  // Called in the say thread as a text enters a stage (under that stage's lock).
  void setStageHook(std::function<void(ZU::ZUMokutoStage, ZU::MKID)> hook);

  const std::shared_ptr<DrivenClock> clock;
  const std::shared_ptr<robotsim::FaultPlan> faults;
  std::unique_ptr<robotsim::Robot> robot;
  std::shared_ptr<ZU::ZUMokuto> mokuto;

 private:
  struct Hook {
    std::mutex mutex;
    std::function<void(ZU::ZUMokutoStage, ZU::MKID)> call;
  };
  ko::test::ScratchFolder fLibrary;
  std::shared_ptr<Hook> fHook = std::make_shared<Hook>();
  std::optional<robotsim::simtest::TimelineWaiter> fWaiter;
};

}  // namespace mokutotest
