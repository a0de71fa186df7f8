#include "watchdog.h"

#include <dirent.h>
#include <execinfo.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <utility>
#include <vector>

namespace mokutotest {

namespace {

constexpr int kStackSignal = SIGUSR2;
sem_t gWritten;

// In the signalled thread: its stack to standard error, then the watchdog goes on.
void writeStack(int /*signal*/) {
  void* frames[64];
  const int count = backtrace(frames, 64);
  char header[64];
  const int length = std::snprintf(header, sizeof header, "---- thread %ld\n",
                                   static_cast<long>(::syscall(SYS_gettid)));
  if (::write(STDERR_FILENO, header, static_cast<std::size_t>(length)) < 0) {
    // Nothing more to do for a closed standard error.
  }
  backtrace_symbols_fd(frames, count, STDERR_FILENO);
  sem_post(&gWritten);
}

std::vector<pid_t> threadIds() {
  std::vector<pid_t> ids;
  if (DIR* tasks = ::opendir("/proc/self/task")) {
    while (const dirent* entry = ::readdir(tasks)) {
      if (entry->d_name[0] != '.')
        ids.push_back(static_cast<pid_t>(std::atoi(entry->d_name)));
    }
    ::closedir(tasks);
  }
  return ids;
}

[[noreturn]] void dumpAndAbort(const std::string& what, std::chrono::seconds bound) {
  std::fprintf(stderr, "watchdog: %s did not end within %lld s; the threads' stacks:\n",
               what.c_str(), static_cast<long long>(bound.count()));
  const pid_t self = static_cast<pid_t>(::syscall(SYS_gettid));
  for (const pid_t id : threadIds()) {
    if (id == self || ::syscall(SYS_tgkill, ::getpid(), id, kStackSignal) != 0)
      continue;
    timespec until{};
    clock_gettime(CLOCK_REALTIME, &until);
    until.tv_sec += 2;
    while (sem_timedwait(&gWritten, &until) != 0 && errno == EINTR) {
    }
  }
  std::fprintf(stderr, "watchdog: aborting\n");
  std::abort();
}

}  // namespace

Watchdog::Watchdog(std::chrono::seconds bound, std::string what) {
  sem_init(&gWritten, 0, 0);
  void* warm[1];
  backtrace(warm, 1);  // loads what backtrace needs, outside any signal handler
  struct sigaction action {};
  action.sa_handler = writeStack;
  sigemptyset(&action.sa_mask);
  action.sa_flags = SA_RESTART;
  sigaction(kStackSignal, &action, nullptr);
  fThread = std::thread([this, bound, what = std::move(what)] {
    std::unique_lock lock(fMutex);
    if (!fDone.wait_for(lock, bound, [this] { return fDisarmed; }))
      dumpAndAbort(what, bound);
  });
}

Watchdog::~Watchdog() {
  {
    std::lock_guard lock(fMutex);
    fDisarmed = true;
  }
  fDone.notify_all();
  fThread.join();
}

}  // namespace mokutotest
