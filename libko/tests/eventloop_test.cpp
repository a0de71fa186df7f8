#include "ko/eventloop.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <stdexcept>
#include <thread>
#include <vector>

#include "ko/log.hpp"
#include "ko/reaper.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::FutureState;
using ko::test::Gate;

TEST(EventLoop, JobsRunInParallelOnTheLoopAndAThrowingOneIsLogged) {
  ko::log::ScopedCapture cap;
  ko::EventLoop loop("jobs", 2);
  EXPECT_EQ(loop.threadCount(), 2u);
  EXPECT_EQ(loop.name(), "jobs");
  EXPECT_FALSE(loop.isInThisLoop());
  EXPECT_TRUE(loop.async([&] { return loop.isInThisLoop(); }).value(10000));
  EXPECT_EQ(loop.asyncDelay([] { return std::string("later"); }, std::chrono::milliseconds(5))
                .value(10000),
            "later");
  Gate posted, delayedPost;
  loop.post([&] { posted.open(); });
  loop.postDelayed([&] { delayedPost.open(); }, std::chrono::milliseconds(1));
  EXPECT_TRUE(posted.wait());
  EXPECT_TRUE(delayedPost.wait());

  // Each job waits for the other: both finish only if they run at the same time.
  Gate first, second;
  auto a = loop.async([&] {
    first.open();
    return second.wait();
  });
  auto b = loop.async([&] {
    second.open();
    return first.wait();
  });
  EXPECT_TRUE(a.value(20000));
  EXPECT_TRUE(b.value(20000));

  loop.post([] { throw std::runtime_error("job failed"); });
  EXPECT_EQ(loop.async([] { return 1; }).value(10000), 1);
  EXPECT_TRUE(ko::test::eventually(
      [&] { return cap->containsPart("ko.eventloop", ko::log::Error, "job failed"); }));
}

TEST(EventLoop, StopDropsQueuedAndLaterJobs) {
  auto loop = std::make_shared<ko::EventLoop>("stopping", 1);
  Gate holding, release;
  auto blocker = loop->async([&] {
    holding.open();
    release.wait();
    // Stopping from inside the loop must not wait for this very job.
    loop->stop();
    return true;
  });
  ASSERT_TRUE(holding.wait());
  auto queued = loop->async([] { return 1; });
  auto delayed = loop->asyncDelay([] { return 2; }, std::chrono::hours(1));
  release.open();
  EXPECT_TRUE(blocker.value(10000));
  EXPECT_EQ(queued.error(10000), "Promise broken");
  EXPECT_EQ(delayed.error(10000), "Promise broken");
  EXPECT_EQ(loop->async([] { return 3; }).error(0), "Promise broken");
}

// A job posted while another thread stops the loop either runs or is dropped; either way
// its future finishes while the loop is still there.
TEST(EventLoop, EveryJobPostedDuringAStopFinishes) {
  constexpr int kRounds = 200;
  constexpr std::size_t kPosters = 2;
  constexpr int kJobs = 400;
  for (int round = 0; round < kRounds; ++round) {
    auto loop = std::make_shared<ko::EventLoop>("racing", 1);
    std::vector<std::vector<ko::Future<int>>> futures(kPosters);
    ko::test::Counter posted;
    std::vector<std::thread> posters;
    for (std::size_t p = 0; p < kPosters; ++p) {
      posters.emplace_back([&, p] {
        for (int i = 0; i < kJobs; ++i) {
          futures[p].push_back(loop->async([i] { return i; }));
          posted.increment();
        }
      });
    }
    // Stop while both threads are still posting.
    EXPECT_TRUE(posted.waitFor(kJobs / 4));
    loop->stop();
    for (auto& t : posters)
      t.join();
    for (const auto& list : futures)
      for (const auto& f : list)
        ASSERT_NE(f.wait(10000), FutureState::Timeout) << "round " << round;
  }
}

