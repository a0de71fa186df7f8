#pragma once
// The link of a session with the other processes: one ZeroMQ socket (a ROUTER bound by the
// listening process, a DEALER in each connected one), served by one I/O thread, and the
// threads that run the calls and deliver the signals that come in.
//
// Threads: the I/O thread receives; it decodes headers, routes messages, keeps the directory
// (listening) and the link state (connected), answers the requests it can answer itself and
// completes the futures of the replies, never running code of the services nor their
// callers' continuations. Calls, posts, subscriptions and properties that come in run on the
// serving threads; the signals of one remote object are delivered in order, one at a time.
// Every thread sends itself, on the socket under its mutex (no hand-over to the I/O thread
// on the way of a call). One mutex guards the node's tables, the socket has its own; neither
// is held while a service, a subscriber or a continuation runs.

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <thread>
#include <tuple>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/dynamicobject.hpp"
#include "ko/future.hpp"
#include "ko/metaobject.hpp"
#include "ko/remote.hpp"
#include "ko/signal.hpp"
#include "ko/wire.hpp"

namespace ko {
class Session;
namespace detail {

class RemoteObject;

// Threads started on demand, each running one job at a time: a call that blocks (a say, a
// blocking bookmark) holds its thread, and the next call gets another. Jobs still queued at
// stop() are dropped. Framework threads (ko/reaper.hpp).
class ServingPool {
 public:
  ServingPool(std::string name, std::size_t maxThreads);
  ~ServingPool();
  ServingPool(const ServingPool&) = delete;
  ServingPool& operator=(const ServingPool&) = delete;

  void post(std::function<void()> job);
  // Joins the threads (a pool thread that stops its own pool leaves once its job returns).
  void stop();

  struct State;

 private:
  std::shared_ptr<State> state_;
};

// Jobs run on a pool one after the other, in the order posted.
class SerialQueue : public std::enable_shared_from_this<SerialQueue> {
 public:
  explicit SerialQueue(std::shared_ptr<ServingPool> pool) : pool_(std::move(pool)) {}
  void post(std::function<void()> job);

 private:
  void drain();
  std::shared_ptr<ServingPool> pool_;
  std::mutex mutex_;
  std::deque<std::function<void()>> jobs_;
  bool draining_ = false;
};

class RemoteNode : public std::enable_shared_from_this<RemoteNode> {
  struct Key {};

 public:
  enum class Role { Listening, Connecting };

  // Binds or connects and starts the I/O thread; raises ko::Error for an endpoint that
  // cannot be used (bad address, address in use, missing keys).
  static std::shared_ptr<RemoteNode> start(Session& session, Role role, const std::string& endpoint,
                                           RemoteOptions options);
  RemoteNode(Key, Session& session, Role role, RemoteOptions options);
  ~RemoteNode();
  RemoteNode(const RemoteNode&) = delete;
  RemoteNode& operator=(const RemoteNode&) = delete;

  // Ends the link: a connected process says goodbye, pending requests fail, the threads
  // are joined. Idempotent.
  void stop();

  Role role() const noexcept { return role_; }
  // The endpoint as bound (the port chosen for "tcp://host:*") or connected.
  const std::string& endpoint() const noexcept { return endpoint_; }
  const std::string& processName() const noexcept { return options_.processName; }
  // Listening: always; connected: while welcomed by the listening process.
  bool isLinked() const;
  // Waits at most `bound` until isLinked().
  bool waitForLink(std::chrono::milliseconds bound) const;

  // ---- for the session ----
  // A service of another process, as a handle that goes invalid when it leaves.
  Future<AnyObject> lookup(const std::string& name);
  Future<std::vector<std::string>> directory();
  // Listening: runs `insert` (the local registration) unless another process has the name,
  // under the directory's lock, then tells the others. Raises ko::Error when taken.
  void registerLocal(const std::string& name, const std::function<void()>& insert);
  // Connected: publishes a local service in the directory and waits for the answer (raises
  // ko::Error when the name is taken). Not linked: it is published once linked.
  void publish(const std::string& name, const AnyObject& object);
  // A local service has left.
  void withdraw(const std::string& name);

  // ---- for the remote objects ----
  Future<AnyValue> call(std::uint32_t peer, const std::string& service, unsigned methodId,
                        const std::string& method, const std::vector<AnyValue>& args);
  void post(std::uint32_t peer, const std::string& service, const std::string& signal,
            const std::vector<AnyValue>& args);
  Future<void> subscribe(std::uint32_t peer, const std::string& service, const std::string& signal);
  void unsubscribe(std::uint32_t peer, const std::string& service, const std::string& signal);
  Future<AnyValue> property(std::uint32_t peer, const std::string& service,
                            const std::string& name);
  Future<void> setProperty(std::uint32_t peer, const std::string& service, const std::string& name,
                           const AnyValue& value);
  const std::shared_ptr<ServingPool>& pool() const noexcept { return pool_; }

