#include "robotsim/zumemory.h"

#include <utility>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "zu/zuvalueconverter.h"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.memory";
constexpr const char* kModuleClass = "ZUMemory";
// Deliveries one drain makes before it lets the other modules' queues have the thread.
constexpr int kDrainBatch = 64;

}  // namespace

ZUMemory::ZUMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                   ZUMemoryOptions options)
    : ZU::ZUModule(broker, name),
      fOptions(std::move(options)),
      fDeliveryLoop(std::make_shared<ko::EventLoop>(
          name + ".delivery", fOptions.deliveryThreads > 0 ? fOptions.deliveryThreads : 1,
          ko::EventLoop::Scheduling::Realtime)) {
  xBindMethods();
}

ZUMemory::~ZUMemory() {
  fDeliveryLoop->stop();
}

void ZUMemory::exit() {
  fDeliveryLoop->stop();
  ZU::ZUModule::exit();
}

void ZUMemory::xBindMethods() {
  setModuleDescription("The memory and event service of the simulated robot.");
  const std::vector<ZU::ZUMethodParameter> keyAndValue = {{"name", "The key."},
                                                          {"value", "The value."}};
  const std::vector<ZU::ZUMethodParameter> subscription = {{"name", "The event."},
                                                           {"callbackModule", "The module."}};
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"declareEvent",
       ZU::overload<void(const std::string&)>(&ZUMemory::declareEvent),
       "Declares an event.",
       {{"eventName", "The event's name."}}},
      {"declareEvent",
       ZU::overload<void(const std::string&, const std::string&)>(&ZUMemory::declareEvent),
       "Declares an event raised by a module.",
       {{"eventName", "The event's name."}, {"extractorName", "The module that raises it."}}},
      {"raiseEvent", &ZUMemory::raiseEvent,
       "Stores the value of a key and delivers it to the key's subscribers.", keyAndValue},
      {"insertData", &ZUMemory::insertData, "Stores the value of a key without delivering it.",
       keyAndValue},
      {"getData",
       &ZUMemory::getData,
       "Returns the last value of a key.",
       {{"name", "The key."}},
       {"value", "Its last value."}},
      {"subscribeToEvent",
       &ZUMemory::subscribeToEvent,
       "Calls a module's method with (memoryKey, value, message) when the event is raised.",
       {{"name", "The event."},
        {"callbackModule", "The module to call."},
        {"callbackMethod", "Its method."}}},
      {"subscribeToMicroEvent",
       &ZUMemory::subscribeToMicroEvent,
       "Calls a module's method with (memoryKey, value, message) when the event is "
       "raised, the message given here.",
       {{"name", "The event."},
        {"callbackModule", "The module to call."},
        {"callbackMessage", "The message passed to the method."},
        {"callbackMethod", "Its method."}}},
      {"unsubscribeToEvent", &ZUMemory::unsubscribeToEvent,
       "Ends a module's subscription to an event.", subscription},
      {"unsubscribeToMicroEvent", &ZUMemory::unsubscribeToMicroEvent,
       "Ends a module's subscription to a micro event.", subscription},
      {"getEventList",
       &ZUMemory::getEventList,
       "Returns the declared events and the raised keys.",
       {},
       {"events", "Their names, sorted."}},
      {"getSubscribers",
       &ZUMemory::getSubscribers,
       "Returns the modules subscribed to an event.",
       {{"name", "The event."}},
       {"modules", "Their names, sorted."}},
  };
  bindMethods(kModuleClass, methods);
}

void ZUMemory::declareEvent(const std::string& name) {
  declareEvent(name, "");
}

void ZUMemory::declareEvent(const std::string& name, const std::string& extractor) {
  if (name.empty())
    ZU_THROW_ERROR(getName(), "declareEvent", "An event needs a name");
  {
    std::lock_guard lock(fMutex);
    fDeclared.insert(name);
  }
  if (fOptions.timeline)
    fOptions.timeline->record(getName(), "declareEvent", ko::AnyValue::List{name, extractor});
}

