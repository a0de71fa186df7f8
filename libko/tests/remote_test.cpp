// Sessions linked across a socket, both ends in this process: services found, called,
// posted to and heard through the directory; errors, time-outs, messages that make no
// sense, a listening process that goes and comes back.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <string>
#include <thread>
#include <vector>
#include <zmq.hpp>
#include <zmq_addon.hpp>

#include "ko/dynamicobject.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko/wire.hpp"
#include "ko_test_helpers.hpp"

namespace ko {
namespace {

using namespace std::chrono_literals;

RemoteOptions fastOptions(const std::string& name) {
  RemoteOptions o;
  o.processName = name;
  o.heartbeatInterval = 50ms;
  o.heartbeatTimeout = 2000ms;
  return o;
}

std::string ipcEndpoint(const char* tag) {
  return "ipc:///tmp/ko-remote-test-" + std::to_string(::getpid()) + "-" + tag;
}

// A process of another language, speaking the protocol through a raw DEALER socket.
class RawProcess {
 public:
  explicit RawProcess(const std::string& endpoint) : socket_(context_, zmq::socket_type::dealer) {
    socket_.set(zmq::sockopt::linger, 0);
    socket_.set(zmq::sockopt::rcvtimeo, static_cast<int>(test::kBound / 1ms));
    socket_.connect(endpoint);
  }
  // A MessagePack array (a header, or a list of arguments).
  static std::string list(AnyValue::List items) {
    return wire::encodeValue(AnyValue::list(std::move(items)));
  }
  void send(const std::vector<std::string>& frames) {
    std::vector<zmq::const_buffer> buffers;
    for (const auto& f : frames)
      buffers.push_back(zmq::buffer(f));
    zmq::send_multipart(socket_, buffers);
  }
  // The header of the next message that is no ping; raises ko::Error after the tests' bound.
  wire::Header receive() {
    for (;;) {
      std::vector<zmq::message_t> parts;
      if (!zmq::recv_multipart(socket_, std::back_inserter(parts)))
        throw Error("no answer");
      wire::Header h = wire::decodeHeader(parts.at(0).to_string());
      if (h.kind != wire::MessageKind::Ping)
        return h;
    }
  }

 private:
  zmq::context_t context_;
  zmq::socket_t socket_;
};

// A service of the listening process: arithmetic, failures, a call that never answers, a
// signal and a property.
struct Calculator {
  DynamicObjectBuilder builder;
  test::Gate release;
  std::atomic<int> hanging{0};
  Calculator() {
    builder.setDescription("A calculator");
    builder.advertiseMethod("add", [](int a, int b) { return a + b; });
    builder.advertiseMethod("echo", [](const AnyValue& v) { return v; });
    builder.advertiseMethod("fail", []() -> int { throw Error("\tCalc::fail\n\tno luck"); });
    builder.advertiseMethod("hang", [this]() {
      ++hanging;
      release.wait();
    });
    builder.advertiseSignal<std::string, int>("changed");
    builder.advertiseProperty("level", AnyValue(3));
  }
  ~Calculator() { release.open(); }
};

class RemoteTest : public ::testing::Test {
 protected:
  void SetUp() override {
    endpoint =
        hub->listen(ipcEndpoint(::testing::UnitTest::GetInstance()->current_test_info()->name()),
                    fastOptions("hub"));
    hub->registerService("Calc", local.builder.object());
    peer->connect(endpoint, fastOptions("peer"));
    ASSERT_TRUE(peer->waitForLink(10s));
  }
  void TearDown() override {
    local.release.open();
    peer->closeLink();
    hub->closeLink();
  }

  AnyObject remoteCalc() { return peer->service("Calc").value(10000); }

