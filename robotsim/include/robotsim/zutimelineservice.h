#pragma once
// ZUTimeline: the simulated robot's timeline as a service, so that a process of its own (a
// command that speaks through the robot) can follow it. It publishes every entry as the
// signal "entryRecorded" (ustime, service, operation, arguments, result), where ustime is
// the entry's time on ko::os::ustime()'s clock, the steady clock that every process of the
// machine shares.
//
// Threads: the signal is triggered in the module's own thread, entry after entry in the
// order recorded, never in the thread that records: the robot's threads on the way from a
// bookmark to its gesture never wait for an observer. The timeline's listener outlives the
// module harmlessly (it holds the signal and a weak handle on that thread).

#include <cstdint>
#include <memory>
#include <string>

#include "ko/anyvalue.hpp"
#include "ko/eventloop.hpp"
#include "ko/signal.hpp"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"

namespace robotsim {

class ZUTimelineService : public ZU::ZUModule {
 public:
  static constexpr const char* kServiceName = "ZUTimeline";
  static constexpr const char* kEntrySignal = "entryRecorded";
  using EntrySignal =
      ko::Signal<std::int64_t, std::string, std::string, ko::AnyValue, ko::AnyValue>;

  ZUTimelineService(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                    std::shared_ptr<Timeline> timeline);

  // ---- bound methods ----
  // Now, on the clock of the entries.
  std::int64_t now();

 private:
  std::shared_ptr<Timeline> fTimeline;
  std::shared_ptr<ko::EventLoop> fTeller;  // one thread: the entries in order
};

}  // namespace robotsim
