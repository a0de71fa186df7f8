#include "remote_node.hpp"

#include <sched.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <limits>
#include <random>
#include <set>
#include <utility>
#include <zmq.hpp>
#include <zmq_addon.hpp>

#include "ko/dynamicobject.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"
#include "ko/session.hpp"

namespace ko::detail {

namespace {

constexpr const char* kCategory = "ko.remote";
// How often the I/O thread looks for requests that have waited their time, at least.
constexpr std::chrono::milliseconds kDeadlineTick(100);
using Clock = std::chrono::steady_clock;
using wire::MessageKind;

bool isRequest(MessageKind kind) {
  switch (kind) {
    case MessageKind::Register:
    case MessageKind::Unregister:
    case MessageKind::Lookup:
    case MessageKind::List:
    case MessageKind::Call:
    case MessageKind::Subscribe:
    case MessageKind::Unsubscribe:
    case MessageKind::Property:
    case MessageKind::SetProperty:
      return true;
    default:
      return false;
  }
}

std::string defaultProcessName() {
  std::string program = "process";
  std::ifstream comm("/proc/self/comm");
  std::getline(comm, program);
  return program + " (pid " + std::to_string(::getpid()) + ")";
}

std::string randomInstance() {
  std::random_device device;
  std::uniform_int_distribution<unsigned long long> draw;
  char text[17];
  std::snprintf(text, sizeof text, "%016llx", draw(device));
  return text;
}

std::string milliseconds(std::chrono::milliseconds ms) {
  return std::to_string(ms.count()) + " ms";
}

AnyValue number(std::uint64_t v) {
  return AnyValue::integer(static_cast<std::int64_t>(v), 8, false);
}

// A frame of the bytes: a large one is handed to ZeroMQ as it is (freed once sent, in
// ZeroMQ's I/O thread), a small one copied (cheaper than a second allocation).
zmq::message_t frameOf(std::string&& bytes) {
  constexpr std::size_t kHandOverBytes = 2048;
  if (bytes.size() < kHandOverBytes)
    return zmq::message_t(bytes.data(), bytes.size());
  auto owned = std::make_unique<std::string>(std::move(bytes));
  zmq::message_t frame(
      owned->data(), owned->size(),
      [](void*, void* hint) { delete static_cast<std::string*>(hint); }, owned.get());
  owned.release();
  return frame;
}

// Settles a promise in this thread, unless this is the I/O thread and continuations wait on
// it: those run on the pool.
void settle(Promise<AnyValue> promise, ServingPool& pool, bool onIoThread, bool ok, AnyValue value,
            std::string error) {
  if (!onIoThread) {
    ok ? promise.trySetValue(std::move(value)) : promise.trySetError(std::move(error));
    return;
  }
  if (ok) {
    std::optional<AnyValue> v(std::move(value));
    if (!promise.trySetValueWithoutContinuations(v))
      pool.post([promise, v = std::move(*v)]() mutable { promise.trySetValue(std::move(v)); });
  } else if (!promise.trySetErrorWithoutContinuations(error)) {
    pool.post([promise, error = std::move(error)]() mutable { promise.trySetError(error); });
  }
}

// The ZeroMQ context of the process, shared by its links (one I/O thread carries them all),
// made for the first and ended with the last.
std::shared_ptr<zmq::context_t> makeContext() {
  auto context = std::make_shared<zmq::context_t>(1);
  // ZeroMQ's own I/O thread carries every message between the socket and the wire: it runs
  // at the real-time priority of the link's threads. ZeroMQ aborts the process when it
  // may not raise its threads, so it is asked only once this thread could be raised.
  if (const os::RealtimeScope probe; probe.raised()) {
    zmq_ctx_set(context->handle(), ZMQ_THREAD_SCHED_POLICY, SCHED_FIFO);
    zmq_ctx_set(context->handle(), ZMQ_THREAD_PRIORITY, os::realtimePriority());
  }
  return context;
}

std::shared_ptr<zmq::context_t> processContext() {
  static std::mutex mutex;
  static std::weak_ptr<zmq::context_t> shared;
  std::lock_guard lock(mutex);
  auto context = shared.lock();
  if (!context) {
    context = makeContext();
    shared = context;
  }
  return context;
}

}  // namespace

struct RemoteNode::Sockets {
  // A listening process with CURVE has a context of its own: the authentication handler is
  // bound in the context, for each of its sockets.
  std::shared_ptr<zmq::context_t> context;
  zmq::socket_t socket;
  std::optional<zmq::socket_t> zap;
  std::set<std::string> clientKeys;  // binary, 32 bytes each
};

// ---- start and stop -------------------------------------------------------------------

std::shared_ptr<RemoteNode> RemoteNode::start(Session& session, Role role,
                                              const std::string& endpoint, RemoteOptions options) {
  if (options.processName.empty())
    options.processName = defaultProcessName();
  if (options.heartbeatInterval.count() <= 0 ||
      options.heartbeatTimeout <= options.heartbeatInterval)
    throw Error("The heartbeat time-out must be longer than its interval, and both positive");
  if (const std::string missing =
          remote::missingKeys(endpoint, role == Role::Listening, options.curve);
      !missing.empty())
    throw Error(missing);
  auto node = std::make_shared<RemoteNode>(Key{}, session, role, std::move(options));
  node->xOpen(endpoint);
  node->thread_ = std::thread([n = node.get()] { n->xRun(); });
  return node;
}

RemoteNode::RemoteNode(Key, Session& session, Role role, RemoteOptions options)
    : session_(session),
      role_(role),
      options_(std::move(options)),
      pool_(std::make_shared<ServingPool>("ko.remote", options_.maxServingThreads)) {}

RemoteNode::~RemoteNode() {
  stop();
  if (wakeFd_ >= 0)
    ::close(wakeFd_);
}

void RemoteNode::xOpen(const std::string& endpoint) {
  const CurveKeys& curve = options_.curve;
  sockets_ = std::make_unique<Sockets>();
  sockets_->context = role_ == Role::Listening && !curve.empty() ? makeContext() : processContext();
  wakeFd_ = ::eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  if (wakeFd_ < 0)
    throw Error("Cannot make the wake-up descriptor of the remote link");
  try {
    if (role_ == Role::Connecting) {
      endpoint_ = endpoint;
      xOpenDealer();
      return;
    }
    auto& s = sockets_->socket;
    if (!curve.empty()) {
      // The ZeroMQ authentication handler: the public keys allowed to connect.
      for (const auto& key : curve.clientKeys) {
        std::string binary(32, '\0');
        if (key.size() != 40 ||
            !zmq_z85_decode(reinterpret_cast<std::uint8_t*>(binary.data()), key.c_str()))
          throw Error("Not a CURVE public key: '" + key + "'");
        sockets_->clientKeys.insert(binary);
      }
      sockets_->zap.emplace(*sockets_->context, zmq::socket_type::rep);
      sockets_->zap->set(zmq::sockopt::linger, 0);
      sockets_->zap->bind("inproc://zeromq.zap.01");
    }
    s = zmq::socket_t(*sockets_->context, zmq::socket_type::router);
    s.set(zmq::sockopt::linger, 0);
    s.set(zmq::sockopt::router_mandatory, 1);
    s.set(zmq::sockopt::sndhwm, 0);
    s.set(zmq::sockopt::rcvhwm, 0);
    s.set(zmq::sockopt::maxmsgsize, static_cast<std::int64_t>(options_.maxMessageBytes) * 4);
    if (!curve.empty()) {
      s.set(zmq::sockopt::curve_server, 1);
      s.set(zmq::sockopt::curve_secretkey, curve.secretKey);
    }
    s.bind(endpoint);
    socketFd_ = s.get(zmq::sockopt::fd);
    endpoint_ = s.get(zmq::sockopt::last_endpoint);
    instance_ = randomInstance();
  } catch (const zmq::error_t& e) {
    throw Error("Cannot listen on " + endpoint + ": " + e.what());
  }
  KO_LOG_INFO(kCategory) << options_.processName << " listens on " << endpoint_
                         << (curve.empty() ? "" : " (CURVE)");
}

void RemoteNode::xOpenDealer() {
  const CurveKeys& curve = options_.curve;
  auto& s = sockets_->socket;
  s = zmq::socket_t(*sockets_->context, zmq::socket_type::dealer);
  s.set(zmq::sockopt::linger, 0);
  s.set(zmq::sockopt::immediate, 1);
  s.set(zmq::sockopt::sndhwm, 0);
  s.set(zmq::sockopt::rcvhwm, 0);
  s.set(zmq::sockopt::reconnect_ivl, 100);
  s.set(zmq::sockopt::reconnect_ivl_max, 1000);
  s.set(zmq::sockopt::maxmsgsize, static_cast<std::int64_t>(options_.maxMessageBytes) * 4);
  if (!curve.empty()) {
    s.set(zmq::sockopt::curve_serverkey, curve.serverKey);
    s.set(zmq::sockopt::curve_publickey, remote::publicKeyOf(curve.secretKey));
    s.set(zmq::sockopt::curve_secretkey, curve.secretKey);
  }
  socketFd_ = s.get(zmq::sockopt::fd);
  try {
    s.connect(endpoint_);
  } catch (const zmq::error_t& e) {
    throw Error("Cannot connect to " + endpoint_ + ": " + e.what());
  }
}

void RemoteNode::stop() {
  // Goodbyes, so that the others need not wait for the heartbeat's time-out.
  std::vector<Outgoing> byes;
  {
    std::lock_guard lock(mutex_);
    if (stoppedForRequests_)
      return;
    stoppedForRequests_ = true;
    if (role_ == Role::Connecting && linked_)
      byes.push_back(Outgoing{
          0, {}, wire::encodeHeader({MessageKind::Bye, 0, 0, self_, {}}), std::nullopt, 0});
    for (const auto& [id, p] : peers_)
      byes.push_back(
          Outgoing{id, {}, wire::encodeHeader({MessageKind::Bye, 0, id, 0, {}}), std::nullopt, 0});
  }
  for (auto& b : byes)
    xSend(std::move(b));
  {
    std::lock_guard lock(socketMutex_);
    stopping_ = true;
  }
  if (wakeFd_ >= 0)
    xWakeIo();
  if (thread_.joinable())
    thread_.join();
  {
    std::lock_guard lock(mutex_);
    linked_ = false;
  }
  linkChanged_.notify_all();
  xFailPending(std::nullopt, "the session has closed its link with " + endpoint_);
  xForget(std::nullopt);
  pool_->stop();
}

bool RemoteNode::xOnIoThread() const {
  return std::this_thread::get_id() == ioThread_.load();
}

bool RemoteNode::isLinked() const {
  std::lock_guard lock(mutex_);
  return role_ == Role::Listening || linked_;
}

bool RemoteNode::waitForLink(std::chrono::milliseconds bound) const {
  std::unique_lock lock(mutex_);
  return linkChanged_.wait_for(lock, bound, [this] { return role_ == Role::Listening || linked_; });
}

void RemoteNode::setLinkListener(std::function<void(bool)> listener) {
  std::lock_guard lock(mutex_);
  linkListener_ = std::move(listener);
}

// ---- the I/O thread ---------------------------------------------------------------------

void RemoteNode::xRun() {
  FrameworkThreadScope scope;
  // On the way of every event and call between processes.
  const os::RealtimeScope realtime;
  ioThread_.store(std::this_thread::get_id());
  const auto now = Clock::now();
  hubSeen_ = now;
  nextHello_ = now;
  nextPing_ = now + options_.heartbeatInterval;
  lastNoAnswerLog_ = now;
  for (;;) {
    // The socket's descriptor tells of changes, not of messages that wait: it is waited on
    // only once none waits. A send may take a change in: one of this thread marks
    // ioReadable_, one of another thread wakes this one through wakeFd_.
    ioReadable_ = false;
    const bool more = xReceive();
    const auto nap = xTick();
    if (stopping_)
      break;
    if (more || ioReadable_)
      continue;
    zmq::pollitem_t items[3] = {
        {nullptr, socketFd_, ZMQ_POLLIN, 0},
        {nullptr, wakeFd_, ZMQ_POLLIN, 0},
        {sockets_->zap ? sockets_->zap->handle() : nullptr, 0, ZMQ_POLLIN, 0},
    };
    try {
      zmq::poll(items, sockets_->zap ? 3 : 2, nap);
    } catch (const zmq::error_t& e) {
      if (e.num() != EINTR) {
        KO_LOG_ERROR(kCategory) << "Polling the link failed: " << e.what();
      }
    }
    if (items[1].revents & ZMQ_POLLIN) {
      std::uint64_t count = 0;
      [[maybe_unused]] const auto read = ::read(wakeFd_, &count, sizeof count);
    }
    if (sockets_->zap && (items[2].revents & ZMQ_POLLIN))
      xHandleZap();
  }
  {
    std::lock_guard lock(socketMutex_);
    sockets_->socket.close();
  }
  if (sockets_->zap)
    sockets_->zap->close();
  ioThread_.store(std::thread::id());
}

bool RemoteNode::xReceive() {
  // A bounded batch, so that the heartbeats are kept between batches; taken at once, and
  // handled with the socket free (a caller woken by a reply sends its next call at once).
  std::vector<std::vector<zmq::message_t>> batch;
  {
    // Waits for a sender to let go (a send holds the socket for microseconds): with a
    // try-lock here, messages were left waiting until the next tick.
    std::unique_lock lock(socketMutex_);
    if (stopping_)
      return false;
    try {
      for (std::vector<zmq::message_t> parts; batch.size() < 256; parts.clear()) {
        if (!zmq::recv_multipart(sockets_->socket, std::back_inserter(parts),
                                 zmq::recv_flags::dontwait))
          break;
        batch.push_back(std::move(parts));
      }
    } catch (const zmq::error_t& e) {
      KO_LOG_ERROR(kCategory) << "Receiving failed: " << e.what();
    }
  }
  for (const auto& parts : batch) {
    // Decoded where ZeroMQ received them.
    std::vector<std::string_view> frames;
    frames.reserve(parts.size());
    for (const auto& p : parts)
      frames.emplace_back(p.data<char>(), p.size());
    xHandle(std::move(frames));
  }
  return batch.size() == 256;
}

void RemoteNode::xHandleZap() {
  std::vector<zmq::message_t> parts;
  if (!zmq::recv_multipart(*sockets_->zap, std::back_inserter(parts), zmq::recv_flags::dontwait))
    return;
  // [version, request id, domain, address, routing id, mechanism, credentials...]
  const bool known = parts.size() >= 7 && parts[5].to_string() == "CURVE" &&
                     sockets_->clientKeys.count(parts[6].to_string()) != 0;
  if (!known) {
    KO_LOG_WARNING(kCategory) << "Refused a connection from "
                              << (parts.size() > 3 ? parts[3].to_string() : std::string("?"))
                              << ": its CURVE key is not among the allowed client keys";
  }
  std::vector<zmq::const_buffer> reply{zmq::buffer(std::string_view("1.0")),
                                       zmq::buffer(parts.size() > 1 ? parts[1].data() : nullptr,
                                                   parts.size() > 1 ? parts[1].size() : 0),
                                       zmq::buffer(std::string_view(known ? "200" : "400")),
                                       zmq::buffer(std::string_view(known ? "OK" : "Unknown key")),
                                       zmq::buffer(std::string_view("")),
                                       zmq::buffer(std::string_view(""))};
  zmq::send_multipart(*sockets_->zap, reply);
}

void RemoteNode::xHandle(std::vector<std::string_view> frames) {
  std::string routing;
  if (role_ == Role::Listening) {
    if (frames.size() < 2)
      return;
    routing = frames.front();
    frames.erase(frames.begin());
  }
  std::size_t total = 0;
  for (const auto& f : frames)
    total += f.size();

  Peer* peer = nullptr;
  std::uint32_t peerId = 0;
  if (role_ == Role::Listening) {
    std::lock_guard lock(mutex_);
    const auto it = peersByRouting_.find(routing);
    if (it != peersByRouting_.end()) {
      peer = &peers_.at(it->second);
      peer->lastSeen = Clock::now();
      peerId = peer->id;
    }
  } else {
    hubSeen_ = Clock::now();
  }

  // An error about a message: to its requester, with its id when the header was read.
  const auto refuse = [&](const std::string& text, const std::optional<wire::Header>& header) {
    const std::string who =
        role_ != Role::Listening ? "the listening process"
        : peer ? "process '" + xPeerName(peerId) + "' (#" + std::to_string(peerId) + ")"
               : "a process not introduced yet";
    KO_LOG_WARNING(kCategory) << "Refused a message of " << total << " bytes from " << who << ": "
                              << text;
    if (header && !isRequest(header->kind))
      return;
    wire::Header h;
    h.kind = MessageKind::Error;
    h.id = header ? header->id : 0;
    h.to = role_ == Role::Listening ? peerId : (header ? header->from : 0);
    h.from = role_ == Role::Listening ? 0 : self_;
    h.fields = {AnyValue(text)};
    xSend(Outgoing{h.to, peer ? std::string() : routing, wire::encodeHeader(h), std::nullopt, 0});
  };

  std::optional<wire::Header> header;
  try {
    header = wire::decodeHeader(frames.front());
  } catch (const wire::DecodeError& e) {
    refuse(std::string("Malformed message: ") + e.what(), std::nullopt);
    return;
  }
  if (total > options_.maxMessageBytes) {
    refuse("The message of " + std::to_string(total) + " bytes exceeds the limit of " +
               std::to_string(options_.maxMessageBytes) + " bytes",
           header);
    return;
  }

  if (role_ == Role::Listening) {
    if (header->kind == MessageKind::Hello) {
      if (header->number(0) != wire::kProtocolVersion) {
        refuse("Protocol version " + std::to_string(header->number(0)) +
                   " is not spoken here (version " + std::to_string(wire::kProtocolVersion) + ")",
               std::nullopt);
        return;
      }
      std::uint32_t id = 0;
      {
        std::lock_guard lock(mutex_);
        if (peer) {
          id = peer->id;  // a repeated hello: the same welcome
        } else {
          id = nextPeer_++;
          peers_[id] = Peer{id, routing, header->text(1), Clock::now()};
          peersByRouting_[routing] = id;
        }
      }
      if (!peer) {
        KO_LOG_INFO(kCategory) << "Process '" << header->text(1) << "' joined as #" << id;
      }
      xSend(MessageKind::Welcome, id, 0,
            {AnyValue(wire::kProtocolVersion), AnyValue(id), AnyValue(instance_),
             AnyValue(static_cast<std::int64_t>(options_.heartbeatInterval.count())),
             number(options_.maxMessageBytes)});
      return;
    }
    if (!peer) {
      Outgoing out{0, routing,
                   wire::encodeHeader({MessageKind::Reset,
                                       0,
                                       0,
                                       0,
                                       {AnyValue("this process does not know yours: say hello")}}),
                   std::nullopt, 0};
      xSend(std::move(out));
      return;
    }
    header->from = peerId;  // never taken from the message
    if (header->to != 0) {
      // For another process: relayed as it is, but for its source.
      bool known = false;
      {
        std::lock_guard lock(mutex_);
        known = peers_.count(header->to) != 0;
      }
      if (!known) {
        if (isRequest(header->kind))
          xReplyError(*header, "Process #" + std::to_string(header->to) + " is gone");
        return;
      }
      Outgoing out{header->to, {}, wire::encodeHeader(*header), std::nullopt, 0};
      if (frames.size() > 1)
        out.body = std::string(frames[1]);
      xSend(std::move(out));
      return;
    }
  }

  wire::Message m;
  try {
    m = wire::decodeMessage(frames);
  } catch (const wire::MessageError& e) {
    refuse(std::string("Malformed message: ") + e.what(), e.header());
    return;
  }
  m.header.from = header->from;
  xHandleFor(std::move(m), peer);
}

void RemoteNode::xHandleFor(wire::Message m, Peer* peer) {
  const wire::Header& h = m.header;
  const bool listening = role_ == Role::Listening;
  if (!listening && h.kind != MessageKind::Welcome && h.kind != MessageKind::Reset) {
    std::lock_guard lock(mutex_);
    if (!linked_)
      return;  // for a link that is gone
  }
  const auto serve = [this, &m](void (RemoteNode::*method)(wire::Message)) {
    pool_->post([this, method, m = std::move(m)]() mutable { (this->*method)(std::move(m)); });
  };
  const auto hubOnly = [&] {
    if (listening)
      return true;
    KO_LOG_WARNING(kCategory) << "Ignored a " << wire::messageKindName(h.kind)
                              << " message: only the listening process answers it";
    return false;
  };
  switch (h.kind) {
    case MessageKind::Hello:
      return;
    case MessageKind::Welcome:
      if (!listening)
        xWelcomed(h);
      return;
    case MessageKind::Bye:
      if (listening && peer)
        xPeerGone(peer->id, "it has left", true);
      else if (!listening)
        xLinkLost("the listening process has stopped");
      return;
    case MessageKind::Ping:
      return;
    case MessageKind::Reset:
      if (!listening && isLinked())
        xLinkLost("the listening process does not know this one any more (" + h.text(0) + ")");
      return;
    case MessageKind::Register: {
      if (!hubOnly())
        return;
      const std::string& name = h.text(0);
      std::string taken;
      {
        std::lock_guard dirLock(directoryMutex_);
        const auto it = directory_.find(name);
        if (xLocalService(name) || (it != directory_.end() && it->second.peer != h.from)) {
          taken = "Service '" + name + "' is already registered";
        } else {
          std::lock_guard lock(mutex_);
          directory_[name] = DirectoryEntry{h.from, peer ? peer->name : std::string(), m.body};
          objects_.erase(name);
        }
      }
      if (!taken.empty())
        return xReplyError(h, taken);
      xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
      KO_LOG_VERBOSE(kCategory) << "Service '" << name << "' of process #" << h.from
                                << " is in the directory";
      xAnnounce("registered", name, h.from);
      return;
    }
    case MessageKind::Unregister: {
      if (!hubOnly())
        return;
      const std::string& name = h.text(0);
      bool removed = false;
      {
        std::lock_guard dirLock(directoryMutex_);
        const auto it = directory_.find(name);
        if (it != directory_.end() && it->second.peer == h.from) {
          std::lock_guard lock(mutex_);
          directory_.erase(it);
          objects_.erase(name);
          removed = true;
        }
      }
      if (!removed)
        return xReplyError(h, "No service is registered as '" + name + "' by this process");
      xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
      xAnnounce("unregistered", name, h.from);
      return;
    }
    case MessageKind::Lookup: {
      if (!hubOnly())
        return;
      std::string error;
      const AnyValue info = xServiceInfo(h.text(0), &error);
      if (!error.empty())
        return xReplyError(h, error);
      xSend(MessageKind::Reply, h.from, h.id, {}, &info);
      return;
    }
    case MessageKind::List: {
      if (!hubOnly())
        return;
      const AnyValue value = AnyValue::from(xServiceNames());
      xSend(MessageKind::Reply, h.from, h.id, {}, &value);
      return;
    }
    case MessageKind::Call:
      return serve(&RemoteNode::xServeCall);
    case MessageKind::Post:
      return serve(&RemoteNode::xServePost);
    case MessageKind::Subscribe:
    case MessageKind::Unsubscribe:
      return serve(&RemoteNode::xServeSubscribe);
    case MessageKind::Property:
    case MessageKind::SetProperty:
      return serve(&RemoteNode::xServeProperty);
    case MessageKind::Reply:
      return xComplete(h.id, h.from, Outcome{true, std::move(m.body), {}});
    case MessageKind::Error:
      return xComplete(h.id, h.from, Outcome{false, {}, h.text(0)});
    case MessageKind::Signal: {
      std::shared_ptr<RemoteObject> object;
      {
        std::lock_guard lock(mutex_);
        const auto it = objects_.find(h.text(0));
        if (it != objects_.end() && it->second->peer() == h.from)
          object = it->second;
      }
      if (object)
        object->deliver(h.text(1), std::move(m.body.asList()));
      return;
    }
    case MessageKind::Service:
      if (!listening && h.text(0) == "unregistered") {
        std::shared_ptr<RemoteObject> dropped;  // released outside the lock
        std::lock_guard lock(mutex_);
        const auto it = objects_.find(h.text(1));
        if (it != objects_.end() && it->second->peer() == static_cast<std::uint32_t>(h.number(2))) {
          dropped = std::move(it->second);
          objects_.erase(it);
        }
      }
      return;
    case MessageKind::PeerGone:
      if (!listening) {
        const auto gone = static_cast<std::uint32_t>(h.number(0));
        xFailPending(gone, "process #" + std::to_string(gone) + " is gone (" + h.text(1) + ")");
        xForget(gone);
      }
      return;
  }
}

void RemoteNode::xSend(MessageKind kind, std::uint32_t to, std::uint64_t id,
                       std::vector<AnyValue> fields, Body body) {
  wire::Header h{kind, id, to, 0, std::move(fields)};
  Outgoing out{to, {}, {}, std::nullopt, 0};
  {
    std::lock_guard lock(mutex_);
    out.epoch = epoch_;
    h.from = role_ == Role::Listening ? 0 : self_;
  }
  out.header = wire::encodeHeader(h);
  if (body)
    out.body = body.list ? wire::encodeList(*body.list) : wire::encodeValue(*body.value);
  else if (wire::hasBody(kind))
    out.body = wire::encodeValue(AnyValue());
  xSend(std::move(out));
}

void RemoteNode::xReplyError(const wire::Header& request, const std::string& text) {
  xSend(MessageKind::Error, request.from, request.id, {AnyValue(text)}, nullptr);
}

void RemoteNode::xSend(Outgoing out) {
  std::lock_guard socketLock(socketMutex_);
  auto& s = sockets_->socket;
  if (stopping_ || !s)
    return;
  try {
    xSendLocked(out);
  } catch (const zmq::error_t& e) {
    // The process left between routing and sending.
    KO_LOG_VERBOSE(kCategory) << "A message to #" << out.to << " was not sent: " << e.what();
  }
  // Sending may have taken in the news of a message come meanwhile, which the socket's
  // descriptor then no longer tells: the I/O thread is told.
  if (s.get(zmq::sockopt::events) & ZMQ_POLLIN) {
    if (xOnIoThread()) {
      ioReadable_ = true;
    } else {
      xWakeIo();
    }
  }
}

void RemoteNode::xWakeIo() {
  const std::uint64_t one = 1;
  [[maybe_unused]] const auto written = ::write(wakeFd_, &one, sizeof one);
}

void RemoteNode::xSendLocked(Outgoing& out) {
  auto& s = sockets_->socket;
  if (role_ == Role::Listening) {
    std::string routing = out.routingId;
    if (routing.empty()) {
      std::lock_guard lock(mutex_);
      const auto it = peers_.find(out.to);
      if (it == peers_.end())
        return;  // gone meanwhile
      routing = it->second.routingId;
    }
    s.send(zmq::buffer(routing), zmq::send_flags::sndmore | zmq::send_flags::dontwait);
  } else {
    std::lock_guard lock(mutex_);
    if (out.epoch != 0 && out.epoch != epoch_)
      return;  // for a link that is gone
  }
  s.send(zmq::buffer(out.header), out.body ? zmq::send_flags::sndmore | zmq::send_flags::dontwait
                                           : zmq::send_flags::dontwait);
  if (out.body)
    s.send(frameOf(std::move(*out.body)), zmq::send_flags::dontwait);
}

std::chrono::milliseconds RemoteNode::xTick() {
  const auto now = Clock::now();
  if (role_ == Role::Listening) {
    std::vector<std::pair<std::uint32_t, std::chrono::milliseconds>> silent;
    std::vector<std::uint32_t> all;
    {
      std::lock_guard lock(mutex_);
      for (const auto& [id, p] : peers_) {
        const auto quiet = std::chrono::duration_cast<std::chrono::milliseconds>(now - p.lastSeen);
        if (quiet > options_.heartbeatTimeout)
          silent.emplace_back(id, quiet);
        all.push_back(id);
      }
    }
    for (const auto& [id, quiet] : silent)
      xPeerGone(id, "no sign of life for " + milliseconds(quiet));
    if (now >= nextPing_) {
      nextPing_ = now + options_.heartbeatInterval;
      for (const auto id : all)
        xSend(Outgoing{
            id, {}, wire::encodeHeader({MessageKind::Ping, 0, id, 0, {}}), std::nullopt, 0});
    }
  } else if (isLinked()) {
    const auto quiet = std::chrono::duration_cast<std::chrono::milliseconds>(now - hubSeen_);
    if (quiet > options_.heartbeatTimeout) {
      xLinkLost("no sign of life for " + milliseconds(quiet));
    } else if (now >= nextPing_) {
      nextPing_ = now + options_.heartbeatInterval;
      xSend(Outgoing{
          0, {}, wire::encodeHeader({MessageKind::Ping, 0, 0, self_, {}}), std::nullopt, 0});
    }
  } else if (now >= nextHello_) {
    nextHello_ = now + std::max(options_.heartbeatInterval, std::chrono::milliseconds(250));
    xSend(Outgoing{0,
                   {},
                   wire::encodeHeader(
                       {MessageKind::Hello,
                        0,
                        0,
                        0,
                        {AnyValue(wire::kProtocolVersion), AnyValue(options_.processName),
                         AnyValue(static_cast<std::int64_t>(::getpid())),
                         AnyValue(static_cast<std::int64_t>(options_.heartbeatInterval.count()))}}),
                   std::nullopt,
                   0});
    if (now - lastNoAnswerLog_ > std::chrono::seconds(10)) {
      lastNoAnswerLog_ = now;
      KO_LOG_INFO(kCategory) << "Waiting for the listening process at " << endpoint_;
    }
  }
  // Requests that have waited their time.
  std::vector<std::pair<std::uint64_t, Pending>> expired;
  // The heartbeats are kept a few times per interval; requests with a deadline are looked
  // at more often.
  const auto heartbeatTick =
      std::max(options_.heartbeatInterval / 4, std::chrono::milliseconds(10));
  std::chrono::milliseconds nap = heartbeatTick;
  {
    std::lock_guard lock(mutex_);
    ioNapsLong_ = deadlines_ == 0 && heartbeatTick > kDeadlineTick;
    if (!ioNapsLong_)
      nap = std::min(heartbeatTick, kDeadlineTick);
    if (deadlines_ > 0) {
      for (auto it = pending_.begin(); it != pending_.end();) {
        if (it->second.deadline && *it->second.deadline <= now) {
          expired.emplace_back(it->first, std::move(it->second));
          it = pending_.erase(it);
          --deadlines_;
        } else {
          ++it;
        }
      }
    }
  }
  for (auto& [id, p] : expired)
    p.done(Outcome{false, {}, "The " + p.what + " got no answer in time"});
  return nap;
}

// ---- requests ---------------------------------------------------------------------------

void RemoteNode::xComplete(std::uint64_t id, std::uint32_t from, Outcome outcome) {
  Pending p;
  {
    std::lock_guard lock(mutex_);
    const auto it = pending_.find(id);
    if (it == pending_.end() || it->second.peer != from)
      return;  // answered after its time, or not by the process asked
    p = std::move(it->second);
    if (p.deadline)
      --deadlines_;
    pending_.erase(it);
  }
  if (!outcome.ok)
    outcome.error = outcome.error.empty() ? "The " + p.what + " failed" : outcome.error;
  p.done(std::move(outcome));
}

void RemoteNode::xFailPending(std::optional<std::uint32_t> peer, const std::string& why) {
  std::vector<Pending> failed;
  {
    std::lock_guard lock(mutex_);
    for (auto it = pending_.begin(); it != pending_.end();) {
      if (!peer || it->second.peer == *peer) {
        if (it->second.deadline)
          --deadlines_;
        failed.push_back(std::move(it->second));
        it = pending_.erase(it);
      } else {
        ++it;
      }
    }
  }
  for (auto& p : failed)
    p.done(Outcome{false, {}, "The " + p.what + " is interrupted: " + why});
}

Future<AnyValue> RemoteNode::xRequest(MessageKind kind, std::uint32_t to,
                                      std::vector<AnyValue> fields, Body body, std::string what,
                                      std::chrono::milliseconds timeout) {
  Promise<AnyValue> promise;
  Future<AnyValue> result = promise.future();
  xRequestWith(kind, to, std::move(fields), body, std::move(what), timeout,
               [this, promise](Outcome o) mutable {
                 settle(std::move(promise), *pool_, xOnIoThread(), o.ok, std::move(o.value),
                        std::move(o.error));
               });
  return result;
}

void RemoteNode::xRequestWith(MessageKind kind, std::uint32_t to, std::vector<AnyValue> fields,
                              Body body, std::string what, std::chrono::milliseconds timeout,
                              std::function<void(Outcome)> done) {
  Outgoing out;
  out.to = to;
  std::string error;
  try {
    if (body)
      out.body = body.list ? wire::encodeList(*body.list) : wire::encodeValue(*body.value);
    std::size_t size = out.body ? out.body->size() : 0;
    for (const auto& f : fields)
      size += f.kind() == Kind::String ? f.asString().size() : 8;
    if (size > options_.maxMessageBytes)
      error = "The " + what + " is " + std::to_string(size) + " bytes: more than the limit of " +
              std::to_string(options_.maxMessageBytes) + " bytes";
  } catch (const Error& e) {
    error = "Cannot send the " + what + ": " + e.what();
  }
  wire::Header h{kind, 0, to, 0, std::move(fields)};
  bool wakeIo = false;
  if (error.empty()) {
    std::lock_guard lock(mutex_);
    if (stoppedForRequests_) {
      error = "Cannot send the " + what + ": the session's link is closed";
    } else if (role_ == Role::Connecting && !linked_) {
      error = "Cannot send the " + what + ": no link with " + endpoint_ + " now";
    } else if (role_ == Role::Listening && to != 0 && peers_.count(to) == 0) {
      error = "Cannot send the " + what + ": process #" + std::to_string(to) + " is gone";
    } else {
      h.id = nextId_++;
      h.from = role_ == Role::Listening ? 0 : self_;
      Pending p{to, std::move(what), std::move(done), std::nullopt};
      if (timeout.count() > 0) {
        p.deadline = Clock::now() + timeout;
        ++deadlines_;
        // The I/O thread sleeps for a heartbeat tick, longer than the deadlines' one.
        wakeIo = std::exchange(ioNapsLong_, false);
      }
      pending_.emplace(h.id, std::move(p));
      out.epoch = epoch_;
    }
  }
  if (!error.empty()) {
    done(Outcome{false, {}, error});
    return;
  }
  if (wakeIo && !xOnIoThread())
    xWakeIo();
  out.header = wire::encodeHeader(h);
  if (!out.body && wire::hasBody(kind))
    out.body = wire::encodeValue(AnyValue());
  xSend(std::move(out));
}

Future<AnyValue> RemoteNode::call(std::uint32_t peer, const std::string& service, unsigned methodId,
                                  const std::string& method, const std::vector<AnyValue>& args) {
  return xRequest(MessageKind::Call, peer,
                  {AnyValue(service), AnyValue(methodId),
                   AnyValue(static_cast<std::int64_t>(options_.callTimeout.count()))},
                  args, "call of " + service + "." + method, options_.callTimeout);
}

void RemoteNode::post(std::uint32_t peer, const std::string& service, const std::string& signal,
                      const std::vector<AnyValue>& args) {
  xSend(MessageKind::Post, peer, 0, {AnyValue(service), AnyValue(signal)}, args);
}

Future<void> RemoteNode::subscribe(std::uint32_t peer, const std::string& service,
                                   const std::string& signal) {
  return xRequest(MessageKind::Subscribe, peer, {AnyValue(service), AnyValue(signal)}, nullptr,
                  "subscription to " + service + "." + signal, options_.requestTimeout)
      .andThen([](const AnyValue&) {});
}

void RemoteNode::unsubscribe(std::uint32_t peer, const std::string& service,
                             const std::string& signal) {
  xRequestWith(MessageKind::Unsubscribe, peer, {AnyValue(service), AnyValue(signal)}, nullptr,
               "end of the subscription to " + service + "." + signal, options_.requestTimeout,
               [](const Outcome&) {});
}

Future<AnyValue> RemoteNode::property(std::uint32_t peer, const std::string& service,
                                      const std::string& name) {
  return xRequest(MessageKind::Property, peer, {AnyValue(service), AnyValue(name)}, nullptr,
                  "read of " + service + "." + name, options_.callTimeout);
}

Future<void> RemoteNode::setProperty(std::uint32_t peer, const std::string& service,
                                     const std::string& name, const AnyValue& value) {
  return xRequest(MessageKind::SetProperty, peer, {AnyValue(service), AnyValue(name)}, &value,
                  "change of " + service + "." + name, options_.callTimeout)
      .andThen([](const AnyValue&) {});
}

// ---- the directory ----------------------------------------------------------------------

AnyObject RemoteNode::xLocalService(const std::string& name) const {
  const Future<AnyObject> found = session_.service(name, "local");
  if (found.state() != FutureState::FinishedWithValue)
    return nullptr;
  AnyObject object = found.value();
  return object && object->isValid() ? object : nullptr;
}

AnyValue RemoteNode::xServiceInfo(const std::string& name, std::string* error) {
  AnyValue members;
  std::uint32_t owner = 0;
  std::string process = options_.processName;
  if (const AnyObject local = xLocalService(name)) {
    try {
      members = wire::metaObjectToValue(local->metaObject());
    } catch (const Error& e) {
      *error = "Cannot find service '" + name + "'";
      return {};
    }
  } else {
    std::lock_guard dirLock(directoryMutex_);
    const auto it = directory_.find(name);
    if (it == directory_.end()) {
      *error = "Cannot find service '" + name + "'";
      return {};
    }
    owner = it->second.peer;
    process = it->second.process;
    members = it->second.meta;
  }
  return AnyValue::map({{"name", AnyValue(name)},
                        {"peer", AnyValue(owner)},
                        {"process", AnyValue(process)},
                        {"members", std::move(members)}});
}

std::shared_ptr<RemoteObject> RemoteNode::xMakeRemoteObject(const std::string& name,
                                                            std::uint32_t peer,
                                                            const std::string& process,
                                                            const AnyValue& meta) {
  auto object = std::make_shared<RemoteObject>(weak_from_this(), name, peer, process,
                                               wire::metaObjectFromValue(meta));
  std::lock_guard lock(mutex_);
  auto& cached = objects_[name];
  if (!cached || cached->peer() != peer)
    cached = object;
  return cached;
}

Future<AnyObject> RemoteNode::lookup(const std::string& name) {
  const std::string notFound = "Cannot find service '" + name + "'";
  {
    std::lock_guard lock(mutex_);
    const auto it = objects_.find(name);
    if (it != objects_.end())
      return Future<AnyObject>::fromValue(GenericObject::makeWeak(it->second, name));
  }
  if (role_ == Role::Listening) {
    DirectoryEntry entry;
    {
      std::lock_guard dirLock(directoryMutex_);
      const auto it = directory_.find(name);
      if (it == directory_.end())
        return makeFutureError<AnyObject>(notFound);
      entry = it->second;
    }
    try {
      return Future<AnyObject>::fromValue(GenericObject::makeWeak(
          xMakeRemoteObject(name, entry.peer, entry.process, entry.meta), name));
    } catch (const Error& e) {
      return makeFutureError<AnyObject>(notFound + ": " + e.what());
    }
  }
  Promise<AnyObject> promise;
  Future<AnyObject> result = promise.future();
  xRequestWith(MessageKind::Lookup, 0, {AnyValue(name)}, nullptr, "lookup of " + name,
               options_.requestTimeout, [this, promise, name, notFound](Outcome o) mutable {
                 std::optional<AnyObject> object;
                 std::string error = o.error;
                 if (o.ok) {
                   try {
                     AnyValue peer, process, members;
                     for (const auto& [k, v] : o.value.asMap()) {
                       const std::string key = k.kind() == Kind::String ? k.asString() : "";
                       if (key == "peer")
                         peer = v;
                       else if (key == "process")
                         process = v;
                       else if (key == "members")
                         members = v;
                     }
                     object = GenericObject::makeWeak(
                         xMakeRemoteObject(name, peer.to<std::uint32_t>(),
                                           process.to<std::string>(), members),
                         name);
                   } catch (const std::exception& e) {
                     error = notFound + ": the directory's answer does not read (" + e.what() + ")";
                   }
                 }
                 if (!xOnIoThread()) {
                   object ? promise.trySetValue(*object) : promise.trySetError(error);
                 } else if (object) {
                   if (!promise.trySetValueWithoutContinuations(object))
                     pool_->post([promise, object]() mutable { promise.trySetValue(*object); });
                 } else if (!promise.trySetErrorWithoutContinuations(error)) {
                   pool_->post([promise, error]() mutable { promise.trySetError(error); });
                 }
               });
  return result;
}

std::vector<std::string> RemoteNode::xServiceNames() {
  std::set<std::string> names;
  for (auto& n : session_.services())
    names.insert(std::move(n));
  std::lock_guard dirLock(directoryMutex_);
  for (const auto& [n, e] : directory_)
    names.insert(n);
  return {names.begin(), names.end()};
}

Future<std::vector<std::string>> RemoteNode::directory() {
  if (role_ == Role::Listening)
    return Future<std::vector<std::string>>::fromValue(xServiceNames());
  return xRequest(MessageKind::List, 0, {}, nullptr, "listing of the directory",
                  options_.requestTimeout)
      .andThen([](const AnyValue& v) { return v.to<std::vector<std::string>>(); });
}

void RemoteNode::registerLocal(const std::string& name, const std::function<void()>& insert) {
  {
    std::lock_guard dirLock(directoryMutex_);
    if (directory_.count(name))
      throw Error("Service '" + name + "' is already registered");
    insert();
  }
  xAnnounce("registered", name, 0);
}

void RemoteNode::publish(const std::string& name, const AnyObject& object) {
  if (!isLinked())
    return;  // published when the link is made
  const AnyValue meta = wire::metaObjectToValue(object->metaObject());
  const Future<AnyValue> answer = xRequest(MessageKind::Register, 0, {AnyValue(name)}, &meta,
                                           "registration of " + name, options_.requestTimeout);
  try {
    answer.value();
  } catch (const FutureError& e) {
    // A link lost meanwhile publishes it again once made; a name taken is refused.
    if (std::string(e.what()).find("already registered") != std::string::npos)
      throw Error(e.what());
    KO_LOG_WARNING(kCategory) << "Service '" << name
                              << "' is not in the directory yet: " << e.what();
  }
}

void RemoteNode::withdraw(const std::string& name) {
  xDropForwarders([&](const ForwarderKey& k) { return std::get<1>(k) == name; });
  if (role_ == Role::Listening) {
    xAnnounce("unregistered", name, 0);
    return;
  }
  if (isLinked())
    xRequestWith(MessageKind::Unregister, 0, {AnyValue(name)}, nullptr, "withdrawal of " + name,
                 options_.requestTimeout, [](const Outcome&) {});
}

void RemoteNode::xAnnounce(const std::string& event, const std::string& service,
                           std::uint32_t owner) {
  std::vector<std::uint32_t> peers;
  {
    std::lock_guard lock(mutex_);
    for (const auto& [id, p] : peers_)
      if (id != owner)
        peers.push_back(id);
  }
  for (const auto id : peers)
    xSend(MessageKind::Service, id, 0, {AnyValue(event), AnyValue(service), AnyValue(owner)});
}

void RemoteNode::xPeerGone(std::uint32_t id, const std::string& reason, bool saidGoodbye) {
  std::string name;
  std::vector<std::string> services;
  std::vector<std::uint32_t> others;
  {
    std::lock_guard dirLock(directoryMutex_);
    std::lock_guard lock(mutex_);
    const auto it = peers_.find(id);
    if (it == peers_.end())
      return;
    name = it->second.name;
    peersByRouting_.erase(it->second.routingId);
    peers_.erase(it);
    for (auto e = directory_.begin(); e != directory_.end();) {
      if (e->second.peer == id) {
        services.push_back(e->first);
        e = directory_.erase(e);
      } else {
        ++e;
      }
    }
    for (const auto& [other, p] : peers_)
      others.push_back(other);
  }
  std::string list;
  for (const auto& s : services)
    list += (list.empty() ? "" : ", ") + s;
  const std::string news = "Process '" + name + "' (#" + std::to_string(id) +
                           ") is gone: " + reason +
                           (services.empty() ? "" : "; its services leave the directory: " + list);
  if (saidGoodbye)
    KO_LOG_INFO(kCategory) << news;
  else
    KO_LOG_WARNING(kCategory) << news;
  for (const auto& s : services)
    xAnnounce("unregistered", s, id);
  for (const auto other : others)
    xSend(MessageKind::PeerGone, other, 0, {AnyValue(id), AnyValue(reason)});
  xFailPending(id, "process '" + name + "' is gone (" + reason + ")");
  xForget(id);
}

void RemoteNode::xForget(std::optional<std::uint32_t> peer) {
  std::vector<std::shared_ptr<RemoteObject>> dropped;
  {
    std::lock_guard lock(mutex_);
    for (auto it = objects_.begin(); it != objects_.end();) {
      if (!peer || it->second->peer() == *peer) {
        dropped.push_back(std::move(it->second));
        it = objects_.erase(it);
      } else {
        ++it;
      }
    }
  }
  xDropForwarders([&](const ForwarderKey& k) { return !peer || std::get<0>(k) == *peer; });
}

void RemoteNode::xDropForwarders(const std::function<bool(const ForwarderKey&)>& which) {
  std::vector<Forwarder> dropped;
  {
    std::lock_guard lock(mutex_);
    for (auto it = forwarders_.begin(); it != forwarders_.end();) {
      if (which(it->first)) {
        dropped.push_back(std::move(it->second));
        it = forwarders_.erase(it);
      } else {
        ++it;
      }
    }
  }
  if (dropped.empty())
    return;
  // Disconnecting waits for a running delivery: never on the I/O thread.
  auto disconnect = [dropped = std::move(dropped)] {
    for (const auto& f : dropped) {
      try {
        f.object->disconnect(f.link);
      } catch (const std::exception&) {
        // The service is gone, and its signal with it.
      }
    }
  };
  if (xOnIoThread())
    pool_->post(std::move(disconnect));
  else
    disconnect();
}

// ---- connected --------------------------------------------------------------------------

void RemoteNode::xWelcomed(const wire::Header& h) {
  const auto id = static_cast<std::uint32_t>(h.number(1));
  bool again = false;
  {
    std::lock_guard lock(mutex_);
    if (linked_ && self_ == id && hubInstance_ == h.text(2))
      return;  // the answer to a repeated hello
    again = !hubInstance_.empty();
    self_ = id;
    hubInstance_ = h.text(2);
    linked_ = true;
  }
  hubSeen_ = Clock::now();
  KO_LOG_INFO(kCategory) << options_.processName << " is linked with " << endpoint_
                         << " as process #" << id << (again ? " (again)" : "");
  linkChanged_.notify_all();
  xRegisterAll();
  xNotifyLink(true);
}

void RemoteNode::xRegisterAll() {
  for (const auto& name : session_.services()) {
    const AnyObject object = xLocalService(name);
    if (!object)
      continue;
    AnyValue meta;
    try {
      meta = wire::metaObjectToValue(object->metaObject());
    } catch (const Error&) {
      continue;  // gone meanwhile
    }
    xRequestWith(MessageKind::Register, 0, {AnyValue(name)}, &meta, "registration of " + name,
                 options_.requestTimeout, [name, this](const Outcome& o) {
                   if (!o.ok) {
                     KO_LOG_ERROR(kCategory) << "Service '" << name << "' is not published at "
                                             << endpoint_ << ": " << o.error;
                   }
                 });
  }
}

void RemoteNode::xLinkLost(const std::string& reason) {
  {
    std::lock_guard lock(mutex_);
    if (!linked_)
      return;
    linked_ = false;
    self_ = 0;
    ++epoch_;
  }
  KO_LOG_WARNING(kCategory) << "Lost the link with " << endpoint_ << ": " << reason;
  xFailPending(std::nullopt, "the link with " + endpoint_ + " was lost (" + reason + ")");
  xForget(std::nullopt);
  {
    // What is sent for the link that is gone (an earlier epoch) is dropped from now on.
    std::lock_guard lock(socketMutex_);
    sockets_->socket.close();
    xOpenDealer();
  }
  nextHello_ = Clock::now();
  linkChanged_.notify_all();
  xNotifyLink(false);
}

void RemoteNode::xNotifyLink(bool linked) {
  std::function<void(bool)> listener;
  {
    std::lock_guard lock(mutex_);
    listener = linkListener_;
  }
  if (listener)
    pool_->post([listener, linked] { listener(linked); });
}

std::string RemoteNode::xPeerName(std::uint32_t peer) const {
  std::lock_guard lock(mutex_);
  const auto it = peers_.find(peer);
  return it == peers_.end() ? "#" + std::to_string(peer) : it->second.name;
}

// ---- serving ----------------------------------------------------------------------------

void RemoteNode::xServeCall(wire::Message m) {
  const wire::Header& h = m.header;
  const std::string& name = h.text(0);
  const AnyObject object = xLocalService(name);
  const std::shared_ptr<DynamicObject> target = object ? object->dynamicObject() : nullptr;
  if (!target)
    return xReplyError(h, "Cannot find service '" + name + "' in " + options_.processName);
  const auto& args = m.body.asList();
  unsigned id = 0;
  if (h.isNumber(1)) {
    const std::int64_t n = h.number(1);
    if (n < 0 || n > std::numeric_limits<unsigned>::max() ||
        !target->metaObject().method(static_cast<unsigned>(n)))
      return xReplyError(h, "Service '" + name + "' has no method with id " + std::to_string(n));
    id = static_cast<unsigned>(n);
  } else {
    try {
      id = object->resolveMethod(h.text(1), args);
    } catch (const std::exception& e) {
      return xReplyError(h, e.what());
    }
  }
  Future<AnyValue> result = target->metaCall(id, args, MetaCallType::Direct);
  auto reply = [self = weak_from_this(), h,
                what = name + "." + target->metaObject().method(id)->name](Future<AnyValue> done) {
    const auto node = self.lock();
    if (!node)
      return;
    if (done.hasError(FutureTimeout_None) || done.state() != FutureState::FinishedWithValue) {
      const std::string error = done.error(FutureTimeout_None);
      return node->xReplyError(h, error.empty() ? "The call of " + what + " failed" : error);
    }
    try {
      std::string body = wire::encodeValue(std::move(done).value());
      if (body.size() > node->options_.maxMessageBytes)
        return node->xReplyError(h, "The result of " + what + " is " + std::to_string(body.size()) +
                                        " bytes: more than the limit of " +
                                        std::to_string(node->options_.maxMessageBytes) + " bytes");
      wire::Header r{MessageKind::Reply, h.id, h.from, 0, {}};
      Outgoing out{h.from, {}, {}, std::move(body), 0};
      {
        std::lock_guard lock(node->mutex_);
        out.epoch = node->epoch_;
        r.from = node->role_ == Role::Listening ? 0 : node->self_;
      }
      out.header = wire::encodeHeader(r);
      node->xSend(std::move(out));
    } catch (const Error& e) {
      node->xReplyError(h, "The result of " + what + " cannot be sent: " + e.what());
    }
  };
  if (result.isFinished())
    reply(std::move(result));
  else
    result.then(reply);
}

void RemoteNode::xServePost(wire::Message m) {
  const wire::Header& h = m.header;
  const AnyObject object = xLocalService(h.text(0));
  if (!object) {
    KO_LOG_WARNING(kCategory) << "A post to " << h.text(0) << "." << h.text(1) << " from process #"
                              << h.from << " finds no such service";
    return;
  }
  try {
    object->post(h.text(1), m.body.asList());
  } catch (const std::exception& e) {
    KO_LOG_WARNING(kCategory) << "A post to " << h.text(0) << "." << h.text(1) << " from process #"
                              << h.from << " failed: " << e.what();
  }
}

void RemoteNode::xServeSubscribe(wire::Message m) {
  const wire::Header& h = m.header;
  const ForwarderKey key{h.from, h.text(0), h.text(1)};
  if (h.kind == MessageKind::Unsubscribe) {
    xDropForwarders([&](const ForwarderKey& k) { return k == key; });
    return xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
  }
  {
    std::lock_guard lock(mutex_);
    if (forwarders_.count(key))
      return xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
  }
  const AnyObject object = xLocalService(h.text(0));
  if (!object)
    return xReplyError(h, "Cannot find service '" + h.text(0) + "' in " + options_.processName);
  SignalLink link = kInvalidSignalLink;
  try {
    link = object->connectAny(h.text(1), [self = weak_from_this(), to = h.from, service = h.text(0),
                                          signal = h.text(1)](const std::vector<AnyValue>& args) {
      const auto node = self.lock();
      if (!node)
        return;
      try {
        node->xSend(MessageKind::Signal, to, 0, {AnyValue(service), AnyValue(signal)}, args);
      } catch (const Error& e) {
        KO_LOG_WARNING(kCategory) << "Signal " << service << "." << signal
                                  << " cannot be sent to process #" << to << ": " << e.what();
      }
    });
  } catch (const std::exception& e) {
    return xReplyError(h, e.what());
  }
  {
    std::lock_guard lock(mutex_);
    forwarders_[key] = Forwarder{object, link};
  }
  xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
}

void RemoteNode::xServeProperty(wire::Message m) {
  const wire::Header& h = m.header;
  const AnyObject object = xLocalService(h.text(0));
  if (!object)
    return xReplyError(h, "Cannot find service '" + h.text(0) + "' in " + options_.processName);
  try {
    if (h.kind == MessageKind::Property) {
      const AnyValue value = object->property(h.text(1)).value();
      xSend(MessageKind::Reply, h.from, h.id, {}, &value);
    } else {
      object->setProperty(h.text(1), m.body).value();
      xSend(MessageKind::Reply, h.from, h.id, {}, nullptr);
    }
  } catch (const std::exception& e) {
    xReplyError(h, e.what());
  }
}

// ---- RemoteObject -----------------------------------------------------------------------

RemoteObject::RemoteObject(std::weak_ptr<RemoteNode> node, std::string service, std::uint32_t peer,
                           std::string process, MetaObject meta)
    : node_(std::move(node)),
      service_(std::move(service)),
      peer_(peer),
      process_(std::move(process)),
      meta_(std::move(meta)) {
  if (const auto n = node_.lock())
    deliveries_ = std::make_shared<SerialQueue>(n->pool());
}

std::shared_ptr<RemoteNode> RemoteObject::xNode() const {
  auto node = node_.lock();
  if (!node)
    throw Error("Object is gone: " + service_ + " (the session's link is closed)");
  return node;
}

Future<AnyValue> RemoteObject::metaCall(unsigned methodId, const std::vector<AnyValue>& args,
                                        MetaCallType) {
  const MetaMethod* method = meta_.method(methodId);
  if (!method)
    return makeFutureError<AnyValue>("No method with id " + std::to_string(methodId));
  if (args.size() != method->arity)
    return makeFutureError<AnyValue>("Method " + method->toString() + " takes " +
                                     std::to_string(method->arity) + " argument(s), got " +
                                     std::to_string(args.size()));
  try {
    return xNode()->call(peer_, service_, methodId, method->name, args);
  } catch (const Error& e) {
    return makeFutureError<AnyValue>(e.what());
  }
}

void RemoteObject::metaPost(unsigned signalId, const std::vector<AnyValue>& args) {
  const MetaSignal* signal = meta_.signal(signalId);
  if (!signal)
    throw Error("No signal with id " + std::to_string(signalId));
  xNode()->post(peer_, service_, signal->name, args);
}

Future<SignalLink> RemoteObject::metaConnect(unsigned signalId, SignalSubscriber subscriber) {
  const MetaSignal* meta = meta_.signal(signalId);
  if (!meta)
    return makeFutureError<SignalLink>("No signal with id " + std::to_string(signalId));
  std::shared_ptr<RemoteNode> node;
  try {
    node = xNode();
  } catch (const Error& e) {
    return makeFutureError<SignalLink>(e.what());
  }
  std::shared_ptr<DynamicSignal> signal;
  SignalLink link = kInvalidSignalLink;
  Future<void> ready;
  {
    std::lock_guard lock(mutex_);
    Subscription& s = subscriptions_[meta->name];
    if (!s.signal)
      s.signal = std::make_shared<DynamicSignal>(meta->parametersSignature);
    signal = s.signal;
    link = s.signal->connectAny(std::move(subscriber));
    if (s.count++ == 0)
      s.ready = node->subscribe(peer_, service_, meta->name);
    ready = s.ready;
  }
  // Waited for by the caller (GenericObject::connect); a failure takes the subscriber away.
  return ready.then([this, signal, link, name = meta->name](const Future<void>& done) {
    if (done.hasError(FutureTimeout_None)) {
      signal->disconnect(link);
      std::lock_guard lock(mutex_);
      auto it = subscriptions_.find(name);
      if (it != subscriptions_.end() && --it->second.count == 0)
        subscriptions_.erase(it);
      throw Error(done.error(FutureTimeout_None));
    }
    return link;
  });
}

Future<void> RemoteObject::metaDisconnect(SignalLink link) {
  std::string name;
  std::shared_ptr<DynamicSignal> signal;
  {
    std::lock_guard lock(mutex_);
    for (auto& [n, s] : subscriptions_) {
      if (s.signal && s.signal->disconnect(link)) {
        name = n;
        signal = s.signal;
        if (--s.count == 0)
          subscriptions_.erase(n);
        break;
      }
    }
  }
  if (!signal)
    return makeFutureError<void>("No subscription with link " + std::to_string(link));
  bool last = false;
  {
    std::lock_guard lock(mutex_);
    last = subscriptions_.count(name) == 0;
  }
  if (last) {
    if (const auto node = node_.lock())
      node->unsubscribe(peer_, service_, name);
  }
  return makeFutureValue();
}

Future<AnyValue> RemoteObject::metaProperty(unsigned propertyId) {
  const MetaProperty* p = meta_.property(propertyId);
  if (!p)
    return makeFutureError<AnyValue>("No property with id " + std::to_string(propertyId));
  try {
    return xNode()->property(peer_, service_, p->name);
  } catch (const Error& e) {
    return makeFutureError<AnyValue>(e.what());
  }
}

Future<void> RemoteObject::metaSetProperty(unsigned propertyId, AnyValue value) {
  const MetaProperty* p = meta_.property(propertyId);
  if (!p)
    return makeFutureError<void>("No property with id " + std::to_string(propertyId));
  try {
    return xNode()->setProperty(peer_, service_, p->name, value);
  } catch (const Error& e) {
    return makeFutureError<void>(e.what());
  }
}

void RemoteObject::deliver(const std::string& signal, std::vector<AnyValue> args) {
  std::shared_ptr<DynamicSignal> target;
  {
    std::lock_guard lock(mutex_);
    const auto it = subscriptions_.find(signal);
    if (it == subscriptions_.end() || !deliveries_)
      return;
    target = it->second.signal;
  }
  deliveries_->post([target, signal, service = service_, args = std::move(args)] {
    try {
      target->triggerAny(args);
    } catch (const std::exception& e) {
      KO_LOG_WARNING(kCategory) << "Signal " << service << "." << signal
                                << " came with arguments that do not fit: " << e.what();
    }
  });
}

}  // namespace ko::detail
