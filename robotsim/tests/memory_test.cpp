// ZUMemory driven through its proxy, as the service drives it.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
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

using testing::ReceivedEvent;
using testing::RecordingModule;
using namespace std::chrono_literals;

constexpr auto kBound = 10s;

class MemoryTest : public ::testing::Test {
 protected:
  MemoryTest()
      : broker(ZU::ZUBroker::create(std::make_shared<ko::Session>())),
        timeline(std::make_shared<Timeline>()),
        memoryModule(
            ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory", ZUMemoryOptions{timeline, 4})),
        first(ZU::ZUModule::createModule<RecordingModule>(broker, "First")),
        second(ZU::ZUModule::createModule<RecordingModule>(broker, "Second")),
        memory(broker) {}

  // Waits until `module` got `count` events of `key`.
  static bool waitFor(const RecordingModule& module, const std::string& key, std::size_t count) {
    return module.waitForEvents(
        [&](const std::vector<ReceivedEvent>& events) {
          std::size_t n = 0;
          for (const auto& e : events)
            n += e.key == key ? 1U : 0U;
          return n >= count;
        },
        kBound);
  }

  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<Timeline> timeline;
  std::shared_ptr<ZUMemory> memoryModule;
  std::shared_ptr<RecordingModule> first;
  std::shared_ptr<RecordingModule> second;
  ZU::ZUMemoryProxy memory;
};

TEST_F(MemoryTest, EachSubscriberGetsEveryEventInRaisedOrderOffTheRaisersThread) {
  memory.subscribeToEvent("counter", "First", "onEvent");
  memory.subscribeToEvent("counter", "Second", "onEvent");
  memory.subscribeToEvent("other", "First", "onEvent");
  constexpr int kCount = 300;
  for (int i = 0; i < kCount; ++i) {
    memory.raiseEvent("counter", ZU::ZUValue(i));
    if (i % 50 == 0)
      memory.raiseEvent("other", ZU::ZUValue(i));
  }
  ASSERT_TRUE(waitFor(*first, "counter", kCount));
  ASSERT_TRUE(waitFor(*second, "counter", kCount));

  for (const auto* module : {first.get(), second.get()}) {
    const auto events = module->events("counter");
    ASSERT_EQ(events.size(), static_cast<std::size_t>(kCount));
    for (int i = 0; i < kCount; ++i) {
      EXPECT_EQ(events[static_cast<std::size_t>(i)].value.asInt(), i);
      EXPECT_NE(events[static_cast<std::size_t>(i)].thread, std::this_thread::get_id());
      EXPECT_EQ(events[static_cast<std::size_t>(i)].message, "");
    }
  }
  // One module's queue keeps the order across events too: "other" i comes after counter i.
  ASSERT_TRUE(waitFor(*first, "other", 6));
  const auto all = first->events();
  int lastCounter = -1;
  for (const auto& e : all) {
    if (e.key == "counter")
      lastCounter = e.value.asInt();
    else
      EXPECT_EQ(lastCounter, e.value.asInt());
  }
}

TEST_F(MemoryTest, RaisesFromManyThreadsKeepEachRaisersOrder) {
  memory.subscribeToEvent("burst", "First", "onEvent");
  constexpr int kThreads = 4;
  constexpr int kEach = 100;
  std::vector<std::thread> raisers;
  for (int t = 0; t < kThreads; ++t) {
    raisers.emplace_back([&, t] {
      for (int i = 0; i < kEach; ++i)
        memory.raiseEvent("burst", ZU::ZUValue::makeArray({t, i}));
    });
  }
  for (auto& r : raisers)
    r.join();
  ASSERT_TRUE(waitFor(*first, "burst", kThreads * kEach));
  std::vector<int> next(kThreads, 0);
  for (const auto& e : first->events("burst")) {
    const auto t = static_cast<std::size_t>(e.value[0].asInt());
    EXPECT_EQ(e.value[1].asInt(), next[t]++);
  }
}

TEST_F(MemoryTest, UnsubscribedModuleGetsNothingMore) {
  memory.subscribeToEvent("a", "First", "onEvent");
  memory.subscribeToEvent("b", "First", "onEvent");
  memory.raiseEvent("a", ZU::ZUValue(1));
  memory.unsubscribeToEvent("a", "First");
  memory.raiseEvent("a", ZU::ZUValue(2));
  memory.raiseEvent("b", ZU::ZUValue(3));  // arrives after anything raised before it
  ASSERT_TRUE(waitFor(*first, "b", 1));
  const auto a = first->events("a");
  for (const auto& e : a)
    EXPECT_EQ(e.value.asInt(), 1);
  EXPECT_EQ(memoryModule->getSubscribers("a"), std::vector<std::string>{});
  EXPECT_EQ(memoryModule->getSubscribers("b"), std::vector<std::string>{"First"});
  EXPECT_THROW(memory.unsubscribeToEvent("a", "First"), ZU::ZUError);
  EXPECT_THROW(memory.unsubscribeToEvent("never", "First"), ZU::ZUError);
}

TEST_F(MemoryTest, MicroEventPassesItsMessageAndANewSubscriptionReplacesTheOld) {
  memory.subscribeToMicroEvent("WordRecognized", "First", "_dialogMatchedInputCallback", "onEvent");
  memory.raiseEvent("WordRecognized", ZU::ZUValue::makeArray({"hello", 0.5F}));
  ASSERT_TRUE(waitFor(*first, "WordRecognized", 1));
  EXPECT_EQ(first->events("WordRecognized")[0].message, "_dialogMatchedInputCallback");
  EXPECT_EQ(first->events("WordRecognized")[0].value[0].asString(), "hello");

  memory.subscribeToEvent("WordRecognized", "First", "onEvent");
  memory.raiseEvent("WordRecognized", ZU::ZUValue(2));
  ASSERT_TRUE(waitFor(*first, "WordRecognized", 2));
  const auto events = first->events("WordRecognized");
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(events[1].message, "");
}

TEST_F(MemoryTest, GetDataAnswersTheLastValueOfEachKind) {
  const std::vector<ZU::ZUValue> values = {ZU::ZUValue(42), ZU::ZUValue(0.25F),
                                           ZU::ZUValue("Standing"), ZU::ZUValue::makeBool(true),
                                           ZU::ZUValue::makeArray({7, "started"})};
  for (const auto& value : values) {
    memory.raiseEvent("key", value);
    const ZU::ZUValue read = memoryModule->getData("key");
    EXPECT_EQ(read.toString(), value.toString());
    EXPECT_EQ(read.getType(), value.getType());
  }
  memoryModule->insertData("quiet", ZU::ZUValue(5));
  EXPECT_EQ(memoryModule->getData("quiet").asInt(), 5);
}

TEST_F(MemoryTest, GetDataOfAKeyWithoutValueIsAClearError) {
  memory.declareEvent("declaredOnly", "First");
  for (const std::string key : {"unknown", "declaredOnly"}) {
    try {
      memoryModule->getData(key);
      ADD_FAILURE() << "no error for " << key;
    } catch (const ZU::ZUError& e) {
      EXPECT_EQ(e.description(), "There is no data for the key '" + key + "'");
    }
  }
  const auto list = memoryModule->getEventList();
  EXPECT_NE(std::find(list.begin(), list.end(), "declaredOnly"), list.end());
}

// A log sink that lets a test wait for a line.
class WaitingSink : public ko::log::Sink {
 public:
  void consume(const ko::log::Record& record) override {
    {
      std::lock_guard lock(fMutex);
      fMessages.push_back(record.category + ": " + record.message);
    }
    fChanged.notify_all();
  }
  bool waitFor(const std::string& part) {
    std::unique_lock lock(fMutex);
    return fChanged.wait_for(lock, kBound, [&] {
      return std::any_of(fMessages.begin(), fMessages.end(),
                         [&](const auto& m) { return m.find(part) != std::string::npos; });
    });
  }