  // Called with true each time the link is made (again), false when it is lost; in a
  // serving thread.
  void setLinkListener(std::function<void(bool)> listener);

 private:
  struct Outgoing {
    std::uint32_t to = 0;
    std::string routingId;  // listening: set for a process not welcomed yet
    std::string header;
    std::optional<std::string> body;
    std::uint64_t epoch = 0;  // connected: the link it was made for; 0 any
  };
  struct Outcome {
    bool ok = false;
    AnyValue value;
    std::string error;
  };
  struct Pending {
    std::uint32_t peer = 0;
    std::string what;  // "call of ZUMokuto.say", for errors
    std::function<void(Outcome)> done;
    std::optional<std::chrono::steady_clock::time_point> deadline;
  };
  struct Peer {
    std::uint32_t id = 0;
    std::string routingId;
    std::string name;
    std::chrono::steady_clock::time_point lastSeen;
  };
  struct DirectoryEntry {
    std::uint32_t peer = 0;
    std::string process;
    AnyValue meta;
  };
  struct Forwarder {
    AnyObject object;
    SignalLink link = kInvalidSignalLink;
  };
  // The body of a message: a value, or a list of arguments (encoded as a list without
  // being copied into one), or none.
  struct Body {
    Body() : value(nullptr), list(nullptr) {}
    Body(const AnyValue* v) : value(v), list(nullptr) {}
    Body(const std::vector<AnyValue>& l) : value(nullptr), list(&l) {}
    explicit operator bool() const { return value || list; }
    const AnyValue* value;
    const std::vector<AnyValue>* list;
  };
  using ForwarderKey =
      std::tuple<std::uint32_t, std::string, std::string>;  // subscriber, service, signal

  void xOpen(const std::string& endpoint);
  void xOpenDealer();
  void xRun();
  // Returns true when more messages may wait.
  bool xReceive();
  // The frames point into the messages ZeroMQ received, alive for the call.
  void xHandle(std::vector<std::string_view> frames);
  void xHandleFor(wire::Message m, Peer* peer);
  // Returns how long the thread may wait for a message before the next tick.
  std::chrono::milliseconds xTick();
  void xHandleZap();

  // Any thread: sends a message at once.
  void xSend(Outgoing out);
  // Has the I/O thread look at the socket and its tables again.
  void xWakeIo();
  // Under socketMutex_.
  void xSendLocked(Outgoing& out);
  void xSend(wire::MessageKind kind, std::uint32_t to, std::uint64_t id,
             std::vector<AnyValue> fields, Body body = {});
  void xReplyError(const wire::Header& request, const std::string& text);
  Future<AnyValue> xRequest(wire::MessageKind kind, std::uint32_t to, std::vector<AnyValue> fields,
                            Body body, std::string what, std::chrono::milliseconds timeout);
  // `done` runs on the I/O thread (or at once in this one when the request cannot go).
  void xRequestWith(wire::MessageKind kind, std::uint32_t to, std::vector<AnyValue> fields,
                    Body body, std::string what, std::chrono::milliseconds timeout,
                    std::function<void(Outcome)> done);
  void xComplete(std::uint64_t id, std::uint32_t from, Outcome outcome);
  // Fails every pending request to `peer` (every one when nullopt).
  void xFailPending(std::optional<std::uint32_t> peer, const std::string& why);

  // Serving threads.
  void xServeCall(wire::Message m);
  void xServePost(wire::Message m);
  void xServeSubscribe(wire::Message m);
  void xServeProperty(wire::Message m);
  AnyObject xLocalService(const std::string& name) const;

  // Hub.
  // A process that said goodbye is news (info); one lost without a word is a warning.
  void xPeerGone(std::uint32_t peer, const std::string& reason, bool saidGoodbye = false);
  void xAnnounce(const std::string& event, const std::string& service, std::uint32_t owner);
  AnyValue xServiceInfo(const std::string& name, std::string* error);
  // Every service's name, this process's and the others', in order.
  std::vector<std::string> xServiceNames();
  // Both: drop what belongs to a process that is gone (`peer`), or to every one.
  void xForget(std::optional<std::uint32_t> peer);
  void xDropForwarders(const std::function<bool(const ForwarderKey&)>& which);
  // Connected.
  void xLinkLost(const std::string& reason);
  void xWelcomed(const wire::Header& h);
  void xRegisterAll();
  void xNotifyLink(bool linked);

