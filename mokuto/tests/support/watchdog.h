#pragma once
// Watchdog: ends a test that does not end in time. When the bound passes before the
// watchdog is destroyed, it writes every thread's stack to standard error, one thread at
// a time (each writes its own, from a signal handler), and aborts the process: a deadlock
// fails with the picture of who waits for whom.
//
// Made and destroyed by the test's thread; its own thread waits for the bound.

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>

namespace mokutotest {

class Watchdog {
 public:
  Watchdog(std::chrono::seconds bound, std::string what);
  ~Watchdog();
  Watchdog(const Watchdog&) = delete;
  Watchdog& operator=(const Watchdog&) = delete;

 private:
  std::mutex fMutex;
  std::condition_variable fDone;
  bool fDisarmed = false;
  std::thread fThread;
};

}  // namespace mokutotest
