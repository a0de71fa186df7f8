#include "ko/os.hpp"

#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
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

}  // namespace ko::os
