#include "support/fake_memory.h"

namespace robotsim::simtest {

FakeMemory::FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("FakeMemory", {{"raiseEvent",
                              &FakeMemory::raiseEvent,
                              "Records an event.",
                              {{"key", "The event's name."}, {"value", "The event's value."}}}});
}

void FakeMemory::raiseEvent(const std::string& key, const ZU::ZUValue& value) {
  Event event{key, {}};
  if (value.isArray())
    value.ToStringArray(event.names, true);
  {
    std::lock_guard lock(fMutex);
    fEvents.push_back(std::move(event));
  }
  fRaised.notify_all();
}

std::vector<FakeMemory::Event> FakeMemory::events(const std::string& key) const {
  std::lock_guard lock(fMutex);
  std::vector<Event> out;
  for (const auto& e : fEvents) {
    if (e.key == key)
      out.push_back(e);
  }
  return out;
}

bool FakeMemory::waitForEvents(const std::string& key, std::size_t count,
                               std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fRaised.wait_for(lock, bound, [&] {
    std::size_t n = 0;
    for (const auto& e : fEvents)
      n += e.key == key ? 1u : 0u;
    return n >= count;
  });
}

}  // namespace robotsim::simtest
