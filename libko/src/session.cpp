#include "ko/session.hpp"

#include <mutex>

#include "ko/log.hpp"
#include "remote_node.hpp"

namespace ko {

namespace {
Future<AnyObject> notFound(const std::string& name) {
  return makeFutureError<AnyObject>("Cannot find service '" + name + "'");
}
}  // namespace

Session::Session() = default;

Session::~Session() {
  closeLink();
}

unsigned Session::registerService(const std::string& name, AnyObject object) {
  if (name.empty())
    throw Error("A service name must not be empty");
  if (!object)
    throw Error("Service '" + name + "' has no object");
  unsigned id = 0;
  std::uint64_t serial = 0;
  std::shared_ptr<detail::RemoteNode> remote;
  {
    std::shared_lock lock(mutex_);
    remote = remote_;
  }
  const AnyObject published = object;
  const auto insert = [&] {
    std::unique_lock lock(mutex_);
    if (byName_.count(name))
      throw Error("Service '" + name + "' is already registered");
    id = nextId_++;
    byName_.emplace(name, Entry{id, std::move(object)});
    byId_.emplace(id, name);
    serial = xQueueAnnouncement(true, id, name);
  };
  // Listening: the name must be free in the whole directory.
  if (remote && remote->role() == detail::RemoteNode::Role::Listening)
    remote->registerLocal(name, insert);
  else
    insert();
  KO_LOG_VERBOSE("ko.session") << "Registered service '" << name << "' as #" << id;
  xAnnounce(serial);
  if (remote && remote->role() == detail::RemoteNode::Role::Connecting) {
    try {
      remote->publish(name, published);
    } catch (const Error&) {
      unregisterService(id);
      throw;
    }
  }
  return id;
}

void Session::unregisterService(unsigned id) {
  std::string name;
  AnyObject object;  // released outside the lock
  std::uint64_t serial = 0;
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
    serial = xQueueAnnouncement(false, id, name);
  }
  KO_LOG_VERBOSE("ko.session") << "Unregistered service '" << name << "' (#" << id << ")";
  xAnnounce(serial);
  std::shared_ptr<detail::RemoteNode> remote;
  {
    std::shared_lock lock(mutex_);
    remote = remote_;
  }
  if (remote)
    remote->withdraw(name);
}

std::uint64_t Session::xQueueAnnouncement(bool registered, unsigned id, const std::string& name) {
  std::lock_guard lock(announceMutex_);
  const std::uint64_t serial = nextSerial_++;
  announcements_.push_back(Announcement{serial, registered, id, name});
  return serial;
}

void Session::xAnnounce(std::uint64_t serial) {
  std::unique_lock lock(announceMutex_);
  if (announcing_) {
    // A subscriber's own change is announced after it returns, by the same thread.
    if (announcer_ == std::this_thread::get_id())
      return;
    announced_.wait(lock, [&] { return announcedSerial_ >= serial || !announcing_; });
    if (announcedSerial_ >= serial)
      return;
  }
  announcing_ = true;
  announcer_ = std::this_thread::get_id();
  while (!announcements_.empty()) {
    const Announcement next = std::move(announcements_.front());
    announcements_.pop_front();
    lock.unlock();
    if (next.registered)
      serviceRegistered(next.id, next.name);
    else
      serviceUnregistered(next.id, next.name);
    lock.lock();
    announcedSerial_ = next.serial;
    announced_.notify_all();
  }
  announcing_ = false;
  announcer_ = {};
  announced_.notify_all();
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
  std::shared_ptr<detail::RemoteNode> remote;
  {
    std::shared_lock lock(mutex_);
    const auto it = byName_.find(name);
    if (it != byName_.end())
      return Future<AnyObject>::fromValue(it->second.object);
    remote = remote_;
  }
  if (scope.empty() && remote)
    return remote->lookup(name);
  return notFound(name);
}

std::string Session::listen(const std::string& endpoint, RemoteOptions options) {
  std::lock_guard link(linkMutex_);
  {
    std::shared_lock lock(mutex_);
    if (remote_)
      throw Error("The session is already linked with " + remote_->endpoint());
  }
  auto node = detail::RemoteNode::start(*this, detail::RemoteNode::Role::Listening, endpoint,
                                        std::move(options));
  std::unique_lock lock(mutex_);
  remote_ = node;
  return node->endpoint();
}

void Session::connect(const std::string& endpoint, RemoteOptions options) {
  std::lock_guard link(linkMutex_);
  {
    std::shared_lock lock(mutex_);
    if (remote_)
      throw Error("The session is already linked with " + remote_->endpoint());
  }
  auto node = detail::RemoteNode::start(*this, detail::RemoteNode::Role::Connecting, endpoint,
                                        std::move(options));
  std::unique_lock lock(mutex_);
  remote_ = std::move(node);
}

void Session::closeLink() {
  std::lock_guard link(linkMutex_);
  std::shared_ptr<detail::RemoteNode> node;
  {
    std::unique_lock lock(mutex_);
    node = std::move(remote_);
  }
  if (node)
    node->stop();
}

bool Session::isLinked() const {
  std::shared_lock lock(mutex_);
  return remote_ && remote_->isLinked();
}

bool Session::waitForLink(std::chrono::milliseconds bound) const {
  std::shared_ptr<detail::RemoteNode> node;
  {
    std::shared_lock lock(mutex_);
    node = remote_;
  }
  return node && node->waitForLink(bound);
}

void Session::setLinkListener(std::function<void(bool)> listener) {
  std::shared_lock lock(mutex_);
  if (!remote_)
    throw Error("The session has no link");
  remote_->setLinkListener(std::move(listener));
}

Future<std::vector<std::string>> Session::directory() const {
  std::shared_ptr<detail::RemoteNode> node;
  {
    std::shared_lock lock(mutex_);
    node = remote_;
  }
  if (!node)
    return Future<std::vector<std::string>>::fromValue(services());
  return node->directory();
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
