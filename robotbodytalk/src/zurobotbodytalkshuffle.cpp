#include "zurobotbodytalkshuffle.h"

#include <cstdlib>

namespace ZU {

std::uint64_t bodyTalkRandom(std::uint64_t bound) {
  if (bound == 0)
    return 0;
  constexpr unsigned kBits = 15;
  constexpr std::uint64_t kMask = (std::uint64_t{1} << kBits) - 1;
  std::uint64_t value = 0;
  // Enough bits to cover the bound, at most 60.
  for (unsigned bits = 0; bits < 60 && (bits == 0 || (bound - 1) >> bits != 0); bits += kBits)
    value = (value << kBits) | (static_cast<std::uint64_t>(std::rand()) & kMask);
  return value % bound;
}

}  // namespace ZU
