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

}  // namespace ko::os