// Every stop returns only once no job runs but the caller's own: a second, concurrent stop
// from outside as much as a stop from a job of the loop.
TEST(EventLoopStop, NoStopReturnsWhileAnotherJobRuns) {
  constexpr int kRounds = 200;
  for (int round = 0; round < kRounds; ++round) {
    auto loop = std::make_shared<ko::EventLoop>("stop-waits", 3);
    std::atomic<bool> longJobEnded{false};
    std::atomic<int> earlyReturns{0};
    Gate longJobStarted;
    loop->post([&] {
      longJobStarted.open();
      // Long enough for the stops to begin meanwhile; a sleep rather than yields, which a
      // loaded machine turns into a time slice each.
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
      longJobEnded = true;
    });
    ASSERT_TRUE(longJobStarted.wait());
    // One stop from a job of the loop, which goes on a while after it, two from outside,
    // all at once.
    std::atomic<bool> stopperStarted{false}, stopperEnded{false};
    auto fromJob = loop->async([&] {
      stopperStarted = true;
      loop->stop();
      if (!longJobEnded)
        ++earlyReturns;
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
      stopperEnded = true;
    });
    std::vector<std::thread> outside;
    for (int i = 0; i < 2; ++i) {
      outside.emplace_back([&] {
        loop->stop();
        if (!longJobEnded || (stopperStarted && !stopperEnded))
          ++earlyReturns;
      });
    }
    for (auto& t : outside)
      t.join();
    ASSERT_NE(fromJob.wait(10000), FutureState::Timeout);
    ASSERT_EQ(earlyReturns.load(), 0) << "round " << round;
  }
}

TEST(EventLoopStop, JobsStoppingTheirLoopTogetherDoNotWaitForEachOther) {
  for (int round = 0; round < 50; ++round) {
    auto loop = std::make_shared<ko::EventLoop>("stop-together", 2);
    ko::test::Counter inside;
    auto stopper = [&] {
      inside.increment();
      inside.waitFor(2);
      loop->stop();
    };
    auto a = loop->async(stopper);
    auto b = loop->async(stopper);
    ASSERT_EQ(a.wait(10000), FutureState::FinishedWithValue);
    ASSERT_EQ(b.wait(10000), FutureState::FinishedWithValue);
  }
}

// The owner of a loop may let go of it from one of the loop's own jobs: the other
// threads are joined, the caller's leaves when its job returns.
TEST(EventLoopStop, LastOwnerMayLetGoFromAJob) {
  auto loop = std::make_shared<ko::EventLoop>("self-owned", 2);
  Gate otherStarted, ownerJobStarted, released;
  std::atomic<bool> otherEnded{false};
  loop->post([&] {
    otherStarted.open();
    ownerJobStarted.wait();
    for (int i = 0; i < 200; ++i)
      std::this_thread::yield();
    otherEnded = true;
  });
  ASSERT_TRUE(otherStarted.wait());
  std::atomic<bool> endedBeforeRelease{false};
  loop->post([&, held = loop]() mutable {
    ownerJobStarted.open();
    loop.reset();
    held.reset();  // the last owner: ~EventLoop in its own job
    endedBeforeRelease = otherEnded.load();
    released.open();
  });
  ASSERT_TRUE(released.wait());
  EXPECT_TRUE(endedBeforeRelease);
}

// An object made with ko::makeShared never dies on a framework thread: dropped in a loop
// job, it is destroyed on the reaper; dropped elsewhere, at once.
TEST(Reaper, ObjectsDroppedInAJobDieOnTheReaper) {
  struct Probe {
    explicit Probe(std::atomic<int>& where) : where_(where) {}
    ~Probe() { where_ = ko::isFrameworkThread() ? 1 : 2; }
    std::atomic<int>& where_;
  };
  std::atomic<int> where{0};
  ko::EventLoop loop("reaping", 1);
  auto probe = ko::makeShared<Probe>(where);
  EXPECT_FALSE(ko::isFrameworkThread());
  EXPECT_TRUE(loop.async([held = std::move(probe)]() mutable {
                    const bool framework = ko::isFrameworkThread();
                    held.reset();
                    return framework;
                  })
                  .value(10000));
  ko::waitForReaper();
  EXPECT_EQ(where.load(), 2);

  where = 0;
  ko::makeShared<Probe>(where).reset();
  EXPECT_EQ(where.load(), 2);
}

TEST(EventLoop, DefaultLoopIsSharedAndSizedFromTheEnvironment) {
  // Each child process runs the test from the start: nothing may create the default loop
  // before the death tests.
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  for (const auto& [variable, threads] : {std::pair{"3", 3U}, std::pair{"many", 4U}}) {
    EXPECT_EXIT(
        {
          setenv("ZEFOKO_EVENTLOOP_THREADS", variable, 1);
          std::exit(ko::getEventLoop()->threadCount() == threads ? 0 : 1);
        },
        ::testing::ExitedWithCode(0), "");
  }
  EXPECT_EQ(ko::getEventLoop(), ko::getEventLoop());
}

}  // namespace
