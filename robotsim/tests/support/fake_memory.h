#pragma once
// A stand-in for the memory service in the tests of the robot's services: it records every
// event raised through it and lets a test wait (with a bound) for them. Raises arrive on
// the raisers' threads; the record is guarded by a mutex.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace robotsim::simtest {

class FakeMemory : public ZU::ZUModule {
 public:
  struct Event {
    std::string key;
    std::vector<std::string> names;  // the value read as a list of strings
  };

  FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);

  void raiseEvent(const std::string& key, const ZU::ZUValue& value);

  // The events of that key, in the order raised.
  std::vector<Event> events(const std::string& key) const;
  // Waits at most `bound` until `count` events of that key have been raised.
  bool waitForEvents(const std::string& key, std::size_t count,
                     std::chrono::milliseconds bound = std::chrono::seconds(10)) const;

 private:
  mutable std::mutex fMutex;
  mutable std::condition_variable fRaised;
  std::vector<Event> fEvents;
};

}  // namespace robotsim::simtest
