#include "ko/future.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <stdexcept>
#include <thread>
#include <vector>

#include "ko_test_helpers.hpp"

namespace {

using ko::Future;
using ko::FutureState;
using ko::Promise;
using ::testing::HasSubstr;

TEST(Future, ValueSetFromAnotherThreadWakesEveryWaiter) {
  Promise<int> promise;
  Future<int> future = promise.future();
  EXPECT_EQ(future.wait(0), FutureState::Timeout);
  EXPECT_TRUE(future.isRunning());

  std::vector<std::thread> waiters;
  std::vector<int> seen(4, 0);
  for (std::size_t i = 0; i < seen.size(); ++i)
    waiters.emplace_back([&, i] { seen[i] = future.value(10000); });
  promise.setValue(42);
  for (auto& t : waiters)
    t.join();
  EXPECT_THAT(seen, ::testing::Each(42));
  EXPECT_EQ(future.wait(std::chrono::milliseconds(0)), FutureState::FinishedWithValue);
  EXPECT_FALSE(future.hasError());
  EXPECT_EQ(future.error(), "");
}

TEST(Future, ErrorAndTimeOutAreRaisedWithTheirText) {
  Promise<std::string> promise;
  auto future = promise.future();
  EXPECT_EQ(future.wait(std::chrono::milliseconds(20)), FutureState::Timeout);
  EXPECT_EQ(ko::test::errorOf<ko::FutureError>([&] { future.value(5); }), "Future timeout");
  promise.setError("the speech engine is gone");
  EXPECT_TRUE(future.hasError());
  EXPECT_EQ(future.wait(), FutureState::FinishedWithError);
  EXPECT_EQ(ko::test::errorOf<ko::FutureError>([&] { future.value(); }),
            "the speech engine is gone");
  // A second result is refused.
  EXPECT_THROW(promise.setValue("late"), ko::FutureError);
  EXPECT_THROW(promise.setError("late"), ko::FutureError);
  EXPECT_FALSE(promise.trySetError("late"));
  EXPECT_EQ(future.error(), "the speech engine is gone");
}

// A duration is waited to the clock's resolution: neither rounded down to no wait nor,
// when long, overflowed into a short one.
TEST(Future, DurationsShorterThanAMillisecondOrVeryLongAreWaitedInFull) {
  Promise<int> promise;
  const auto future = promise.future();
  for (const auto wait : {std::chrono::microseconds(300), std::chrono::microseconds(999)}) {
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(future.wait(wait), FutureState::Timeout);
    EXPECT_GE(std::chrono::steady_clock::now() - start, wait);
  }
  EXPECT_EQ(future.wait(std::chrono::nanoseconds(-5)), FutureState::Timeout);

  // 2^32 + 1 ms once became 1 ms; hours::max() overflowed.
  std::thread setter([&] {
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    promise.setValue(3);
  });
  EXPECT_EQ(future.wait(std::chrono::milliseconds((1LL << 32) + 1)),
            FutureState::FinishedWithValue);
  setter.join();
  EXPECT_EQ(future.wait(std::chrono::hours::max()), FutureState::FinishedWithValue);
}

TEST(Future, BrokenPromiseOnlyWhenTheLastCopyGoes) {
  Future<int> future;
  {
    Promise<int> first;
    future = first.future();
    {
      Promise<int> copy = first;
      Promise<int> moved = std::move(copy);
    }
    EXPECT_TRUE(future.isRunning());
  }
  EXPECT_EQ(future.error(0), "Promise broken");
}

TEST(Future, CanceledInvalidAndReadyFutures) {
  Promise<void> promise;
  auto canceled = promise.future();
  promise.setCanceled();
  EXPECT_TRUE(canceled.isCanceled());
  EXPECT_THROW(canceled.value(), ko::FutureError);

  Future<int> invalid;
  EXPECT_FALSE(invalid.isValid());
  EXPECT_EQ(invalid.wait(), FutureState::None);
  EXPECT_EQ(invalid.error(), "Invalid future");

  auto f = ko::makeFutureValue(std::string("ready"));
  EXPECT_EQ(f.state(), FutureState::FinishedWithValue);
  EXPECT_EQ(std::move(f).value(), "ready");
  EXPECT_EQ(ko::makeFutureValue().wait(), FutureState::FinishedWithValue);
  EXPECT_EQ(ko::makeFutureError<int>("no").error(), "no");
}

TEST(FutureThen, RunsInTheFinishingThreadOrAtOnce) {
  Promise<int> promise;
  std::thread::id ranIn;
  auto doubled = promise.future().then([&](Future<int> f) {
    ranIn = std::this_thread::get_id();
    return f.value() * 2;
  });
  EXPECT_TRUE(doubled.isRunning());
  std::thread setter([&] { promise.setValue(21); });
  const auto setterId = setter.get_id();
  setter.join();
  EXPECT_EQ(doubled.value(), 42);
  EXPECT_EQ(ranIn, setterId);

  // Already finished: the callback runs in this thread before then() returns.
  bool called = false;
  promise.future().then([&](const Future<int>&) { called = true; });
  EXPECT_TRUE(called);
  auto onReady = ko::makeFutureValue(3).then([](Future<int> f) { return f.value() + 1; });
  EXPECT_EQ(onReady.value(0), 4);
}

TEST(FutureThen, ErrorsFlowThrough) {
  Promise<int> promise;
  auto seenError = promise.future().then([](Future<int> f) { return f.error(); });
  auto chained = promise.future().andThen([](int v) { return v + 1; });
  auto throwing = promise.future().then([](Future<int>) -> int { throw std::runtime_error("cb"); });
  promise.setError("boom");
  EXPECT_EQ(seenError.value(), "boom");
  EXPECT_EQ(chained.error(), "boom");
  EXPECT_EQ(throwing.error(), "cb");

  Promise<void> done;
  auto next = done.future().andThen([] { return std::string("after"); });
  done.setValue();
  EXPECT_EQ(next.value(), "after");
}

}  // namespace
