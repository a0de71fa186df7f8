#pragma once
// The animation library on disk: each behaviour is a folder holding "behavior.json", and
// its installed path is that folder relative to the library root ("animations/Stand/
// Gestures/Hey_1"). The descriptor reads
//   {"tags": [...], "duration": seconds,
//    "joints": {"HeadYaw": {"times": [...], "keys": [[angle, [3, dt, da], [3, dt, da]], ...]}}}
// with absolute angles in radians.
//
// Pure functions over the file system; any thread (concurrent writers of the same folder
// are the caller's business).

#include <filesystem>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "ko/anyvalue.hpp"
#include "robotsim/bezier.h"

namespace robotsim {

inline constexpr const char* kBehaviorFileName = "behavior.json";

// Raised for a descriptor that cannot be read or is malformed; what() gives the reason.
class DescriptorError : public std::invalid_argument {
 public:
  using std::invalid_argument::invalid_argument;
};

struct BehaviorDescriptor {
  std::vector<std::string> tags;
  double duration = 0;  // seconds
  // The arguments of the Bezier move that plays it: joint names, times and keys.
  ko::AnyValue names;
  ko::AnyValue times;
  ko::AnyValue keys;
  std::vector<JointTrack> tracks;  // the same, read and checked
};

// Reads and checks a descriptor's text: known joints, well-formed keys with increasing
// positive times, a positive duration that no key goes beyond.
BehaviorDescriptor parseBehaviorDescriptor(std::string_view json);
// The same for a file.
BehaviorDescriptor readBehaviorDescriptor(const std::filesystem::path& file);

// Whether `path` may name a behaviour: relative, '/'-separated, without empty, "." or ".."
// parts.
bool isValidBehaviorPath(std::string_view path);

struct ScannedLibrary {
  std::map<std::string, BehaviorDescriptor> behaviors;  // installed path -> descriptor
  std::map<std::string, std::string> rejected;          // installed path -> reason
};

// Every behaviour under `root` (a missing root is an empty library).
ScannedLibrary scanBehaviorLibrary(const std::filesystem::path& root);

}  // namespace robotsim
