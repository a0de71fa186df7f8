#include "ko/reaper.hpp"

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <exception>
#include <mutex>
#include <thread>

#include "ko/log.hpp"

namespace ko {

namespace {

thread_local int tlFrameworkDepth = 0;

// The thread that runs the destructions handed over, one after the other.
class Reaper {
 public:
  Reaper() : fThread([this] { xRun(); }) {}
  ~Reaper() {
    {
      std::lock_guard lock(fMutex);
      fQuit = true;
    }
    fQueued.notify_all();
    fThread.join();
  }
  Reaper(const Reaper&) = delete;
  Reaper& operator=(const Reaper&) = delete;

  void add(std::function<void()> destroy) {
    {
      std::lock_guard lock(fMutex);
      fQueue.push_back(std::move(destroy));
      ++fAdded;
    }
    fQueued.notify_one();
  }

  void waitUntilDone() {
    std::unique_lock lock(fMutex);
    const std::uint64_t target = fAdded;
    fDone.wait(lock, [&] { return fFinished >= target; });
  }

 private:
  void xRun() {
    std::unique_lock lock(fMutex);
    for (;;) {
      fQueued.wait(lock, [this] { return fQuit || !fQueue.empty(); });
      if (fQueue.empty())
        return;
      std::function<void()> destroy = std::move(fQueue.front());
      fQueue.pop_front();
      lock.unlock();
      try {
        destroy();
      } catch (const std::exception& e) {
        KO_LOG_ERROR("ko.reaper") << "A destructor threw: " << e.what();
      } catch (...) {
        KO_LOG_ERROR("ko.reaper") << "A destructor threw an unknown exception";
      }
      destroy = nullptr;
      lock.lock();
      ++fFinished;
      fDone.notify_all();
    }
  }

  std::mutex fMutex;
  std::condition_variable fQueued;
  std::condition_variable fDone;
  std::deque<std::function<void()>> fQueue;
  std::uint64_t fAdded = 0;
  std::uint64_t fFinished = 0;
  bool fQuit = false;
  std::thread fThread;
};

// The reaper while it takes destructions; null before it starts and once the process has
// begun to end (static destruction), when a destruction runs in the dropping thread. Both
// stay valid through the end of the process: the mutex has no destructor to run.
std::mutex gReaperMutex;
Reaper* gReaper = nullptr;

// The process's reaper, started on first use.
struct ReaperHandle {
  ReaperHandle() {
    std::lock_guard lock(gReaperMutex);
    gReaper = &reaper;
  }
  ~ReaperHandle() {
    std::lock_guard lock(gReaperMutex);
    gReaper = nullptr;
  }
  Reaper reaper;
};

Reaper& reaper() {
  static ReaperHandle handle;
  return handle.reaper;
}

}  // namespace

namespace detail {
// Called by whatever starts framework threads before it starts them: the reaper is then
// built first and, at the end of the process, destroyed after them.
void startReaper() {
  (void)reaper();
}
}  // namespace detail

bool isFrameworkThread() noexcept {
  return tlFrameworkDepth > 0;
}

FrameworkThreadScope::FrameworkThreadScope() noexcept {
  detail::startReaper();
  ++tlFrameworkDepth;
}

FrameworkThreadScope::~FrameworkThreadScope() {
  --tlFrameworkDepth;
}

void reap(std::function<void()> destroy) {
  if (!destroy)
    return;
  {
    std::lock_guard lock(gReaperMutex);
    if (gReaper) {
      gReaper->add(std::move(destroy));
      return;
    }
  }
  destroy();  // the process is ending: no reaper any more
}

void waitForReaper() {
  reaper().waitUntilDone();
}

}  // namespace ko
