#include "zu/zubroker.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdlib>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"
#include "zu/zuerror.h"
#include "zu/zumodulecore.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "ZUBroker";
constexpr int kDefaultDeadlockTimeout = 30000;
constexpr int kUnread = INT_MIN;

std::atomic<int> gDeadlockTimeout{kUnread};

// The text of a lookup that finished without a value.
std::string failureText(const ko::Future<ko::AnyObject>& lookup) {
  try {
    (void)lookup.value(ko::FutureTimeout_None);
  } catch (const std::exception& e) {
    return e.what();
  }
  return "empty service object";
}

}  // namespace

std::shared_ptr<ZUBroker> ZUBroker::create(std::shared_ptr<ko::Session> session, std::string name,
                                           std::shared_ptr<ZUBrokerManager> manager) {
  return ko::makeShared<ZUBroker>(Key{}, std::move(session), std::move(name), std::move(manager));
}

ZUBroker::ZUBroker(Key, std::shared_ptr<ko::Session> session, std::string name,
                   std::shared_ptr<ZUBrokerManager> manager)
    : fName(std::move(name)),
      fSession(std::move(session)),
      fManager(manager ? std::move(manager) : ZUBrokerManager::getInstance()) {
  if (!fSession)
    ZU_THROW_ERROR("ZUBroker", "ZUBroker", "A broker needs a ko session");
}

ZUBroker::~ZUBroker() = default;

void ZUBroker::registerModule(const std::shared_ptr<ZUModuleCore>& module) {
  if (!module)
    ZU_THROW_ERROR("ZUBroker", "registerModule", "Can't register module ''no module given");
  const std::string& name = module->getName();
  // The entry is made first, without a service: an unregister that comes meanwhile takes
  // it away, and the registration then withdraws the service it made.
  std::uint64_t serial = 0;
  {
    std::unique_lock lock(fMutex);
    xWaitForWithdrawal(lock, name);
    if (fModules.count(name))
      ZU_THROW_ERROR("ZUBroker", "registerModule", "module '" + name + "'already exists");
    serial = fNextSerial++;
    fModules[name] = Registration{module, 0, serial};
  }
  auto withdrawEntry = [&] {
    std::lock_guard lock(fMutex);
    const auto it = fModules.find(name);
    if (it != fModules.end() && it->second.serial == serial)
      fModules.erase(it);
  };
  // The session keeps names unique and announces the new service to its subscribers, who
  // may use this broker: no lock of ours is held meanwhile.
  unsigned serviceId = 0;
  try {
    serviceId = fSession->registerService(name, ko::GenericObject::makeWeak(module, name));
  } catch (const ko::Error& e) {
    withdrawEntry();
    const std::vector<std::string> names = fSession->services();
    if (std::find(names.begin(), names.end(), name) != names.end())
      ZU_THROW_ERROR("ZUBroker", "registerModule", "module '" + name + "'already exists");
    ZU_THROW_ERROR("ZUBroker", "registerModule",
                   "Can't register module '" + name + "'" + std::string(e.what()));
  }
  bool withdrawn = false;
  {
    std::lock_guard lock(fMutex);
    const auto it = fModules.find(name);
    if (it != fModules.end() && it->second.serial == serial)
      it->second.serviceId = serviceId;
    else
      withdrawn = true;
  }
  if (withdrawn) {
    xUnregisterModule(name, Registration{nullptr, serviceId, serial});
    return;
  }
  module->setParentBroker(weak_from_this());
}

bool ZUBroker::unregisterModule(const std::string& name) {
  std::optional<Registration> registration;
  {
    std::unique_lock lock(fMutex);
    const auto it = fModules.find(name);
    if (it != fModules.end()) {
      registration = std::move(it->second);
      fModules.erase(it);
    } else {
      // Not a module of ours: the session's service of that name is withdrawn, and no
      // registration of ours under that name begins meanwhile (it would be the one withdrawn).
      xWaitForWithdrawal(lock, name);
      fWithdrawing.emplace(name, std::this_thread::get_id());
    }
  }
  // A registration still being made withdraws its own service.
  if (registration && registration->serviceId == 0)
    return true;
  // Unlocked: the session announces the withdrawal to its subscribers, and the broker's
  // hold on the module, perhaps the last, goes at the end.
  const bool done = xUnregisterModule(name, registration);
  if (!registration) {
    {
      std::lock_guard lock(fMutex);
      fWithdrawing.erase(name);
    }
    fWithdrawn.notify_all();
  }
  if (!done) {
    KO_LOG_ERROR(kCategory) << "ZUBroker::unregisterModule can't unregister module: " << name;
  }
  return done;
}

void ZUBroker::xWaitForWithdrawal(std::unique_lock<std::mutex>& lock, const std::string& name) {
  fWithdrawn.wait(lock, [&] {
    const auto it = fWithdrawing.find(name);
    return it == fWithdrawing.end() || it->second == std::this_thread::get_id();
  });
}

bool ZUBroker::xUnregisterModule(const std::string& name,
                                 const std::optional<Registration>& registration) {
  try {
    if (registration)
      fSession->unregisterService(registration->serviceId);
    else
      fSession->unregisterService(name);
    return true;
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot unregister module " << name << " : " << e.what();
    return false;
  }
}

std::shared_ptr<ZUModuleCore> ZUBroker::getModuleByName(const std::string& name) const {
  std::lock_guard lock(fMutex);
  const auto it = fModules.find(name);
  return it == fModules.end() ? nullptr : it->second.module;
}