 private:
  std::mutex fMutex;
  std::condition_variable fChanged;
  std::vector<std::string> fMessages;
};

TEST_F(MemoryTest, FailingOrMissingSubscribersAreLoggedAndSkipped) {
  ko::log::ScopedCapture cap;
  auto sink = std::make_shared<WaitingSink>();
  ko::log::addSink(sink);
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
  ASSERT_TRUE(waitFor(*third, "e", 1));
  EXPECT_TRUE(sink->waitFor("robotsim.memory: First.failingCallback failed on event e"));
  EXPECT_TRUE(sink->waitFor("robotsim.memory: Module Gone is gone: event e not delivered"));
  EXPECT_TRUE(sink->waitFor("robotsim.memory: Module NeverThere is gone: event e not delivered"));
  EXPECT_TRUE(sink->waitFor("robotsim.memory: Second.noSuchMethod failed on event e"));
  ko::log::removeSink(sink);

  // The failing subscribers' queues go on.
  memory.subscribeToEvent("f", "First", "onEvent");
  memory.raiseEvent("f", ZU::ZUValue(2));
  EXPECT_TRUE(waitFor(*first, "f", 1));
}

TEST_F(MemoryTest, BadSubscriptionsAndKeysAreRefused) {
  EXPECT_THROW(memory.subscribeToEvent("", "First", "onEvent"), ZU::ZUError);
  EXPECT_THROW(memory.subscribeToEvent("e", "", "onEvent"), ZU::ZUError);
  EXPECT_THROW(memory.subscribeToEvent("e", "First", ""), ZU::ZUError);
  EXPECT_THROW(memory.raiseEvent("", ZU::ZUValue(1)), ZU::ZUError);
  EXPECT_THROW(memory.declareEvent("", "First"), ZU::ZUError);
}

// ---- lifetimes --------------------------------------------------------------------

// A subscriber for the lifetime tests: its callback runs a hook that the test gives.
class HookedModule : public ZU::ZUModule {
 public:
  using Hook = std::function<void(const HookedModule& self, const std::string& key)>;
  HookedModule(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name, Hook hook)
      : ZU::ZUModule(broker, name), fHook(std::move(hook)) {
    bindMethods("HookedModule", {{"onEvent",
                                  &HookedModule::onEvent,
                                  "Runs the test's hook.",
                                  {{"memoryKey", "The event."},
                                   {"value", "Its value."},
                                   {"message", "The subscription's message."}}}});
  }
  void onEvent(const std::string& key, const ZU::ZUValue&, const std::string&) {
    fHook(*this, key);
  }

