#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/eventloop.hpp"
#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "zu/zumodule.h"
#include "zu/zuproxy.h"
#include "zutest_modules.h"

namespace {

using ko::AnyValue;
using ::testing::HasSubstr;
using zutest::Greeter;

class TaskTest : public ::testing::Test {
 protected:
  zutest::Process process_;
  std::shared_ptr<Greeter> greeter_ =
      ZU::ZUModule::createModule<Greeter>(process_.broker, "Greeter");
};

TEST_F(TaskTest, WaitWithoutLimitBlocksUntilTheCallEnds) {
  const int id = greeter_->pCall(AnyValue::list({"waitForRelease"}));
  ASSERT_TRUE(greeter_->started.wait());
  EXPECT_TRUE(greeter_->isRunning(id));
  // A limited wait on a call that cannot end yet runs out of time.
  EXPECT_TRUE(greeter_->wait(id, 1));

  std::atomic<bool> released{false};
  std::thread releaser([&] {
    released = true;
    greeter_->release.open();
  });
  EXPECT_FALSE(greeter_->wait(id, 0));
  EXPECT_TRUE(released);
  EXPECT_FALSE(greeter_->isRunning(id));
  releaser.join();
  // An id that never existed answers at once.
  EXPECT_FALSE(greeter_->wait(4242, 0));
  EXPECT_FALSE(greeter_->isRunning(4242));
  greeter_->stop(4242);
}

TEST_F(TaskTest, StopSetsTheFlagThatTheTaskReadsThroughItsCurrentTask) {
  ko::log::ScopedCapture cap;
  const int id = greeter_->pCall(AnyValue::list({"waitForStop"}));
  ASSERT_TRUE(greeter_->started.wait());
  EXPECT_EQ(greeter_->taskId, id);
  greeter_->stop(id);
  EXPECT_FALSE(greeter_->wait(id, 0));
  EXPECT_TRUE(greeter_->stopSeen);
  EXPECT_TRUE(cap->contains("zucommon.zumodulecore", ko::log::Info,
                            "Greeter :Task " + std::to_string(id) + " asked to stop"));
  // Outside a posted call the thread runs no task.
  EXPECT_EQ(greeter_->currentTask(), nullptr);
}

TEST_F(TaskTest, PCallWithoutAMethodNameOrByAnUnknownIdRaises) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  for (const AnyValue& args : {AnyValue::list({}), AnyValue(), AnyValue::list({42, 1})}) {
    EXPECT_EQ(ko::test::errorOf([&] { greeter_->pCall(args); }),
              "\tGreeter::pCall\n\tmissing function name");
    // Called by name, as another service would.
    EXPECT_EQ(zutest::errorOf([&] { proxy.call<int>("pCall", args); }), "missing function name");
  }
  EXPECT_EQ(zutest::errorOf([&] { greeter_->pCallById(9999, AnyValue::list({})); }),
            "Cant find methodId #9999 on module:Greeter");
}

TEST_F(TaskTest, PCallPicksTheOverloadThatTakesTheArguments) {
  const int first = greeter_->pCall(AnyValue::list({"say", "hello"}));
  EXPECT_FALSE(greeter_->wait(first, 0));
  const int second = greeter_->pCall(AnyValue::list({"say", "hi", AnyValue::list({"mode", 2})}));
  EXPECT_NE(first, second);
  EXPECT_FALSE(greeter_->wait(second, 0));
  EXPECT_THAT(greeter_->said.all(), ::testing::ElementsAre("hello", R"(hi with ["mode", 2])"));
}

TEST_F(TaskTest, ACallThatFailsOrWhoseArgumentsDoNotConvertEndsItsTaskAndIsLogged) {
  for (const auto& [args, text] :
       {std::pair(AnyValue::list({"fail"}), "engine overheated"),
        std::pair(AnyValue::list({"add", "one", "two"}), "Cannot convert")}) {
    ko::log::ScopedCapture cap;
    const int id = greeter_->pCall(args);
    EXPECT_FALSE(greeter_->wait(id, 0));
    EXPECT_FALSE(greeter_->isRunning(id));
    EXPECT_TRUE(cap->containsPart("zucommon.zumodulecore", ko::log::Warning, text));
  }
}

