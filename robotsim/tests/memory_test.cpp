// ZUMemory driven through its proxy, as the service drives it: deliveries, subscriptions,
// stored values, failing subscribers and the lifetimes of callbacks.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "ko/log.hpp"
#include "ko/reaper.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/zumemory.h"
#include "support/recording_module.h"
#include "zu/zubroker.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

using testing::RecordingModule;

class MemoryTest : public ::testing::Test {
 protected:
  std::shared_ptr<ZU::ZUBroker> broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  std::shared_ptr<ZUMemory> memoryModule = ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory");
  std::shared_ptr<RecordingModule> first =
      ZU::ZUModule::createModule<RecordingModule>(broker, "First");
  std::shared_ptr<RecordingModule> second =
      ZU::ZUModule::createModule<RecordingModule>(broker, "Second");
  ZU::ZUMemoryProxy memory{broker};
};

// Each subscriber gets every event, off the raisers' threads, in each raiser's order
// across the events it is subscribed to.
TEST_F(MemoryTest, EachSubscriberGetsEveryEventInEachRaisersOrder) {
  memory.subscribeToEvent("counter", "First", "onEvent");
  memory.subscribeToEvent("counter", "Second", "onEvent");
  memory.subscribeToEvent("other", "First", "onEvent");
  constexpr int kThreads = 4;
  constexpr int kEach = 100;
  std::vector<std::thread> raisers;
  std::vector<std::thread::id> ids;
  for (int t = 0; t < kThreads; ++t) {
    raisers.emplace_back([&, t] {
      for (int i = 0; i < kEach; ++i) {
        memory.raiseEvent("counter", ZU::ZUValue::makeArray({t, i}));
        if (i % 25 == 0)
          memory.raiseEvent("other", ZU::ZUValue::makeArray({t, i}));
      }
    });
    ids.push_back(raisers.back().get_id());
  }
  for (auto& r : raisers)
    r.join();
  ASSERT_TRUE(first->waitForEvents("counter", kThreads * kEach));
  ASSERT_TRUE(first->waitForEvents("other", kThreads * kEach / 25));
  ASSERT_TRUE(second->waitForEvents("counter", kThreads * kEach));
  EXPECT_TRUE(second->events("other").empty());
  for (const auto* module : {first.get(), second.get()}) {
    std::vector<int> next(kThreads, 0);  // each raiser's next counter
    for (const auto& e : module->events()) {
      const auto t = static_cast<std::size_t>(e.value[0].asInt());
      EXPECT_NE(e.thread, ids[t]);
      EXPECT_EQ(e.message, "");
      // "other" i was raised after counter i and before counter i + 1.
      ASSERT_EQ(e.value[1].asInt(), e.key == "counter" ? next[t]++ : next[t] - 1) << e.key;
    }
  }
}

// A micro event passes its message; a new subscription of the module replaces it; an
// unsubscribed module gets nothing more; bad subscriptions and keys are refused.
TEST_F(MemoryTest, SubscriptionsAreReplacedEndedOrRefused) {
  memory.subscribeToMicroEvent("WordRecognized", "First", "_dialogMatchedInputCallback", "onEvent");
  memory.raiseEvent("WordRecognized", ZU::ZUValue::makeArray({"hello", 0.5F}));
  ASSERT_TRUE(first->waitForEvents("WordRecognized", 1));
  memory.subscribeToEvent("WordRecognized", "First", "onEvent");
  memory.subscribeToEvent("b", "First", "onEvent");
  memory.raiseEvent("WordRecognized", ZU::ZUValue(2));
  ASSERT_TRUE(first->waitForEvents("WordRecognized", 2));
  memory.unsubscribeToEvent("WordRecognized", "First");
  memory.raiseEvent("WordRecognized", ZU::ZUValue(3));
  memory.raiseEvent("b", ZU::ZUValue(4));  // delivered after anything raised before it
  ASSERT_TRUE(first->waitForEvents("b", 1));
  const auto words = first->events("WordRecognized");
  ASSERT_EQ(words.size(), 2U);
  EXPECT_EQ(words[0].message, "_dialogMatchedInputCallback");
  EXPECT_EQ(words[0].value[0].asString(), "hello");
  EXPECT_EQ(words[1].message, "");
  EXPECT_EQ(memoryModule->getSubscribers("WordRecognized"), std::vector<std::string>{});
  EXPECT_EQ(memoryModule->getSubscribers("b"), std::vector<std::string>{"First"});

  EXPECT_THROW(memory.unsubscribeToEvent("WordRecognized", "First"), ZU::ZUError);
  EXPECT_THROW(memory.unsubscribeToEvent("never", "First"), ZU::ZUError);
  EXPECT_THROW(memory.subscribeToEvent("e", "", "onEvent"), ZU::ZUError);
  EXPECT_THROW(memory.raiseEvent("", ZU::ZUValue(1)), ZU::ZUError);
  EXPECT_THROW(memory.declareEvent("", "First"), ZU::ZUError);
}

TEST_F(MemoryTest, GetDataAnswersTheLastValueOrAClearError) {
  for (const auto& value : {ZU::ZUValue(42), ZU::ZUValue(0.25F), ZU::ZUValue("Standing"),
                            ZU::ZUValue::makeBool(true), ZU::ZUValue::makeArray({7, "started"})}) {
    memory.raiseEvent("key", value);
    const ZU::ZUValue read = memoryModule->getData("key");
    EXPECT_EQ(read.toString(), value.toString());
    EXPECT_EQ(read.getType(), value.getType());
  }
  memoryModule->insertData("quiet", ZU::ZUValue(5));
  EXPECT_EQ(memoryModule->getData("quiet").asInt(), 5);
  memory.declareEvent("declaredOnly", "First");
  for (const std::string key : {"unknown", "declaredOnly"}) {
    EXPECT_THAT(ko::test::errorOf([&] { memoryModule->getData(key); }),
                ::testing::EndsWith("\n\tThere is no data for the key '" + key + "'"));
  }
  EXPECT_THAT(memoryModule->getEventList(), ::testing::ElementsAre("declaredOnly", "key", "quiet"));
}