 private:
  const Hook fHook;
};

// A callback that holds the memory service, as one that calls back into it does, may
// outlive every owner of the service: the service then dies off its delivery threads, once
// the callback has returned (dying in one, it would free what the thread goes on using).
TEST(MemoryLifetime, ACallbackHoldingTheServiceMayOutliveItsOwners) {
  ko::test::Gate entered, ownersGone, released;
  {
    auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
    ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory");
    ZU::ZUModule::createModule<HookedModule>(
        broker, "Holder", [&](const HookedModule& self, const std::string&) {
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

// Once unsubscribeToEvent returns, no callback of that subscription runs or begins.
TEST(MemoryLifetime, NoCallbackRunsOnceTheUnsubscribeHasReturned) {
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  auto memoryModule = ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory");
  std::atomic<bool> unsubscribed{false};
  std::atomic<int> late{0};
  ko::test::Counter ticks;
  auto subscriber = ZU::ZUModule::createModule<HookedModule>(
      broker, "Late", [&](const HookedModule&, const std::string& key) {
        const bool tick = key == "tick";
        if (tick && unsubscribed)
          ++late;
        for (int i = 0; i < 20; ++i)
          std::this_thread::yield();
        if (tick && unsubscribed)
          ++late;
        ticks.increment();
      });
  ZU::ZUMemoryProxy memory(broker);
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

TEST(MemoryLifetime, ACallbackMayEndItsOwnSubscription) {
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  auto memoryModule = ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory");
  ZU::ZUMemoryProxy memory(broker);
  std::atomic<int> ticks{0};
  ko::test::Counter flushes;
  auto subscriber = ZU::ZUModule::createModule<HookedModule>(
      broker, "Self", [&](const HookedModule&, const std::string& key) {
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

TEST_F(MemoryTest, RaisesAreOnTheTimeline) {
  memory.raiseEvent("ZUMokuto/EndOfMokuto", ZU::ZUValue(3));
  const auto entries = timeline->entries("ZUMemory", "raiseEvent");
  ASSERT_EQ(entries.size(), 1U);
  EXPECT_EQ(entries[0].arguments.asList().at(0).asString(), "ZUMokuto/EndOfMokuto");
  EXPECT_EQ(entries[0].arguments.asList().at(1).to<int>(), 3);
}

}  // namespace
}  // namespace robotsim