  std::shared_ptr<RemoteObject> xMakeRemoteObject(const std::string& name, std::uint32_t peer,
                                                  const std::string& process, const AnyValue& meta);
  std::string xPeerName(std::uint32_t peer) const;

  Session& session_;
  const Role role_;
  RemoteOptions options_;
  std::string endpoint_;
  std::string instance_;  // listening: this run's identity, told in every welcome
  std::shared_ptr<ServingPool> pool_;

  // The sockets, for the I/O thread alone once it runs.
  struct Sockets;
  std::unique_ptr<Sockets> sockets_;
  int wakeFd_ = -1;
  std::thread thread_;
  std::atomic<std::thread::id> ioThread_{};
  bool xOnIoThread() const;

  // Guards the socket (not the ZAP one): any thread sends, the I/O thread receives. Taken
  // before mutex_.
  std::mutex socketMutex_;
  std::atomic<bool> stopping_ = false;  // set under socketMutex_
  // The I/O thread's: the socket's descriptor, and whether its own send saw a message wait.
  int socketFd_ = -1;
  bool ioReadable_ = false;

  mutable std::mutex mutex_;
  mutable std::condition_variable linkChanged_;
  std::map<std::uint64_t, Pending> pending_;
  std::size_t deadlines_ = 0;  // pending requests with a deadline
  bool ioNapsLong_ = false;    // the I/O thread waits longer than a deadline may
  std::uint64_t nextId_ = 1;
  bool stoppedForRequests_ = false;
  std::uint64_t epoch_ = 1;                                       // counts the links made
  std::map<std::string, std::shared_ptr<RemoteObject>> objects_;  // by service name
  std::map<ForwarderKey, Forwarder> forwarders_;
  std::function<void(bool)> linkListener_;
  // Listening.
  std::map<std::uint32_t, Peer> peers_;
  std::map<std::string, std::uint32_t> peersByRouting_;
  std::uint32_t nextPeer_ = 1;
  std::map<std::string, DirectoryEntry> directory_;  // the other processes' services
  std::mutex directoryMutex_;                        // before mutex_ and the session's
  // Connected.
  std::uint32_t self_ = 0;  // the id the listening process gave; 0 until welcomed
  bool linked_ = false;
  std::string hubInstance_;
  std::chrono::steady_clock::time_point hubSeen_;
  std::chrono::steady_clock::time_point nextHello_;
  std::chrono::steady_clock::time_point nextPing_;
  std::chrono::steady_clock::time_point lastNoAnswerLog_;
};

// A service of another process seen as a local object: its member table is the remote
// one, its calls, posts, subscriptions and properties are messages. Held by the node while
// the service is in the directory; handed out as weak handles.
class RemoteObject : public DynamicObject {
 public:
  RemoteObject(std::weak_ptr<RemoteNode> node, std::string service, std::uint32_t peer,
               std::string process, MetaObject meta);

  bool isRemote() const override { return true; }
  const MetaObject& metaObject() const override { return meta_; }
  Future<AnyValue> metaCall(unsigned methodId, const std::vector<AnyValue>& args,
                            MetaCallType callType = MetaCallType::Auto) override;
  void metaPost(unsigned signalId, const std::vector<AnyValue>& args) override;
  Future<SignalLink> metaConnect(unsigned signalId, SignalSubscriber subscriber) override;
  Future<void> metaDisconnect(SignalLink link) override;
  Future<AnyValue> metaProperty(unsigned propertyId) override;
  Future<void> metaSetProperty(unsigned propertyId, AnyValue value) override;

  std::uint32_t peer() const noexcept { return peer_; }
  const std::string& service() const noexcept { return service_; }
  // A signal of the service, from the node: delivered in order on the serving threads.
  void deliver(const std::string& signal, std::vector<AnyValue> args);

 private:
  struct Subscription {
    std::shared_ptr<DynamicSignal> signal;
    std::size_t count = 0;
    Future<void> ready;
  };
  std::shared_ptr<RemoteNode> xNode() const;

  const std::weak_ptr<RemoteNode> node_;
  const std::string service_;
  const std::uint32_t peer_;
  const std::string process_;
  const MetaObject meta_;
  std::shared_ptr<SerialQueue> deliveries_;
  std::mutex mutex_;
  std::map<std::string, Subscription> subscriptions_;  // by signal name
};

}  // namespace detail
}  // namespace ko
