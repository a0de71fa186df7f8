#pragma once
// Small operating-system helpers. Thread-safe.

#include <cstdint>
#include <string>

namespace ko::os {

// Microseconds of the steady clock (arbitrary origin, never goes back).
std::int64_t ustime();
// The variable's value; "" when it is unset.
std::string getenv(const std::string& name);
// The calling thread's kernel id.
int gettid();

}  // namespace ko::os
