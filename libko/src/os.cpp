#include "ko/os.hpp"

#if defined(__GLIBC__)
#include <malloc.h>
#endif
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <cstdlib>

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

}  // namespace ko::os
