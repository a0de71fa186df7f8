#include <gtest/gtest.h>

#include <linux/capability.h>
#include <pthread.h>
#include <sched.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstddef>
#include <thread>
#include <utility>

#include "ko/eventloop.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"

namespace {

// Takes CAP_SYS_NICE from the calling thread (capabilities belong to threads): with the
// process's RLIMIT_RTPRIO at 0, the thread is then refused SCHED_FIFO as an ordinary
// user's is.
bool dropSysNice() {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct data[_LINUX_CAPABILITY_U32S_3]{};
  if (::syscall(SYS_capget, &header, data) != 0)
    return false;
  for (auto& d : data) {
    d.effective &= ~CAP_TO_MASK(CAP_SYS_NICE);
    d.permitted &= ~CAP_TO_MASK(CAP_SYS_NICE);
  }
  return ::syscall(SYS_capset, &header, data) == 0;
}

// The policy and priority of the calling thread.
std::pair<int, int> scheduling() {
  int policy = -1;
  sched_param param{};
  pthread_getschedparam(pthread_self(), &policy, &param);
  return {policy, param.sched_priority};
}

// Whether this process may give a thread SCHED_FIFO (a thread of its own, put back at once).
bool mayUseFifo() {
  bool may = false;
  std::thread([&may] {
    sched_param param{};
    param.sched_priority = 1;
    may = pthread_setschedparam(pthread_self(), SCHED_FIFO, &param) == 0;
  }).join();
  return may;
}

struct RealtimeCase {
  const char* name;
  int priority;
  bool refused;             // the threads are refused real-time scheduling
  std::pair<int, int> got;  // policy and priority in the scope (and on the loop)
  std::size_t warnings;     // over the two threads and the loop
};

// A scope raises its thread and gives its scheduling back; a real-time loop's threads run
// raised; a refusal is one warning per process, the threads going on under normal
// scheduling. The refused case is the process's only refusal.
TEST(RealtimePriority, RaisesRestoresAndWarnsOnceWhenRefused) {
  const RealtimeCase cases[] = {
      {"off", 0, false, {SCHED_OTHER, 0}, 0},
      {"refused", 1, true, {SCHED_OTHER, 0}, 1},
      {"allowed", 2, false, {SCHED_FIFO, 2}, 0},
  };
  const bool may = mayUseFifo();
  rlimit saved{};
  ASSERT_EQ(::getrlimit(RLIMIT_RTPRIO, &saved), 0);
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    if (!c.refused && c.got.first == SCHED_FIFO && !may)
      continue;  // an ordinary user: nothing to raise
    ko::os::setRealtimePriority(c.priority);
    rlimit none = saved;
    none.rlim_cur = 0;
    if (c.refused) {
      ASSERT_EQ(::setrlimit(RLIMIT_RTPRIO, &none), 0);
    }
    ko::log::ScopedCapture capture(ko::log::Warning);
    for (int n = 0; n < 2; ++n) {
      std::thread([&c] {
        ASSERT_TRUE(!c.refused || dropSysNice());
        const auto before = scheduling();
        {
          const ko::os::RealtimeScope realtime;
          EXPECT_EQ(scheduling(), c.got);
          EXPECT_EQ(realtime.raised(), c.got.first == SCHED_FIFO);
        }
        EXPECT_EQ(scheduling(), before);
      }).join();
    }
    if (!c.refused) {
      ko::EventLoop loop("realtime", 1, ko::EventLoop::Scheduling::Realtime);
      EXPECT_EQ(loop.async([] { return scheduling(); }).value(), c.got);
    }
    EXPECT_EQ(capture->count(), c.warnings);
    ASSERT_EQ(::setrlimit(RLIMIT_RTPRIO, &saved), 0);
  }
  ko::os::setRealtimePriority(-1);
}

}  // namespace
