#pragma once
// RecordingModule: a module for the speech and memory tests that stands where the
// service's module stands. It records the memory events it receives (key, value,
// message, receiving thread, time), runs a test's hook on each, records the
// blocking-bookmark calls of the speech engine, and can hold those calls on a latch until
// the test releases them.
//
// Callbacks arrive on the memory service's delivery threads and the speech engine's
// blocking-call threads; the test thread reads and waits. One mutex and condition
// variable guard everything.

#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace robotsim::testing {

struct ReceivedEvent {
  std::string key;
  ZU::ZUValue value;
  std::string message;
  std::thread::id thread;
  std::chrono::steady_clock::time_point time;
};

class RecordingModule : public ZU::ZUModule {
 public:
  RecordingModule(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);

  // ---- bound methods ----
  // Records the event.
  void onEvent(const std::string& memoryKey, const ZU::ZUValue& value, const std::string& message);
  // Raises ZUError, as a faulty subscriber would.
  void failingCallback(const std::string& memoryKey, const ZU::ZUValue& value,
                       const std::string& message);
  // Records the bookmark, then waits while the latch is closed.
  void _mrkpauseCallback(int bookmark);

  // ---- test side ----
  // Runs `hook` after each event is recorded, in the delivering thread; set it before the
  // module subscribes.
  using Hook = std::function<void(const RecordingModule& self, const std::string& key)>;
  void setHook(Hook hook) { fHook = std::move(hook); }
  void holdBlockingBookmarks() {
    std::lock_guard lock(fMutex);
    fHold = true;
  }
  void releaseBlockingBookmarks();
  std::vector<ReceivedEvent> events() const {
    std::lock_guard lock(fMutex);
    return fEvents;
  }
  // The events of one key, in arrival order.
  std::vector<ReceivedEvent> events(const std::string& key) const;
  std::vector<int> blockingBookmarks() const {
    std::lock_guard lock(fMutex);
    return fBlocking;
  }
  // Wait at most `bound` until the condition holds on the events received; answer it.
  bool waitForEvents(const std::function<bool(const std::vector<ReceivedEvent>&)>& condition,
                     std::chrono::milliseconds bound) const;
  // Wait at most `bound` until `count` events of `key` have come; answer whether they have.
  bool waitForEvents(const std::string& key, std::size_t count,
                     std::chrono::milliseconds bound = std::chrono::seconds(10)) const;
  bool waitForBlockingBookmarks(std::size_t count, std::chrono::milliseconds bound) const;

 private:
  mutable std::mutex fMutex;
  mutable std::condition_variable fChanged;
  std::vector<ReceivedEvent> fEvents;
  std::vector<int> fBlocking;
  bool fHold = false;
  Hook fHook;
};

// Whether a speech status [id, word] is among the events.
bool hasStatus(const std::vector<ReceivedEvent>& events, int id, const std::string& word);
// The statuses of one text, in arrival order ("started", "done", "stopped").
std::vector<std::string> statusesOf(const std::vector<ReceivedEvent>& events, int id);

}  // namespace robotsim::testing