TEST_F(MemoryTest, FailingOrMissingSubscribersAreLoggedAndSkipped) {
  ko::log::ScopedCapture cap;
  auto gone = ZU::ZUModule::createModule<RecordingModule>(broker, "Gone");
  memory.subscribeToEvent("e", "First", "failingCallback");
  memory.subscribeToEvent("e", "Gone", "onEvent");
  memory.subscribeToEvent("e", "NeverThere", "onEvent");
  memory.subscribeToEvent("e", "Second", "noSuchMethod");
  memory.subscribeToEvent("e", "Third", "onEvent");
  auto third = ZU::ZUModule::createModule<RecordingModule>(broker, "Third");
  broker->unregisterModule("Gone");
  gone.reset();

  memory.raiseEvent("e", ZU::ZUValue(1));
  ASSERT_TRUE(third->waitForEvents("e", 1));
  for (const char* line :
       {"First.failingCallback failed on event e", "Module Gone is gone: event e not delivered",
        "Module NeverThere is gone: event e not delivered",
        "Second.noSuchMethod failed on event e"}) {
    EXPECT_TRUE(ko::test::eventually([&] {
      return cap->containsPart("robotsim.memory", ko::log::Error, line);
    })) << line;
  }
  // The failing subscribers' queues go on.
  memory.subscribeToEvent("f", "First", "onEvent");
  memory.raiseEvent("f", ZU::ZUValue(2));
  EXPECT_TRUE(first->waitForEvents("f", 1));
}

// ---- lifetimes --------------------------------------------------------------------

// A callback that holds the memory service, as one that calls back into it does, may
// outlive every owner of the service: the service then dies off its delivery threads, once
// the callback has returned (dying in one, it would free what the thread goes on using).
TEST(MemoryLifetime, ACallbackHoldingTheServiceMayOutliveItsOwners) {
  ko::test::Gate entered, ownersGone, released;
  {
    auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
    ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory");
    ZU::ZUModule::createModule<RecordingModule>(broker, "Holder")
        ->setHook([&](const RecordingModule& self, const std::string&) {
          std::shared_ptr<ko::DynamicObject> held = self.findService("ZUMemory")->dynamicObject();
          entered.open();
          ownersGone.wait();
          held.reset();  // the last reference, in a delivery thread
          released.open();
        });
    ZU::ZUMemoryProxy memory(broker);
    memory.subscribeToEvent("e", "Holder", "onEvent");
    memory.raiseEvent("e", ZU::ZUValue(1));
    ASSERT_TRUE(entered.wait());
  }
  ownersGone.open();
  EXPECT_TRUE(released.wait());
  ko::waitForReaper();
}

TEST_F(MemoryTest, NoCallbackRunsOnceTheUnsubscribeHasReturned) {
  std::atomic<bool> unsubscribed{false};
  std::atomic<int> late{0};
  ko::test::Counter ticks;
  auto subscriber = ZU::ZUModule::createModule<RecordingModule>(broker, "Late");
  subscriber->setHook([&](const RecordingModule&, const std::string& key) {
    const bool tick = key == "tick";
    if (tick && unsubscribed)
      ++late;
    for (int i = 0; i < 20; ++i)
      std::this_thread::yield();
    if (tick && unsubscribed)
      ++late;
    ticks.increment();
  });
  for (int round = 0; round < 100; ++round) {
    unsubscribed = false;
    memory.subscribeToEvent("tick", "Late", "onEvent");
    const int before = ticks.value();
    std::thread raiser([&] {
      for (int i = 0; i < 40; ++i)
        memory.raiseEvent("tick", ZU::ZUValue(i));
    });
    ASSERT_TRUE(ticks.waitFor(before + 1));
    memory.unsubscribeToEvent("tick", "Late");
    unsubscribed = true;
    raiser.join();
    // Whatever was queued for "Late" before this comes first.
    const int flushed = ticks.value() + 1;
    memory.subscribeToEvent("flush", "Late", "onEvent");
    memory.raiseEvent("flush", ZU::ZUValue(round));
    ASSERT_TRUE(ticks.waitFor(flushed));
    memory.unsubscribeToEvent("flush", "Late");
    ASSERT_EQ(late.load(), 0) << "round " << round;
  }
}

TEST_F(MemoryTest, ACallbackMayEndItsOwnSubscription) {
  std::atomic<int> ticks{0};
  ko::test::Counter flushes;
  auto subscriber = ZU::ZUModule::createModule<RecordingModule>(broker, "Self");
  subscriber->setHook([&](const RecordingModule&, const std::string& key) {
    if (key == "tick") {
      ++ticks;
      memory.unsubscribeToEvent("tick", "Self");
    } else {
      flushes.increment();
    }
  });
  memory.subscribeToEvent("tick", "Self", "onEvent");
  memory.subscribeToEvent("flush", "Self", "onEvent");
  for (int i = 0; i < 3; ++i)
    memory.raiseEvent("tick", ZU::ZUValue(i));
  memory.raiseEvent("flush", ZU::ZUValue(0));
  // Deliveries to a module come in raised order: the ticks were all handled first.
  ASSERT_TRUE(flushes.waitFor(1));
  EXPECT_EQ(ticks.load(), 1);
}

}  // namespace
}  // namespace robotsim
