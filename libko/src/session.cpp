#include "ko/session.hpp"

#include <mutex>

#include "ko/log.hpp"

namespace ko {

namespace {
Future<AnyObject> notFound(const std::string& name) {
  return makeFutureError<AnyObject>("Cannot find service '" + name + "'");
}
}  // namespace

Session::Session() = default;
Session::~Session() = default;

unsigned Session::registerService(const std::string& name, AnyObject object) {
  if (name.empty())
    throw Error("A service name must not be empty");
  if (!object)
    throw Error("Service '" + name + "' has no object");
  unsigned id = 0;
  {
    std::unique_lock lock(mutex_);
    if (byName_.count(name))
      throw Error("Service '" + name + "' is already registered");
    id = nextId_++;
    byName_.emplace(name, Entry{id, std::move(object)});
    byId_.emplace(id, name);
  }
  KO_LOG_VERBOSE("ko.session") << "Registered service '" << name << "' as #" << id;
  serviceRegistered(id, name);
  return id;
}

void Session::unregisterService(unsigned id) {
  std::string name;
  AnyObject object;  // released outside the lock
  {
    std::unique_lock lock(mutex_);
    const auto it = byId_.find(id);
    if (it == byId_.end())
      throw Error("No service is registered with id " + std::to_string(id));
    name = it->second;
    const auto entry = byName_.find(name);
    object = std::move(entry->second.object);
    byName_.erase(entry);
    byId_.erase(it);
  }
  KO_LOG_VERBOSE("ko.session") << "Unregistered service '" << name << "' (#" << id << ")";
  serviceUnregistered(id, name);
}

void Session::unregisterService(const std::string& name) {
  unsigned id = 0;
  {
    std::shared_lock lock(mutex_);
    const auto it = byName_.find(name);
    if (it == byName_.end())
      throw Error("No service is registered as '" + name + "'");
    id = it->second.id;
  }
  unregisterService(id);
}

Future<AnyObject> Session::service(const std::string& name, const std::string& scope) const {
  LookupHook hook;
  {
    std::shared_lock lock(mutex_);
    hook = hook_;
  }
  if (hook) {
    try {
      if (auto answer = hook(name, scope))
        return std::move(*answer);
    } catch (...) {
      return makeFutureError<AnyObject>(detail::currentExceptionText());
    }
  }
  if (!scope.empty() && scope != "local")
    return makeFutureError<AnyObject>("Unknown scope '" + scope + "'");
  std::shared_lock lock(mutex_);
  const auto it = byName_.find(name);
  if (it == byName_.end())
    return notFound(name);
  return Future<AnyObject>::fromValue(it->second.object);
}

std::vector<std::string> Session::services() const {
  std::shared_lock lock(mutex_);
  std::vector<std::string> out;
  out.reserve(byName_.size());
  for (const auto& [name, entry] : byName_)
    out.push_back(name);
  return out;
}

void Session::setLookupHook(LookupHook hook) {
  std::unique_lock lock(mutex_);
  hook_ = std::move(hook);
}

}  // namespace ko
