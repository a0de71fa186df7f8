#pragma once
// ZUMemory: the memory and event service of the simulated robot. It keeps the last value
// of each key, and delivers each raised event to the modules subscribed to it by calling
// their bound callback (memoryKey, value, message) by name.
//
// Threads: calls arrive on ko threads, several at once. Deliveries run on the service's
// own delivery loop, never in the raiser's call; each subscribing module has a queue of
// its own that one loop thread at a time drains, so a module receives its events in the
// order they were raised and one at a time, and a slow module holds up no other. The
// keys, the subscriptions and the queues are guarded by one mutex; no lock is held while
// a callback runs. The delivery threads find the subscribers through the session, never
// holding the broker.
//
// Unsubscribing: once unsubscribeToEvent returns, no callback of that subscription runs
// or will run, except the one from which it was called (a callback may end its own
// subscription). So it waits for a callback of that subscription running in another
// thread: do not call it while holding a lock that the callback takes.
//
// exit(), from any thread, stops the delivery loop, waiting for the callbacks in progress
// (unless called from one of them), and unregisters; events raised afterwards are kept
// but not delivered. The destructor does the same stop, on any thread but the module's
// own (the framework sees to it, see ko/reaper.hpp).

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/eventloop.hpp"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace robotsim {

struct ZUMemoryOptions {
  std::shared_ptr<Timeline> timeline;
  // The threads that run the callbacks.
  std::size_t deliveryThreads = 4;
};

class ZUMemory : public ZU::ZUModule {
 public:
  ZUMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
           ZUMemoryOptions options = {});
  ~ZUMemory() override;

  void exit() override;

  // ---- bound methods ----
  void declareEvent(const std::string& name);
  // `extractor`: the module that raises the event.
  void declareEvent(const std::string& name, const std::string& extractor);
  // Stores the value and delivers it to the subscribers of the key.
  void raiseEvent(const std::string& key, const ZU::ZUValue& value);
  // Stores the value without delivering it.
  void insertData(const std::string& key, const ZU::ZUValue& value);
  // The last value of the key; raises ZUError when the key has none.
  ZU::ZUValue getData(const std::string& key);
  // Delivers the event to module.callback(memoryKey, value, message) with an empty
  // message. A module subscribes once per event: a new subscription replaces the old.
  void subscribeToEvent(const std::string& name, const std::string& callbackModule,
                        const std::string& callbackMethod);
  // The same, with the message given here.
  void subscribeToMicroEvent(const std::string& name, const std::string& callbackModule,
                             const std::string& callbackMessage, const std::string& callbackMethod);
  // Raises ZUError when the module is not subscribed to the event. Deliveries still
  // queued for it are dropped.
  void unsubscribeToEvent(const std::string& name, const std::string& callbackModule);
  void unsubscribeToMicroEvent(const std::string& name, const std::string& callbackModule);
  // The declared events and the keys raised, sorted.
  std::vector<std::string> getEventList();
  // The modules subscribed to the event, sorted.
  std::vector<std::string> getSubscribers(const std::string& name);

  // ---- for the clocks of tests, which let no time pass while an event is on its way ----
  // The deliveries of the key still queued or in their callback.
  std::size_t undelivered(const std::string& key) const;
  // The deliveries of the key over so far (the callback returned, or it was dropped).
  std::uint64_t delivered(const std::string& key) const;

 private:
  struct Subscription {
    std::string module;
    std::string method;
    std::string message;
    std::uint64_t serial = 0;  // which subscription of (event, module) this is
  };
  struct Delivery {
    std::string event;
    Subscription subscription;
    ko::AnyValue value;
  };
  // The deliveries waiting for one module, drained by one loop thread at a time.
  struct Inbox {
    std::deque<Delivery> queue;
    bool draining = false;
    std::uint64_t delivering = 0;  // the serial of the subscription whose callback runs
    std::thread::id thread;        // and the thread that runs it
  };

  void xBindMethods();
  void xSubscribe(const std::string& name, Subscription subscription, const char* method);
  void xUnsubscribe(const std::string& name, const std::string& module, const char* method);
  void xDrain(const std::string& module);
  void xDeliver(const Delivery& delivery);
  // With fMutex held.
  bool xIsCurrent(const Delivery& delivery) const;
  // With fMutex held: one delivery of the key is over.
  void xDone(const std::string& key);

  const ZUMemoryOptions fOptions;
  std::shared_ptr<ko::EventLoop> fDeliveryLoop;

  mutable std::mutex fMutex;
  std::map<std::string, ko::AnyValue> fData;
  std::set<std::string> fDeclared;
  std::map<std::string, std::map<std::string, Subscription>> fSubscriptions;  // event, module
  std::map<std::string, Inbox> fInboxes;                                      // by module
  std::condition_variable fDelivered;                                         // a callback returned
  std::uint64_t fNextSerial = 1;
  std::map<std::string, std::size_t> fUndelivered;       // by key
  std::map<std::string, std::uint64_t> fDeliveredCount;  // by key
};

}  // namespace robotsim
