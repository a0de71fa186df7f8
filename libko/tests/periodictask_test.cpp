#include "ko/periodictask.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <stdexcept>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::test::Counter;
using ko::test::eventually;
using ko::test::Gate;

class PeriodicTaskTest : public ::testing::Test {
 protected:
  Counter calls_;  // of the callback; outlives the task
  std::shared_ptr<ko::EventLoop> loop_ = std::make_shared<ko::EventLoop>("periodic", 4);
  ko::PeriodicTask task_{loop_};
};

TEST_F(PeriodicTaskTest, StopWaitsForTheRunningCallback) {
  Gate entered, release;
  std::atomic<bool> callbackDone{false};
  task_.setCallback([&] {
    if (calls_.increment() == 1) {
      entered.open();
      release.wait();
    }
    callbackDone = true;
  });
  task_.setUsPeriod(1000);
  task_.start();
  ASSERT_TRUE(entered.wait());

  std::atomic<bool> stopReturned{false};
  bool doneWhenStopReturned = false;
  std::thread stopper([&] {
    task_.stop();
    doneWhenStopReturned = callbackDone.load();
    stopReturned = true;
  });
  ASSERT_TRUE(eventually([&] { return task_.isStopping(); }));
  EXPECT_FALSE(stopReturned.load());
  EXPECT_TRUE(task_.isRunning());
  release.open();
  stopper.join();
  EXPECT_TRUE(doneWhenStopReturned);
  EXPECT_FALSE(task_.isRunning());
  EXPECT_FALSE(task_.isStopping());
  EXPECT_EQ(calls_.value(), 1);
}

TEST_F(PeriodicTaskTest, StopFromInsideTheCallbackDoesNotDeadlock) {
  Gate stopReturned;
  task_.setCallback([&] {
    calls_.increment();
    task_.stop();
    EXPECT_TRUE(task_.isStopping());
    stopReturned.open();
  });
  task_.setUsPeriod(0);
  task_.start();
  ASSERT_TRUE(stopReturned.wait());
  task_.stop();  // waits for the callback to return
  EXPECT_FALSE(task_.isRunning());
  EXPECT_EQ(calls_.value(), 1);
}

TEST_F(PeriodicTaskTest, CallbacksNeverOverlap) {
  std::atomic<int> inside{0}, overlaps{0};
  task_.setCallback([&] {
    if (inside.fetch_add(1) != 0)
      ++overlaps;
    std::this_thread::yield();
    inside.fetch_sub(1);
    calls_.increment();
  });
  task_.setUsPeriod(0);
  task_.start();
  // Restarting and period changes while it runs must not produce a second chain of runs.
  for (int i = 0; i < 20; ++i) {
    task_.start();
    task_.setUsPeriod(i % 2);
  }
  ASSERT_TRUE(calls_.waitFor(300));
  task_.stop();
  EXPECT_EQ(overlaps.load(), 0);
}

TEST_F(PeriodicTaskTest, RestartFromTheCallbackCancelsItsOwnStop) {
  task_.setCallback([&] {
    if (calls_.increment() == 1) {
      task_.asyncStop();
      task_.start();
    }
  });
  task_.setUsPeriod(0);
  task_.start();
  ASSERT_TRUE(calls_.waitFor(3));
  task_.stop();
}

// A stop from outside wins over a restart that the running callback makes meanwhile: once
// stop() returns, the task is stopped for good.
TEST_F(PeriodicTaskTest, StopFromOutsideWinsOverARestartFromTheCallback) {
  Gate running;
  task_.setCallback([&] {
    calls_.increment();
    running.open();
    // Wait until the other thread's stop is pending, then try to go on.
    EXPECT_TRUE(eventually([&] { return task_.isStopping(); }));
    task_.start();
  });
  task_.setUsPeriod(0);
  task_.start();
  ASSERT_TRUE(running.wait());
  task_.stop();
  EXPECT_FALSE(task_.isRunning());
  EXPECT_EQ(calls_.value(), 1);
}

TEST_F(PeriodicTaskTest, ThrowingCallbackIsLoggedAndTheTaskGoesOn) {
  ko::log::ScopedCapture cap;
  task_.setName("thrower");
  task_.setCallback([&] {
    calls_.increment();
    throw std::runtime_error("no motion");
  });
  task_.setUsPeriod(0);
  task_.start();
  ASSERT_TRUE(calls_.waitFor(3));
  task_.stop();
  EXPECT_TRUE(cap->containsPart("ko.periodictask", ko::log::Error, "'thrower' threw: no motion"));
}

TEST_F(PeriodicTaskTest, BadUseIsRefusedAndAStoppedLoopStopsItsTasks) {
  task_.setName("empty");
  EXPECT_THROW(task_.start(), ko::Error);
  EXPECT_THROW(task_.setUsPeriod(-1), ko::Error);
  task_.stop();  // stopping a task that never ran is harmless
  task_.asyncStop();
  EXPECT_FALSE(task_.isRunning());
  EXPECT_EQ(task_.name(), "empty");

  task_.setCallback([] {});
  task_.setUsPeriod(3600LL * 1000000);
  task_.start(false);
  loop_->stop();
  EXPECT_TRUE(eventually([&] { return !task_.isRunning(); }));
  EXPECT_THROW(task_.start(), ko::Error);
}

}  // namespace
