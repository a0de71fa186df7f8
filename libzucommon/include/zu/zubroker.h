#pragma once
// ZUBroker: registers modules as ko services of a session and finds services by name.
// ZUBrokerManager: the process's set of brokers.

#include <condition_variable>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/session.hpp"

namespace ZU {

class ZUModuleCore;
class ZUBrokerManager;

// The registration of a process's modules with a ko session, and the lookup of services.
// A registered module is kept alive by the broker until it is unregistered; the session
// holds a weak handle on it, so the proxies of other services never keep it alive. All
// functions are thread-safe, from any thread: the session keeps the names unique, and the
// broker's lock guards only its table of modules, never held while the session runs its
// subscribers (who may use the broker); lookups take no lock of the broker. A register
// and an unregister of one name that race each other end as if one came after the other.
//
// A broker is made by create() and owned by its owner (a host, a test); modules hold it
// weakly. Their own threads never hold it (they look services up through the session),
// and if any other framework thread drops the last reference, the broker, with the
// modules it releases, is destroyed on the reaper (ko/reaper.hpp).
class ZUBroker : public std::enable_shared_from_this<ZUBroker> {
  struct Key {};

 public:
  // `manager`: the broker manager that the broker carries; by default the process's.
  static std::shared_ptr<ZUBroker> create(std::shared_ptr<ko::Session> session,
                                          std::string name = "ZUBroker",
                                          std::shared_ptr<ZUBrokerManager> manager = nullptr);
  ZUBroker(Key, std::shared_ptr<ko::Session> session, std::string name,
           std::shared_ptr<ZUBrokerManager> manager);
  ~ZUBroker();
  ZUBroker(const ZUBroker&) = delete;
  ZUBroker& operator=(const ZUBroker&) = delete;

  const std::string& getName() const noexcept { return fName; }
  const std::shared_ptr<ko::Session>& session() const noexcept { return fSession; }
  const std::shared_ptr<ZUBrokerManager>& getBrokerManager() const noexcept { return fManager; }

  // Publishes the module under its name. Raises ZUError "module '<name>'already exists"
  // for a name in use, "Can't register module '<name>'<reason>" for any other failure.
  void registerModule(const std::shared_ptr<ZUModuleCore>& module);
  // Withdraws the service and releases the broker's hold on the module; a failure is
  // logged and answered as false.
  bool unregisterModule(const std::string& name);
  // The module registered under that name by this broker; nullptr when none.
  std::shared_ptr<ZUModuleCore> getModuleByName(const std::string& name) const;

  // The service's object: looked up in the "local" scope, then in any scope, each lookup
  // waiting at most deadlockTimeout() ms. An empty handle when not found.
  ko::AnyObject service(const std::string& name) const;

  // The lookup time-out in ms: KO_DEADLOCK_TIMEOUT (read once per process), else 30000.
  static int deadlockTimeout();
  // The time-out that a value of KO_DEADLOCK_TIMEOUT gives: an integer with automatic base
  // (decimal, 0x hexadecimal, 0 octal), clamped to the int range; 30000 for an empty
  // value or one that is not a number.
  static int parseDeadlockTimeout(const std::string& text);
  // For tests: the next deadlockTimeout() reads the environment again.
  static void resetDeadlockTimeoutForTesting();

 private:
  struct Registration {
    std::shared_ptr<ZUModuleCore> module;
    unsigned serviceId = 0;  // 0 while the registration is being made
    std::uint64_t serial = 0;
  };
  // Withdraws the service, without the broker's lock: the one of `registration` when the
  // broker registered it, otherwise the session's service of that name.
  bool xUnregisterModule(const std::string& name, const std::optional<Registration>& registration);
  // Waits while another thread withdraws the session's service of that name.
  void xWaitForWithdrawal(std::unique_lock<std::mutex>& lock, const std::string& name);

  const std::string fName;
  const std::shared_ptr<ko::Session> fSession;
  const std::shared_ptr<ZUBrokerManager> fManager;
  mutable std::mutex fMutex;
  std::map<std::string, Registration> fModules;
  std::uint64_t fNextSerial = 1;
  std::map<std::string, std::thread::id> fWithdrawing;  // by name, not ours
  std::condition_variable fWithdrawn;
};

// The brokers of the process. The manager that a module library receives with its broker
// becomes the process's instance. Thread-safe.
class ZUBrokerManager {
 public:
  ZUBrokerManager() = default;
  ZUBrokerManager(const ZUBrokerManager&) = delete;
  ZUBrokerManager& operator=(const ZUBrokerManager&) = delete;

  // The process's manager, created on first use unless one was installed.
  static std::shared_ptr<ZUBrokerManager> getInstance();
  static void setInstance(std::shared_ptr<ZUBrokerManager> manager);

  // Adding a broker twice changes nothing.
  void addBroker(const std::shared_ptr<ZUBroker>& broker);
  void removeBroker(const std::shared_ptr<ZUBroker>& broker);
  // The first broker added and still present; nullptr when none.
  std::shared_ptr<ZUBroker> getBroker() const;
  std::shared_ptr<ZUBroker> getBrokerByName(const std::string& name) const;
  std::vector<std::shared_ptr<ZUBroker>> getBrokers() const;

 private:
  // With fMutex held.
  void xDropExpired();

  mutable std::mutex fMutex;
  // Weak: a broker carries its manager, and a broker that is gone leaves the set.
  std::vector<std::weak_ptr<ZUBroker>> fBrokers;
};

}  // namespace ZU
