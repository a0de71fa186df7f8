#include "robotsim/zutimelineservice.h"

#include "ko/os.hpp"

namespace robotsim {

ZUTimelineService::ZUTimelineService(const std::shared_ptr<ZU::ZUBroker>& broker,
                                     const std::string& name, std::shared_ptr<Timeline> timeline)
    : ZU::ZUModule(broker, name),
      fTimeline(std::move(timeline)),
      fTeller(std::make_shared<ko::EventLoop>(name + ".entries", 1)) {
  setModuleDescription("The timeline of the simulated robot, entry by entry.");
  bindMethods("ZUTimeline", {{"now",
                              &ZUTimelineService::now,
                              "Returns the time on the clock of the entries.",
                              {},
                              {"ustime", "Microseconds of the machine's steady clock."}}});
  auto signal = std::make_shared<EntrySignal>();
  advertiseSignal(kEntrySignal, signal);
  if (fTimeline) {
    fTimeline->addListener([signal, teller = std::weak_ptr<ko::EventLoop>(fTeller),
                            origin = fTimeline->originUs()](const TimelineEntry& e) {
      if (signal->subscriberCount() == 0)
        return;
      if (const auto loop = teller.lock()) {
        loop->post([signal, e, us = origin + e.us] {
          (*signal)(us, e.service, e.operation, e.arguments, e.result);
        });
      }
    });
  }
}

std::int64_t ZUTimelineService::now() {
  return ko::os::ustime();
}

}  // namespace robotsim