// A module whose own call by id throws for one method, as an override of it may.
class Refusing : public Greeter {
 public:
  using Greeter::Greeter;
  ko::Future<AnyValue> metaCall(unsigned methodId, const std::vector<AnyValue>& args,
                                ko::MetaCallType callType) override {
    const ko::MetaMethod* method = metaObject().method(methodId);
    if (method && method->name == "add")
      throw std::runtime_error("call refused");
    return Greeter::metaCall(methodId, args, callType);
  }
};

TEST(TaskEnd, ACallByIdThatThrowsStillEndsItsTask) {
  zutest::Process process;
  const auto refusing = ZU::ZUModule::createModule<Refusing>(process.broker, "Refusing");
  ko::log::ScopedCapture cap;
  const int id = refusing->pCall(AnyValue::list({"add", 1, 2}));
  EXPECT_FALSE(refusing->wait(id, zutest::kBoundMs));
  EXPECT_FALSE(refusing->isRunning(id));
  EXPECT_TRUE(cap->containsPart("zucommon.zumodulecore", ko::log::Warning, "call refused"));
}

// exit() on a module with a loop of its own: the running posted call is waited for, the
// one still queued never runs, and later posts are refused.
class LoopedGreeter : public Greeter {
 public:
  LoopedGreeter(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : Greeter(broker, name) {
    setEventLoop(std::make_shared<ko::EventLoop>(name, 1));
  }
};

TEST(TaskEnd, ExitWaitsForTheRunningCallAndDropsTheQueuedOnes) {
  zutest::Process process;
  const auto greeter = ZU::ZUModule::createModule<LoopedGreeter>(process.broker, "Looped");
  const int running = greeter->pCall(AnyValue::list({"waitForRelease"}));
  ASSERT_TRUE(greeter->started.wait());
  const int queued = greeter->pCall(AnyValue::list({"say", "late"}));
  std::thread exiting([&] { greeter->exit(); });
  ASSERT_TRUE(ko::test::eventually([&] { return greeter->hasExited(); }));
  greeter->release.open();
  exiting.join();
  EXPECT_FALSE(greeter->wait(running, zutest::kBoundMs));
  EXPECT_FALSE(greeter->wait(queued, zutest::kBoundMs));
  EXPECT_TRUE(greeter->said.all().empty());
  EXPECT_TRUE(greeter->hasExited());
  EXPECT_EQ(zutest::errorOf([&] {
              greeter->pCall(AnyValue::list({"say", "later"}));
            }),
            "Module Looped has exited");
  EXPECT_EQ(process.broker->getModuleByName("Looped"), nullptr);
}

TEST_F(TaskTest, PostsFromManyThreadsGetDistinctIdsAndAllEnd) {
  constexpr int kThreads = 4;
  constexpr int kPosts = 25;
  std::vector<std::vector<int>> ids(kThreads);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      const ZU::ZUProxy proxy("Greeter", process_.broker);
      for (int i = 0; i < kPosts; ++i)
        ids[static_cast<std::size_t>(t)].push_back(proxy.post("say", "t" + std::to_string(t)));
      for (const int id : ids[static_cast<std::size_t>(t)])
        EXPECT_FALSE(proxy.wait(id, 0));
    });
  }
  for (auto& th : threads)
    th.join();
  std::set<int> distinct;
  for (const auto& list : ids)
    distinct.insert(list.begin(), list.end());
  EXPECT_EQ(distinct.size(), static_cast<std::size_t>(kThreads * kPosts));
  EXPECT_EQ(greeter_->said.all().size(), static_cast<std::size_t>(kThreads * kPosts));
}

}  // namespace