ko::AnyObject ZUBroker::service(const std::string& name) const {
  const int timeout = deadlockTimeout();

  const ko::Future<ko::AnyObject> local = fSession->service(name, "local");
  const ko::FutureState localState = local.wait(timeout);
  // A service of another process is not in this one: the local failure is an error only
  // when the service is found nowhere.
  std::string localFailure;
  if (localState == ko::FutureState::Timeout) {
    KO_LOG_ERROR(kCategory) << "session.service(" << name << ") timeout after 30sec.";
  } else if (localState == ko::FutureState::FinishedWithValue && local.value()) {
    return local.value();
  } else {
    localFailure = "Future exception while checking local service: " + failureText(local);
  }

  const ko::Future<ko::AnyObject> any = fSession->service(name, "");
  const ko::FutureState anyState = any.wait(timeout);
  if (anyState == ko::FutureState::FinishedWithValue && any.value()) {
    if (!localFailure.empty()) {
      KO_LOG_VERBOSE(kCategory) << localFailure << " (found in another process)";
    }
    return any.value();
  }
  if (!localFailure.empty()) {
    KO_LOG_ERROR(kCategory) << localFailure;
  }
  if (anyState == ko::FutureState::Timeout) {
    KO_LOG_ERROR(kCategory) << "session.service(" << name << ") timed out after 30sec.";
  } else {
    KO_LOG_ERROR(kCategory) << "Future exception while checking remote service: "
                            << failureText(any);
  }
  return nullptr;
}

int ZUBroker::parseDeadlockTimeout(const std::string& text) {
  if (text.empty())
    return kDefaultDeadlockTimeout;
  errno = 0;
  char* end = nullptr;
  const long long value = std::strtoll(text.c_str(), &end, 0);
  if (end == text.c_str()) {
    KO_LOG_WARNING(kCategory) << "KO_DEADLOCK_TIMEOUT is not a number: '" << text << "'; using "
                              << kDefaultDeadlockTimeout << " ms";
    return kDefaultDeadlockTimeout;
  }
  return static_cast<int>(std::clamp<long long>(value, INT_MIN + 1, INT_MAX));
}

int ZUBroker::deadlockTimeout() {
  int timeout = gDeadlockTimeout.load(std::memory_order_acquire);
  if (timeout == kUnread) {
    timeout = parseDeadlockTimeout(ko::os::getenv("KO_DEADLOCK_TIMEOUT"));
    gDeadlockTimeout.store(timeout, std::memory_order_release);
  }
  return timeout;
}

void ZUBroker::resetDeadlockTimeoutForTesting() {
  gDeadlockTimeout.store(kUnread, std::memory_order_release);
}

// ---- ZUBrokerManager ---------------------------------------------------------

namespace {
std::mutex gManagerMutex;
std::shared_ptr<ZUBrokerManager> gManager;
}  // namespace

std::shared_ptr<ZUBrokerManager> ZUBrokerManager::getInstance() {
  std::lock_guard lock(gManagerMutex);
  if (!gManager)
    gManager = std::make_shared<ZUBrokerManager>();
  return gManager;
}

void ZUBrokerManager::setInstance(std::shared_ptr<ZUBrokerManager> manager) {
  std::lock_guard lock(gManagerMutex);
  gManager = std::move(manager);
}

void ZUBrokerManager::addBroker(const std::shared_ptr<ZUBroker>& broker) {
  if (!broker)
    return;
  std::lock_guard lock(fMutex);
  xDropExpired();
  for (const auto& b : fBrokers)
    if (b.lock() == broker)
      return;
  fBrokers.push_back(broker);
}

void ZUBrokerManager::removeBroker(const std::shared_ptr<ZUBroker>& broker) {
  std::lock_guard lock(fMutex);
  xDropExpired();
  const auto it =
      std::find_if(fBrokers.begin(), fBrokers.end(),
                   [&](const std::weak_ptr<ZUBroker>& b) { return b.lock() == broker; });
  if (!broker || it == fBrokers.end()) {
    KO_LOG_WARNING("ZUBroker.manager")
        << "Broker " << (broker ? broker->getName() : std::string("(null)")) << " is not managed";
    return;
  }
  fBrokers.erase(it);
}

std::shared_ptr<ZUBroker> ZUBrokerManager::getBroker() const {
  std::lock_guard lock(fMutex);
  for (const auto& b : fBrokers)
    if (auto broker = b.lock())
      return broker;
  return nullptr;
}

std::shared_ptr<ZUBroker> ZUBrokerManager::getBrokerByName(const std::string& name) const {
  std::lock_guard lock(fMutex);
  for (const auto& b : fBrokers)
    if (auto broker = b.lock(); broker && broker->getName() == name)
      return broker;
  return nullptr;
}

std::vector<std::shared_ptr<ZUBroker>> ZUBrokerManager::getBrokers() const {
  std::lock_guard lock(fMutex);
  std::vector<std::shared_ptr<ZUBroker>> out;
  for (const auto& b : fBrokers)
    if (auto broker = b.lock())
      out.push_back(std::move(broker));
  return out;
}

void ZUBrokerManager::xDropExpired() {
  fBrokers.erase(std::remove_if(fBrokers.begin(), fBrokers.end(),
                                [](const std::weak_ptr<ZUBroker>& b) { return b.expired(); }),
                 fBrokers.end());
}

}  // namespace ZU