void ZUMemory::raiseEvent(const std::string& key, const ZU::ZUValue& value) {
  if (key.empty())
    ZU_THROW_ERROR(getName(), "raiseEvent", "A key needs a name");
  const ko::AnyValue stored = ZU::toAnyReference(value);
  if (fOptions.timeline)
    fOptions.timeline->record(getName(), "raiseEvent", ko::AnyValue::List{key, stored});
  std::vector<std::string> wake;
  {
    std::lock_guard lock(fMutex);
    fData[key] = stored;
    const auto subscribers = fSubscriptions.find(key);
    if (subscribers != fSubscriptions.end()) {
      for (const auto& [module, subscription] : subscribers->second) {
        Inbox& inbox = fInboxes[module];
        inbox.queue.push_back(Delivery{key, subscription, stored});
        ++fUndelivered[key];
        if (!inbox.draining) {
          inbox.draining = true;
          wake.push_back(module);
        }
      }
    }
  }
  for (auto& module : wake)
    fDeliveryLoop->post([this, module = std::move(module)] { xDrain(module); });
}

void ZUMemory::insertData(const std::string& key, const ZU::ZUValue& value) {
  if (key.empty())
    ZU_THROW_ERROR(getName(), "insertData", "A key needs a name");
  std::lock_guard lock(fMutex);
  fData[key] = ZU::toAnyReference(value);
}

ZU::ZUValue ZUMemory::getData(const std::string& key) {
  ko::AnyValue value;
  {
    std::lock_guard lock(fMutex);
    const auto it = fData.find(key);
    if (it == fData.end())
      ZU_THROW_ERROR(getName(), "getData", "There is no data for the key '" + key + "'");
    value = it->second;
  }
  return ZU::fromAnyReference(value);
}

void ZUMemory::subscribeToEvent(const std::string& name, const std::string& callbackModule,
                                const std::string& callbackMethod) {
  xSubscribe(name, Subscription{callbackModule, callbackMethod, "", 0}, "subscribeToEvent");
}

void ZUMemory::subscribeToMicroEvent(const std::string& name, const std::string& callbackModule,
                                     const std::string& callbackMessage,
                                     const std::string& callbackMethod) {
  xSubscribe(name, Subscription{callbackModule, callbackMethod, callbackMessage, 0},
             "subscribeToMicroEvent");
}

void ZUMemory::xSubscribe(const std::string& name, Subscription subscription, const char* method) {
  if (name.empty() || subscription.module.empty() || subscription.method.empty()) {
    ZU_THROW_ERROR(getName(), method,
                   "A subscription needs an event, a module and a method (event '" + name +
                       "', module '" + subscription.module + "', method '" + subscription.method +
                       "')");
  }
  const std::string module = subscription.module;
  {
    std::lock_guard lock(fMutex);
    subscription.serial = fNextSerial++;
    fSubscriptions[name][module] = std::move(subscription);
  }
  if (fOptions.timeline)
    fOptions.timeline->record(getName(), method, ko::AnyValue::List{name, module});
}

void ZUMemory::unsubscribeToEvent(const std::string& name, const std::string& callbackModule) {
  xUnsubscribe(name, callbackModule, "unsubscribeToEvent");
}

void ZUMemory::unsubscribeToMicroEvent(const std::string& name, const std::string& callbackModule) {
  xUnsubscribe(name, callbackModule, "unsubscribeToMicroEvent");
}

