#include "ko/signal.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <stdexcept>
#include <thread>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::test::Gate;
using ::testing::ElementsAre;

TEST(Signal, SubscribersReceiveUntilDisconnected) {
  ko::Signal<int, std::string> sig;
  std::vector<std::string> got;
  const auto a =
      sig.connect([&](int n, std::string s) { got.push_back("a" + std::to_string(n) + s); });
  const auto b =
      sig.connect([&](int n, const std::string& s) { got.push_back("b" + std::to_string(n) + s); });
  EXPECT_NE(a, b);
  EXPECT_NE(a, ko::kInvalidSignalLink);
  EXPECT_EQ(sig.subscriberCount(), 2u);
  sig(1, "x");
  EXPECT_TRUE(sig.disconnect(a));
  EXPECT_FALSE(sig.disconnect(a));
  EXPECT_FALSE(sig.disconnect(b + 1000));
  sig(2, "y");
  sig.disconnectAll();
  sig(3, "z");
  EXPECT_THAT(got, ElementsAre("a1x", "b1x", "b2y"));
  EXPECT_EQ(sig.subscriberCount(), 0u);
  EXPECT_EQ(sig.signature(), "(is)");
}

TEST(Signal, ThrowingSubscriberIsLoggedAndOthersRunOneMayDisconnectItself) {
  ko::log::ScopedCapture cap;
  ko::Signal<int> sig;
  int second = 0, selfCalls = 0;
  sig.connect([](int) { throw std::runtime_error("subscriber broke"); });
  sig.connect([&](int v) { second += v; });
  ko::SignalLink self = 0;
  self = sig.connect([&](int) {
    ++selfCalls;
    EXPECT_TRUE(sig.disconnect(self));
  });
  EXPECT_NO_THROW(sig(5));
  sig(1);
  EXPECT_EQ(second, 6);
  EXPECT_EQ(selfCalls, 1);
  EXPECT_TRUE(cap->containsPart("ko.signal", ko::log::Error, "subscriber broke"));
}

TEST(Signal, DisconnectWaitsForARunningCallInAnotherThread) {
  ko::Signal<int> sig;
  Gate entered, release;
  std::atomic<bool> finished{false};
  const auto link = sig.connect([&](int) {
    entered.open();
    release.wait();
    finished = true;
  });
  std::thread emitter([&] { sig(1); });
  ASSERT_TRUE(entered.wait());
  bool finishedWhenDisconnected = false;
  Gate disconnecting;
  std::thread disconnecter([&] {
    disconnecting.open();
    sig.disconnect(link);
    finishedWhenDisconnected = finished.load();
  });
  EXPECT_TRUE(disconnecting.wait());
  // Long enough for the disconnect to begin waiting; a sleep rather than yields, which a
  // loaded machine turns into a time slice each.
  std::this_thread::sleep_for(std::chrono::milliseconds(1));
  release.open();
  disconnecter.join();
  emitter.join();
  EXPECT_TRUE(finishedWhenDisconnected);
}

TEST(Signal, AnyValueFaceChecksArguments) {
  ko::Signal<int, std::string> sig;
  ko::SignalBase& base = sig;
  std::vector<ko::AnyValue> received;
  int typed = 0;
  base.connectAny([&](const std::vector<ko::AnyValue>& args) { received = args; });
  sig.connect([&](int n, const std::string&) { typed = n; });
  base.triggerAny({7, "seven"});
  EXPECT_EQ(typed, 7);
  ASSERT_EQ(received.size(), 2u);
  EXPECT_EQ(received[1].to<std::string>(), "seven");
  EXPECT_THROW(base.triggerAny({7}), ko::Error);
  EXPECT_THROW(base.triggerAny({"seven", 7}), ko::Error);
  EXPECT_THROW(sig.connect(nullptr), ko::Error);
}

TEST(Signal, DynamicSignalHasARunTimeSignature) {
  ko::DynamicSignal sig("s[m]");
  EXPECT_EQ(sig.signature(), "(s[m])");
  EXPECT_EQ(sig.arity(), 2u);
  std::string name;
  const auto link =
      sig.connectAny([&](const std::vector<ko::AnyValue>& a) { name = a[0].to<std::string>(); });
  sig.triggerAny({"EndOfMokuto", ko::AnyValue::List{1, 2}});
  EXPECT_EQ(name, "EndOfMokuto");
  EXPECT_THROW(sig.triggerAny({}), ko::Error);
  EXPECT_TRUE(sig.disconnect(link));
  EXPECT_THROW(ko::DynamicSignal("[s"), ko::Error);
}

TEST(Signal, ConcurrentConnectTriggerDisconnect) {
  ko::Signal<int> sig;
  std::atomic<long> sum{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 300; ++i) {
        const auto link = sig.connect([&](int v) { sum += v; });
        sig(1);
        sig.disconnect(link);
      }
    });
  }
  for (auto& t : threads)
    t.join();
  EXPECT_GE(sum.load(), 4 * 300);
  EXPECT_EQ(sig.subscriberCount(), 0u);
}

}  // namespace
