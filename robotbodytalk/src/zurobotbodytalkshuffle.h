#pragma once
// The body talk's random draws: from the process's rand(), so that one srand() makes a run
// repeatable. Draws wider than rand()'s guaranteed 15 bits join several values 15 bits at
// a time. rand() is the C library's: callers on several threads share one sequence.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace ZU {

// A number in [0, bound) (0 when bound is 0).
std::uint64_t bodyTalkRandom(std::uint64_t bound);

// A uniform (Fisher-Yates) shuffle.
template <class T>
void bodyTalkShuffle(std::vector<T>& items) {
  for (std::size_t i = items.size(); i > 1; --i) {
    const auto j = static_cast<std::size_t>(bodyTalkRandom(i));
    if (j != i - 1)
      std::swap(items[i - 1], items[j]);
  }
}

}  // namespace ZU
