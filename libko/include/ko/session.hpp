#pragma once
// The registry of named services of a process, and the lookup of a service by name.
//
// Services are registered under unique names and found by name, in the "local" scope
// (this process) or in any scope (""). A session may link its process with others
// (ko/remote.hpp, docs/protocol.md): one session listens on an endpoint and keeps the
// directory of services of every process linked with it, the others connect to it; then
// the scope "" finds the services of every process, a service registered here is
// published in the directory under a name unique in it, and withdrawn when it is
// unregistered or its process ends. All functions are thread-safe.
//
// The signals announce the registrations and withdrawals one at a time, in the order they
// were made, outside the session's lock (a subscriber may use the session). Each is
// triggered in the thread that made the change or, when another thread is announcing at
// that moment, in that thread; registerService and unregisterService return once their
// announcement has been made, except when called from a subscriber (then it follows when
// the subscriber returns).

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>
#include <thread>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/future.hpp"
#include "ko/remote.hpp"
#include "ko/signal.hpp"

namespace ko {

namespace detail {
class RemoteNode;
}

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

  // ---- links with other processes ----
  // Listens on `endpoint` ("tcp://HOST:PORT", "tcp://127.0.0.1:*" for a port of the
  // system's choice, "ipc://PATH") and keeps the directory; answers the endpoint bound.
  // Connects to the session listening on `endpoint`, now and again whenever its process
  // comes back; the link is made in the background (waitForLink). Both raise ko::Error
  // for an endpoint that cannot be used, one that reaches the network without CURVE keys,
  // or a session already linked.
  std::string listen(const std::string& endpoint, RemoteOptions options = {});
  void connect(const std::string& endpoint, RemoteOptions options = {});
  // Ends the link; the other processes' services leave this one, calls to them fail.
  void closeLink();
  // Listening, or connected and welcomed by the listening process.
  bool isLinked() const;
  bool waitForLink(std::chrono::milliseconds bound) const;
  // Called in a framework thread with true each time the link is made (again after the
  // listening process came back), false when it is lost.
  void setLinkListener(std::function<void(bool)> listener);
  // The names of every service of the directory (this process's alone when unlinked).
  Future<std::vector<std::string>> directory() const;

  Signal<unsigned, std::string> serviceRegistered;    // (id, name)
  Signal<unsigned, std::string> serviceUnregistered;  // (id, name)

 private:
  struct Entry {
    unsigned id;
    AnyObject object;
  };
  struct Announcement {
    std::uint64_t serial;
    bool registered;
    unsigned id;
    std::string name;
  };
  // With mutex_ held: queues the announcement of a change; answers its serial.
  std::uint64_t xQueueAnnouncement(bool registered, unsigned id, const std::string& name);
  // Makes the queued announcements up to `serial`, or waits until another thread has.
  void xAnnounce(std::uint64_t serial);

  mutable std::shared_mutex mutex_;
  std::map<std::string, Entry, std::less<>> byName_;
  std::map<unsigned, std::string> byId_;
  unsigned nextId_ = 1;
  LookupHook hook_;
  std::shared_ptr<detail::RemoteNode> remote_;  // under mutex_
  std::mutex linkMutex_;                        // listen, connect and closeLink, one at a time

  std::mutex announceMutex_;  // after mutex_
  std::condition_variable announced_;
  std::deque<Announcement> announcements_;
  std::uint64_t nextSerial_ = 1;
  std::uint64_t announcedSerial_ = 0;
  bool announcing_ = false;
  std::thread::id announcer_;
};

}  // namespace ko
