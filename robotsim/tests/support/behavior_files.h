#pragma once
// Writes the behaviour descriptors of the tests' libraries.

#include <cstddef>
#include <sstream>
#include <string>
#include <vector>

namespace robotsim::simtest {

// A descriptor moving one joint to `angle` in `seconds`.
inline std::string descriptor(const std::vector<std::string>& tags, double seconds,
                              const std::string& joint = "HeadYaw", double angle = 0.3) {
  std::ostringstream out;
  out << "{\"tags\": [";
  for (std::size_t i = 0; i < tags.size(); ++i)
    out << (i ? ", " : "") << '"' << tags[i] << '"';
  out << "], \"duration\": " << seconds << ", \"joints\": {\"" << joint << "\": {\"times\": ["
      << seconds << "], \"keys\": [[" << angle << ", [3, " << -seconds / 3 << ", 0.0], [3, 0.0, "
      << "0.0]]]}}}";
  return out.str();
}

}  // namespace robotsim::simtest
