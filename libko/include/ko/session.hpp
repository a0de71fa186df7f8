#pragma once
// The registry of named services of a process, and the lookup of a service by name.
//
// Services are registered under unique names and found by name, in the "local" scope
// (this process) or in any scope (""); only the local scope exists for now. All functions
// are thread-safe; the signals are triggered outside the session's lock, in the thread
// that registered or unregistered the service.

#include <functional>
#include <map>
#include <optional>
#include <shared_mutex>
#include <string>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/future.hpp"
#include "ko/signal.hpp"

namespace ko {

class Session {
 public:
  // May answer a future for a lookup instead of the session (a test that makes a lookup
  // hang or fail); std::nullopt lets the session answer.
  using LookupHook = std::function<std::optional<Future<AnyObject>>(const std::string& name,
                                                                    const std::string& scope)>;

  Session();
  ~Session();
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  // Answers the service's id (never 0). Raises ko::Error "Service '<name>' is already
  // registered" for a name in use, and ko::Error for an empty name or object.
  unsigned registerService(const std::string& name, AnyObject object);
  // Raise ko::Error when no such service is registered.
  void unregisterService(unsigned id);
  void unregisterService(const std::string& name);

  // The service's object. Scope "local": this process; "": any scope. A missing service
  // gives the future error "Cannot find service '<name>'", an unknown scope
  // "Unknown scope '<scope>'".
  Future<AnyObject> service(const std::string& name, const std::string& scope = "") const;
  // The names of the registered services, sorted.
  std::vector<std::string> services() const;

  void setLookupHook(LookupHook hook);

  Signal<unsigned, std::string> serviceRegistered;    // (id, name)
  Signal<unsigned, std::string> serviceUnregistered;  // (id, name)

 private:
  struct Entry {
    unsigned id;
    AnyObject object;
  };
  mutable std::shared_mutex mutex_;
  std::map<std::string, Entry, std::less<>> byName_;
  std::map<unsigned, std::string> byId_;
  unsigned nextId_ = 1;
  LookupHook hook_;
};

}  // namespace ko