void ZUMemory::xUnsubscribe(const std::string& name, const std::string& module,
                            const char* method) {
  {
    std::unique_lock lock(fMutex);
    const auto event = fSubscriptions.find(name);
    if (event == fSubscriptions.end() || event->second.count(module) == 0) {
      ZU_THROW_ERROR(getName(), method,
                     "Module '" + module + "' is not subscribed to the event '" + name + "'");
    }
    const std::uint64_t serial = event->second.at(module).serial;
    event->second.erase(module);
    if (event->second.empty())
      fSubscriptions.erase(event);
    // A callback of the subscription running in another thread ends first.
    fDelivered.wait(lock, [&] {
      const auto inbox = fInboxes.find(module);
      return inbox == fInboxes.end() || inbox->second.delivering != serial ||
             inbox->second.thread == std::this_thread::get_id();
    });
  }
  if (fOptions.timeline)
    fOptions.timeline->record(getName(), method, ko::AnyValue::List{name, module});
}

std::vector<std::string> ZUMemory::getEventList() {
  std::lock_guard lock(fMutex);
  std::set<std::string> names = fDeclared;
  for (const auto& [key, value] : fData)
    names.insert(key);
  return {names.begin(), names.end()};
}

std::vector<std::string> ZUMemory::getSubscribers(const std::string& name) {
  std::vector<std::string> out;
  std::lock_guard lock(fMutex);
  const auto event = fSubscriptions.find(name);
  if (event != fSubscriptions.end()) {
    for (const auto& [module, subscription] : event->second)
      out.push_back(module);
  }
  return out;
}

void ZUMemory::xDrain(const std::string& module) {
  for (int delivered = 0;; ++delivered) {
    Delivery delivery;
    {
      std::lock_guard lock(fMutex);
      Inbox& inbox = fInboxes[module];
      if (inbox.queue.empty()) {
        inbox.draining = false;
        return;
      }
      if (delivered == kDrainBatch) {
        fDeliveryLoop->post([this, module] { xDrain(module); });
        return;
      }
      delivery = std::move(inbox.queue.front());
      inbox.queue.pop_front();
      // Decided under the lock that an unsubscribe takes: either it comes first and the
      // delivery is dropped, or it waits for the callback to return.
      if (!xIsCurrent(delivery)) {
        xDone(delivery.event);
        continue;
      }
      inbox.delivering = delivery.subscription.serial;
      inbox.thread = std::this_thread::get_id();
    }
    xDeliver(delivery);
    {
      std::lock_guard lock(fMutex);
      Inbox& inbox = fInboxes[module];
      inbox.delivering = 0;
      inbox.thread = {};
      xDone(delivery.event);
    }
    fDelivered.notify_all();
  }
}

void ZUMemory::xDone(const std::string& key) {
  --fUndelivered[key];
  ++fDeliveredCount[key];
}

std::size_t ZUMemory::undelivered(const std::string& key) const {
  std::lock_guard lock(fMutex);
  const auto it = fUndelivered.find(key);
  return it == fUndelivered.end() ? 0 : it->second;
}

std::uint64_t ZUMemory::delivered(const std::string& key) const {
  std::lock_guard lock(fMutex);
  const auto it = fDeliveredCount.find(key);
  return it == fDeliveredCount.end() ? 0 : it->second;
}

bool ZUMemory::xIsCurrent(const Delivery& delivery) const {
  const auto event = fSubscriptions.find(delivery.event);
  if (event == fSubscriptions.end())
    return false;
  const auto it = event->second.find(delivery.subscription.module);
  return it != event->second.end() && it->second.serial == delivery.subscription.serial;
}

void ZUMemory::xDeliver(const Delivery& delivery) {
  const Subscription& s = delivery.subscription;
  const ko::AnyObject object = findService(s.module);
  if (!object) {
    KO_LOG_ERROR(kCategory) << "Module " << s.module << " is gone: event " << delivery.event
                            << " not delivered";
    return;
  }
  try {
    object->call<void>(s.method,
                       std::vector<ko::AnyValue>{ko::AnyValue(delivery.event), delivery.value,
                                                 ko::AnyValue(s.message)});
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << s.module << "." << s.method << " failed on event " << delivery.event
                            << ": " << e.what();
  }
}

}  // namespace robotsim
