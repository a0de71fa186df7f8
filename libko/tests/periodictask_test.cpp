#include "ko/periodictask.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <stdexcept>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::test::Counter;
using ko::test::eventually;
using ko::test::Gate;

class PeriodicTaskTest : public ::testing::Test {
 protected:
  std::shared_ptr<ko::EventLoop> loop_ = std::make_shared<ko::EventLoop>("periodic", 4);
};

TEST_F(PeriodicTaskTest, StopWaitsForTheRunningCallback) {
  ko::PeriodicTask task(loop_);
  Gate entered, release;
  std::atomic<bool> callbackDone{false};
  Counter calls;
  task.setCallback([&] {
    if (calls.increment() == 1) {
      entered.open();
      release.wait();
    }
    callbackDone = true;
  });
  task.setUsPeriod(1000);
  task.start();
  ASSERT_TRUE(entered.wait());

  std::atomic<bool> stopReturned{false};
  bool doneWhenStopReturned = false;
  std::thread stopper([&] {
    task.stop();
    doneWhenStopReturned = callbackDone.load();
    stopReturned = true;
  });
  ASSERT_TRUE(eventually([&] { return task.isStopping(); }));
  EXPECT_FALSE(stopReturned.load());
  EXPECT_TRUE(task.isRunning());
  release.open();
  stopper.join();
  EXPECT_TRUE(doneWhenStopReturned);
  EXPECT_FALSE(task.isRunning());
  EXPECT_FALSE(task.isStopping());
  EXPECT_EQ(calls.value(), 1);
}

TEST_F(PeriodicTaskTest, StopFromInsideTheCallbackDoesNotDeadlock) {
  ko::PeriodicTask task(loop_);
  Counter calls;
  Gate stopReturned;
  task.setCallback([&] {
    calls.increment();
    task.stop();
    EXPECT_TRUE(task.isStopping());
    stopReturned.open();
  });
  task.setUsPeriod(0);
  task.start();
  ASSERT_TRUE(stopReturned.wait());
  task.stop();  // waits for the callback to return
  EXPECT_FALSE(task.isRunning());
  EXPECT_EQ(calls.value(), 1);
}

TEST_F(PeriodicTaskTest, CallbacksNeverOverlap) {
  ko::PeriodicTask task(loop_);
  std::atomic<int> inside{0}, overlaps{0};
  Counter calls;
  task.setCallback([&] {
    if (inside.fetch_add(1) != 0)
      ++overlaps;
    std::this_thread::yield();
    inside.fetch_sub(1);
    calls.increment();
  });
  task.setUsPeriod(0);
  task.start();
  // Restarting and period changes while it runs must not produce a second chain of runs.
  for (int i = 0; i < 20; ++i) {
    task.start();
    task.setUsPeriod(i % 2);
  }
  ASSERT_TRUE(calls.waitFor(300));
  task.stop();
  EXPECT_EQ(overlaps.load(), 0);
}

TEST_F(PeriodicTaskTest, RestartFromTheCallbackCancelsItsOwnStop) {
  ko::PeriodicTask task(loop_);
  Counter calls;
  task.setCallback([&] {
    if (calls.increment() == 1) {
      task.asyncStop();
      task.start();
    }
  });
  task.setUsPeriod(0);
  task.start();
  ASSERT_TRUE(calls.waitFor(3));
  task.stop();
}

// A stop from outside wins over a restart that the running callback makes meanwhile: once
// stop() returns, the task is stopped for good.
TEST_F(PeriodicTaskTest, StopFromOutsideWinsOverARestartFromTheCallback) {
  ko::PeriodicTask task(loop_);
  Gate running;
  Counter calls;
  task.setCallback([&] {
    calls.increment();
    running.open();
    // Wait until the other thread's stop is pending, then try to go on.
    EXPECT_TRUE(eventually([&] { return task.isStopping(); }));
    task.start();
  });
  task.setUsPeriod(0);
  task.start();
  ASSERT_TRUE(running.wait());
  task.stop();
  EXPECT_FALSE(task.isRunning());
  EXPECT_EQ(calls.value(), 1);
}

TEST_F(PeriodicTaskTest, ThrowingCallbackIsLoggedAndTheTaskGoesOn) {
  ko::log::ScopedCapture cap;
  ko::PeriodicTask task(loop_);
  task.setName("thrower");
  Counter calls;
  task.setCallback([&] {
    calls.increment();
    throw std::runtime_error("no motion");
  });
  task.setUsPeriod(0);
  task.start();
  ASSERT_TRUE(calls.waitFor(3));
  task.stop();
  EXPECT_TRUE(cap->containsPart("ko.periodictask", ko::log::Error, "'thrower' threw: no motion"));
}

TEST_F(PeriodicTaskTest, BadUseIsRefusedAndAStoppedLoopStopsItsTasks) {
  ko::PeriodicTask task(loop_);
  task.setName("empty");
  EXPECT_THROW(task.start(), ko::Error);
  EXPECT_THROW(task.setUsPeriod(-1), ko::Error);
  task.stop();  // stopping a task that never ran is harmless
  task.asyncStop();
  EXPECT_FALSE(task.isRunning());
  EXPECT_EQ(task.name(), "empty");

  task.setCallback([] {});
  task.setUsPeriod(3600LL * 1000000);
  task.start(false);
  loop_->stop();
  EXPECT_TRUE(eventually([&] { return !task.isRunning(); }));
  EXPECT_THROW(task.start(), ko::Error);
}

}  // namespace