  Calculator local;
  std::shared_ptr<Session> hub = std::make_shared<Session>();
  std::shared_ptr<Session> peer = std::make_shared<Session>();
  std::string endpoint;
};

TEST_F(RemoteTest, ValuesGoAndComeBackExactly) {
  const AnyObject calc = remoteCalc();
  EXPECT_EQ(calc->call<int>("add", 2, 3), 5);
  EXPECT_EQ(calc->async<int>("add", 40, 2).value(10000), 42);
  for (const AnyValue& v :
       {AnyValue(1.5F), AnyValue(std::int64_t{7}), AnyValue::raw({1, 2}), AnyValue::map({}),
        AnyValue::list({}), AnyValue::none(), AnyValue::tuple({1, "a"}, {"n", "s"}, "T")}) {
    const AnyValue back = calc->call("echo", v);
    EXPECT_EQ(back.signature(), v.signature());
    EXPECT_TRUE(back == v) << v.toString();
  }
  EXPECT_EQ(calc->property("level").value(10000).to<int>(), 3);
  calc->setProperty("level", AnyValue(4)).value(10000);
  EXPECT_EQ(calc->property("level").value(10000).to<int>(), 4);
  EXPECT_TRUE(calc->property("add").hasError(10000));
}

TEST_F(RemoteTest, FailuresComeBackAsTheirText) {
  const AnyObject calc = remoteCalc();
  const struct {
    const char* name;
    std::function<void()> call;
    const char* text;
  } cases[] = {
      {"the method throws", [&] { calc->call<int>("fail"); }, "\tCalc::fail\n\tno luck"},
      {"a bad argument", [&] { calc->call<int>("add", "x", 1); }, "Cannot convert argument 1"},
      {"an unknown method", [&] { calc->call<int>("nothing"); }, "Cannot find method 'nothing'"},
      {"an object cannot travel", [&] { calc->call("echo", AnyValue::pointerTo(AnyValue(1))); },
       "cannot be sent to another process"},
      {"an unknown service", [&] { peer->service("Nobody").value(10000); },
       "Cannot find service 'Nobody'"},
  };
  for (const auto& c : cases)
    EXPECT_THAT(test::errorOf(c.call), ::testing::HasSubstr(c.text)) << c.name;
  EXPECT_EQ(calc->call<int>("add", 1, 1), 2);  // the link goes on
}

TEST_F(RemoteTest, SignalsReachSubscribersInOrderUntilTheyLeave) {
  const AnyObject calc = remoteCalc();
  test::Recorded<int> heard;
  const SignalLink link = calc->connect("changed", [&](std::string, int n) { heard.add(n); });
  auto* changed = local.builder.dynamicObject()->signal<std::string, int>("changed");
  std::vector<int> sent;
  for (int k = 0; k < 50; ++k) {
    sent.push_back(k);
    (*changed)("level", k);
  }
  ASSERT_TRUE(heard.waitFor(50));
  EXPECT_EQ(heard.all(), sent);
  calc->disconnect(link);
  EXPECT_TRUE(test::eventually([&] { return changed->subscriberCount() == 0; }));
  // A post from the other process triggers the signal here.
  test::Gate posted;
  changed->connect([&](std::string what, int) {
    if (what == "posted")
      posted.open();
  });
  calc->post("changed", "posted", 1);
  EXPECT_TRUE(posted.wait());
}

TEST_F(RemoteTest, TheDirectoryHoldsEveryProcesssServicesUnderUniqueNames) {
  DynamicObjectBuilder script;
  script.advertiseMethod("twice", [](int n) { return 2 * n; });
  peer->registerService("Script", script.object());
  EXPECT_EQ(hub->directory().value(10000), (std::vector<std::string>{"Calc", "Script"}));
  EXPECT_EQ(peer->directory().value(10000), (std::vector<std::string>{"Calc", "Script"}));
  EXPECT_EQ(hub->service("Script").value(10000)->call<int>("twice", 21), 42);
  EXPECT_THROW(peer->registerService("Calc", script.object()), Error);
  EXPECT_THROW(hub->registerService("Script", script.object()), Error);

  // A service that leaves leaves every process; its handles go invalid.
  const AnyObject held = hub->service("Script").value(10000);
  peer->unregisterService("Script");
  EXPECT_TRUE(test::eventually([&] { return !held->isValid(); }));
  EXPECT_TRUE(hub->service("Script").hasError(10000));
}

TEST_F(RemoteTest, ACallThatNeverAnswersEndsByItsTimeOut) {
  // The caller's own bound.
  const Future<void> waited = remoteCalc()->async<void>("hang");
  EXPECT_EQ(waited.wait(100), FutureState::Timeout);
  // The session's call time-out.
  auto impatient = std::make_shared<Session>();
  RemoteOptions options = fastOptions("impatient");
  options.callTimeout = 200ms;
  impatient->connect(endpoint, options);
  ASSERT_TRUE(impatient->waitForLink(10s));
  const std::string error =
      impatient->service("Calc").value(10000)->async<void>("hang").error(10000);
  EXPECT_NE(error.find("got no answer in time"), std::string::npos) << error;
  // A pending call ends with a clear error when its caller's link closes.
  const Future<void> pending = remoteCalc()->async<void>("hang");
  ASSERT_TRUE(test::eventually([&] { return local.hanging.load() == 3; }));
  peer->closeLink();
  const std::string interrupted = pending.error(10000);
  EXPECT_NE(interrupted.find("is interrupted: the session has closed its link"), std::string::npos)
      << interrupted;
}

// Messages that make no sense get an error reply (with the request's id when it can be
// read) and leave the listening process serving.
TEST_F(RemoteTest, MessagesThatMakeNoSenseGetAnErrorReply) {
  log::ScopedCapture capture(log::Warning);
  RemoteOptions small = fastOptions("hub");
  small.maxMessageBytes = 2048;
  auto strict = std::make_shared<Session>();
  const std::string at = strict->listen(ipcEndpoint("strict"), small);
  strict->registerService("Calc", local.builder.object());

  RawProcess raw(at);
  const auto send = [&](const std::vector<std::string>& frames) { raw.send(frames); };
  const auto receive = [&] { return raw.receive(); };
  const auto header = RawProcess::list;
  const auto args = RawProcess::list;

  send({header({"ping", 0, 0, 0})});
  EXPECT_EQ(receive().kind, wire::MessageKind::Reset);  // no hello yet
  send({header({"hello", 0, 0, 0, 1, "raw", 1, 1000})});
  ASSERT_EQ(receive().kind, wire::MessageKind::Welcome);

  const struct {
    const char* name;
    std::vector<std::string> frames;
    std::uint64_t id;
    const char* text;
  } cases[] = {
      {"no MessagePack", {"\xc1garbage"}, 0, "Malformed message"},
      {"an unknown kind", {header({"shout", 5, 0, 0})}, 0, "Unknown message kind 'shout'"},
      {"a call without arguments",
       {header({"call", 6, 0, 0, "Calc", "add", 0})},
       6,
       "has 2 frame(s), not 1"},
      {"arguments that are no list",
       {header({"call", 7, 0, 0, "Calc", "add", 0}), wire::encodeValue(AnyValue(1))},
       7,
       "are not a list"},
      {"too large",
       {header({"call", 8, 0, 0, "Calc", "echo", 0}), args({std::string(4096, 'x')})},
       8,
       "exceeds the limit of 2048 bytes"},
      {"an unknown service",
       {header({"call", 9, 0, 0, "Nobody", "add", 0}), args({1, 2})},
       9,
       "Cannot find service 'Nobody'"},
      {"an unknown method",
       {header({"call", 10, 0, 0, "Calc", "mul", 0}), args({1, 2})},
       10,
       "Cannot find method 'mul'"},
      {"an unknown method id",
       {header({"call", 11, 0, 0, "Calc", 7, 0}), args({})},
       11,
       "has no method with id 7"},
      {"a process that is gone",
       {header({"lookup", 12, 99, 0, "Calc"})},
       12,
       "Process #99 is gone"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    send(c.frames);
    const wire::Header reply = receive();
    EXPECT_EQ(reply.kind, wire::MessageKind::Error);
    EXPECT_EQ(reply.id, c.id);
    if (reply.kind == wire::MessageKind::Error) {
      EXPECT_NE(reply.text(0).find(c.text), std::string::npos) << reply.text(0);
    }
  }
  // Still serving, by name as a client of another language calls.
  send({header({"call", 20, 0, 0, "Calc", "add", 0}), args({2, 2})});
  EXPECT_EQ(receive().kind, wire::MessageKind::Reply);
  EXPECT_TRUE(capture->containsPart("ko.remote", log::Warning, "Refused a message"));
  strict->closeLink();
}

TEST_F(RemoteTest, ConnectedProcessesPublishTheirServicesAgainWhenTheListeningOneComesBack) {
  DynamicObjectBuilder script;
  script.advertiseMethod("twice", [](int n) { return 2 * n; });
  peer->registerService("Script", script.object());
  // Shared with the listener, which may be called after the test's end.
  const auto lost = std::make_shared<test::Counter>();
  const auto linked = std::make_shared<test::Counter>();
  peer->setLinkListener([lost, linked](bool up) { (up ? *linked : *lost).increment(); });

  hub->closeLink();
  ASSERT_TRUE(lost->waitFor(1));
  auto again = std::make_shared<Session>();
  again->listen(endpoint, fastOptions("hub again"));
  ASSERT_TRUE(linked->waitFor(1));
  ASSERT_TRUE(test::eventually([&] { return again->service("Script").hasValue(100); }));
  EXPECT_EQ(again->service("Script").value(10000)->call<int>("twice", 4), 8);
  again->closeLink();
}

// The link's I/O thread sleeps a whole heartbeat tick (far longer than the tests' bound
// here) unless woken: messages that come while the process's other threads hold the socket
// to send must wake it all the same.
TEST(RemoteLink, MessagesThatComeWhileOtherThreadsSendAreTakenAtOnce) {
  RemoteOptions sleepy;
  sleepy.processName = "hub";
  sleepy.heartbeatInterval = 10min;
  sleepy.heartbeatTimeout = 20min;
  Session hub;
  const std::string at = hub.listen(ipcEndpoint("sleepy"), sleepy);
  Calculator local;
  hub.registerService("Calc", local.builder.object());
  auto* changed = local.builder.dynamicObject()->signal<std::string, int>("changed");

  RawProcess raw(at);
  raw.send({RawProcess::list({"hello", 0, 0, 0, 1, "raw", 1, 1000})});
  ASSERT_EQ(raw.receive().kind, wire::MessageKind::Welcome);
  raw.send({RawProcess::list({"subscribe", 1, 0, 0, "Calc", "changed"})});
  ASSERT_EQ(raw.receive().kind, wire::MessageKind::Reply);

  // Rounds of calls from the raw process while threads of the hub send signals to it.
  constexpr int kRounds = 20, kCalls = 20, kSenders = 4, kSignals = 50;
  std::uint64_t id = 100;
  for (int round = 0; round < kRounds; ++round) {
    std::vector<std::thread> senders;
    for (int t = 0; t < kSenders; ++t)
      senders.emplace_back([&] {
        for (int k = 0; k < kSignals; ++k)
          (*changed)("burst", k);
      });
    for (int k = 0; k < kCalls; ++k)
      raw.send(
          {RawProcess::list({"call", id++, 0, 0, "Calc", "add", 0}), RawProcess::list({k, 1})});
    for (auto& s : senders)
      s.join();
    int replies = 0;
    for (int signals = 0; replies < kCalls || signals < kSenders * kSignals;) {
      const wire::MessageKind kind = raw.receive().kind;
      ASSERT_TRUE(kind == wire::MessageKind::Reply || kind == wire::MessageKind::Signal);
      ++(kind == wire::MessageKind::Reply ? replies : signals);
    }
  }
  hub.closeLink();
}

TEST(RemoteSecurity, OnlyLoopbackAndIpcEndpointsGoWithoutKeys) {
  const struct {
    const char* endpoint;
    bool local;
  } cases[] = {
      {"ipc:///tmp/robot", true},
      {"tcp://127.0.0.1:5555", true},
      {"tcp://127.1.2.3:*", true},
      {"tcp://localhost:5555", true},
      {"tcp://[::1]:5555", true},
      {"tcp://0.0.0.0:5555", false},
      {"tcp://*:5555", false},
      {"tcp://192.168.1.20:5555", false},
      {"tcp://127.0.0.1.example:1", false},
      {"tcp://robot.local:5555", false},
  };
  for (const auto& c : cases)
    EXPECT_EQ(remote::isLocalEndpoint(c.endpoint), c.local) << c.endpoint;
  Session session;
  EXPECT_THROW(session.listen("tcp://*:0"), Error);
  EXPECT_THROW(session.connect("tcp://192.0.2.1:5555"), Error);
}

TEST(RemoteSecurity, CurveLinksOnlyTheClientsWhoseKeysAreAllowed) {
  log::ScopedCapture capture(log::Warning);
  const auto server = remote::makeKeyPair();
  const auto allowed = remote::makeKeyPair();
  const auto stranger = remote::makeKeyPair();
  RemoteOptions serving;
  serving.curve.secretKey = server.secretKey;
  serving.curve.clientKeys = {allowed.publicKey};
  Session hub;
  const std::string at = hub.listen("tcp://127.0.0.1:*", serving);
  DynamicObjectBuilder answer;
  answer.advertiseMethod("value", [] { return 42; });
  hub.registerService("Answer", answer.object());

  const auto client = [&](const remote::KeyPair& keys) {
    RemoteOptions o;
    o.curve.secretKey = keys.secretKey;
    o.curve.serverKey = server.publicKey;
    auto s = std::make_shared<Session>();
    s->connect(at, o);
    return s;
  };
  const auto friendly = client(allowed);
  ASSERT_TRUE(friendly->waitForLink(10s));
  EXPECT_EQ(friendly->service("Answer").value(10000)->call<int>("value"), 42);
  const auto unknown = client(stranger);
  EXPECT_TRUE(test::eventually(
      [&] { return capture->containsPart("ko.remote", log::Warning, "Refused a connection"); }));
  EXPECT_FALSE(unknown->isLinked());
  unknown->closeLink();
  friendly->closeLink();
  hub.closeLink();
}

}  // namespace
}  // namespace ko
