#include "ko/os.hpp"

#if defined(__GLIBC__)
#include <malloc.h>
#endif
#include <pthread.h>
#include <sched.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <charconv>
#include <chrono>
#include <climits>
#include <cstdlib>
#include <system_error>

#include "ko/log.hpp"

namespace ko::os {

std::int64_t ustime() {
  return std::chrono::duration_cast<std::chrono::microseconds>(
             std::chrono::steady_clock::now().time_since_epoch())
      .count();
}

std::string getenv(const std::string& name) {
  const char* value = std::getenv(name.c_str());
  return value ? std::string(value) : std::string();
}

int gettid() {
  return static_cast<int>(::syscall(SYS_gettid));
}

bool keepFreedMemory(std::size_t retainedBytes) {
#if defined(__GLIBC__)
  const auto retained = static_cast<int>(std::min(retainedBytes, std::size_t{INT_MAX}));
  // Blocks above this size get a mapping of their own; the allocator refuses more than 32 MB.
  const auto direct = static_cast<int>(std::min(retainedBytes / 4, std::size_t{32} << 20));
  return ::mallopt(M_TRIM_THRESHOLD, retained) == 1 && ::mallopt(M_MMAP_THRESHOLD, direct) == 1;
#else
  (void)retainedBytes;
  return false;
#endif
}

namespace {

constexpr const char* kCategory = "ko.os";
constexpr const char* kVariable = "KO_REALTIME_PRIORITY";
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int kDefaultPriority = 0;
#else
constexpr int kDefaultPriority = 1;
#endif

std::atomic<int> gPriorityOverride{-1};
std::atomic<bool> gRefusalLogged{false};

int priorityFromEnvironment() {
  const std::string text = getenv(kVariable);
  if (text.empty())
    return kDefaultPriority;
  int value = -1;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size() || value < 0 ||
      value > sched_get_priority_max(SCHED_FIFO)) {
    KO_LOG_WARNING(kCategory) << kVariable << "='" << text << "' is not a priority from 0 to "
                              << sched_get_priority_max(SCHED_FIFO) << "; using "
                              << kDefaultPriority;
    return kDefaultPriority;
  }
  return value;
}

}  // namespace

int realtimePriority() {
  const int override = gPriorityOverride.load();
  if (override >= 0)
    return override;
  static const int fromEnvironment = priorityFromEnvironment();
  return fromEnvironment;
}

void setRealtimePriority(int priority) {
  gPriorityOverride.store(priority < 0 ? -1 : priority);
}

RealtimeScope::RealtimeScope() {
  const int priority = realtimePriority();
  if (priority <= 0)
    return;
  sched_param current{};
  if (pthread_getschedparam(pthread_self(), &fPolicy, &current) != 0 || fPolicy == SCHED_FIFO ||
      fPolicy == SCHED_RR) {
    return;
  }
  fPriority = current.sched_priority;
  sched_param wanted{};
  wanted.sched_priority = priority;
  const int error = pthread_setschedparam(pthread_self(), SCHED_FIFO, &wanted);
  if (error == 0) {
    fRaised = true;
  } else if (!gRefusalLogged.exchange(true)) {
    KO_LOG_WARNING(kCategory) << "The real-time priority " << priority << " (" << kVariable
                              << ") is refused: " << std::system_category().message(error)
                              << "; the framework's latency-critical threads keep normal "
                                 "scheduling";
  }
}

RealtimeScope::~RealtimeScope() {
  if (!fRaised)
    return;
  sched_param own{};
  own.sched_priority = fPriority;
  pthread_setschedparam(pthread_self(), fPolicy, &own);
}

}  // namespace ko::os
