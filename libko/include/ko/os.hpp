#pragma once
// Small operating-system helpers. Thread-safe.

#include <cstddef>
#include <cstdint>
#include <string>

namespace ko::os {

// Microseconds of the steady clock (arbitrary origin, never goes back).
std::int64_t ustime();
// The variable's value; "" when it is unset.
std::string getenv(const std::string& name);
// The calling thread's kernel id.
int gettid();

// Has the C library's allocator keep up to `retainedBytes` of the memory that the
// process frees for its next allocations, and serve blocks of up to a quarter of that
// from its heap, where by default it gives memory back to the system after a large free
// and takes it again, a page fault per page, at the next allocations. For processes
// with real-time threads, such as the host of the speech service: a page fault costs
// microseconds. The process keeps its peak heap for its lifetime. Process-wide; call
// it once, early, before other threads start. False where the allocator has no such
// settings (the process then runs as before).
bool keepFreedMemory(std::size_t retainedBytes = std::size_t{64} << 20);

// The real-time priority of the framework's latency-critical threads: the threads that
// deliver events and the speech player's. KO_REALTIME_PRIORITY 0 keeps them under normal
// scheduling, 1 to 99 runs them under SCHED_FIFO at that priority. Unset or empty: 1, the
// lowest real-time priority, except in sanitizer builds, where it is 0; another value is
// reported once and taken as unset. The variable is read once per process.
int realtimePriority();
// Replaces the variable for this process (tests); a negative value goes back to it.
void setRealtimePriority(int priority);

// While it lives, the calling thread runs under SCHED_FIFO at realtimePriority(), unless
// that is 0 or the thread already runs under a real-time policy; its own scheduling comes
// back at the end of the scope. When the process may not (no CAP_SYS_NICE, RLIMIT_RTPRIO
// below the priority), the first refusal in the process is logged as a warning, and the
// thread keeps its scheduling. Nothing else changes: the thread never spins.
class RealtimeScope {
 public:
  RealtimeScope();
  ~RealtimeScope();
  RealtimeScope(const RealtimeScope&) = delete;
  RealtimeScope& operator=(const RealtimeScope&) = delete;
  // Whether the scope raised the thread.
  bool raised() const noexcept { return fRaised; }

 private:
  bool fRaised = false;
  int fPolicy = 0;
  int fPriority = 0;
};

}  // namespace ko::os
