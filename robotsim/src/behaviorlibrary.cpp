#include "robotsim/behaviorlibrary.h"

#include <cmath>
#include <fstream>
#include <sstream>
#include <system_error>

#include "ko/json.hpp"

namespace robotsim {

namespace fs = std::filesystem;

namespace {

// A descriptor is a few kilobytes; anything much larger is not one.
constexpr std::uintmax_t kMaxDescriptorBytes = 4u << 20;
// Key times are written with a few decimals; the duration may round the other way.
constexpr double kDurationTolerance = 1e-3;

const ko::AnyValue* member(const ko::AnyValue& map, std::string_view name) {
  for (const auto& [key, value] : map.asMap()) {
    if (key.kind() == ko::Kind::String && key.asString() == name)
      return &value;
  }
  return nullptr;
}

double durationOf(const ko::AnyValue& value) {
  double d = 0;
  if (value.kind() == ko::Kind::Int)
    d = static_cast<double>(value.asInt().value);
  else if (value.kind() == ko::Kind::Float)
    d = value.asFloat().value;
  else
    throw DescriptorError("\"duration\" must be a number of seconds");
  if (!std::isfinite(d) || d <= 0)
    throw DescriptorError("\"duration\" must be positive");
  return d;
}

std::vector<std::string> tagsOf(const ko::AnyValue* value) {
  std::vector<std::string> tags;
  if (!value)
    return tags;
  if (value->kind() != ko::Kind::List)
    throw DescriptorError("\"tags\" must be a list of strings");
  for (const auto& tag : value->asList()) {
    if (tag.kind() != ko::Kind::String || tag.asString().empty())
      throw DescriptorError("\"tags\" must be a list of non-empty strings");
    tags.push_back(tag.asString());
  }
  return tags;
}

}  // namespace

BehaviorDescriptor parseBehaviorDescriptor(std::string_view json) {
  ko::AnyValue root;
  try {
    root = ko::fromJson(json);
  } catch (const ko::JsonError& e) {
    throw DescriptorError(std::string("not JSON: ") + e.what());
  }
  if (root.kind() != ko::Kind::Map)
    throw DescriptorError("the descriptor must be a JSON object");

  BehaviorDescriptor out;
  out.tags = tagsOf(member(root, "tags"));
  const ko::AnyValue* duration = member(root, "duration");
  if (!duration)
    throw DescriptorError("\"duration\" is missing");
  out.duration = durationOf(*duration);

  const ko::AnyValue* joints = member(root, "joints");
  if (!joints || joints->kind() != ko::Kind::Map || joints->asMap().empty())
    throw DescriptorError("\"joints\" must be an object with at least one joint");
  ko::AnyValue::List names;
  ko::AnyValue::List times;
  ko::AnyValue::List keys;
  for (const auto& [name, track] : joints->asMap()) {
    const std::string jointName = name.kind() == ko::Kind::String ? name.asString() : "";
    if (track.kind() != ko::Kind::Map)
      throw DescriptorError("joint \"" + jointName + "\" must be an object with times and keys");
    const ko::AnyValue* t = member(track, "times");
    const ko::AnyValue* k = member(track, "keys");
    if (!t || !k)
      throw DescriptorError("joint \"" + jointName + "\" needs \"times\" and \"keys\"");
    names.emplace_back(jointName);
    times.push_back(*t);
    keys.push_back(*k);
  }
  out.names = ko::AnyValue::list(std::move(names));
  out.times = ko::AnyValue::list(std::move(times));
  out.keys = ko::AnyValue::list(std::move(keys));
  try {
    out.tracks = parseBezierTracks(out.names, out.times, out.keys);
  } catch (const KeyframeError& e) {
    throw DescriptorError(e.what());
  }
  for (const auto& track : out.tracks) {
    if (track.keys.back().time > out.duration + kDurationTolerance)
      throw DescriptorError("a key comes after the end of the behaviour (\"duration\")");
  }
  return out;
}

BehaviorDescriptor readBehaviorDescriptor(const fs::path& file) {
  std::error_code ec;
  const auto size = fs::file_size(file, ec);
  if (ec)
    throw DescriptorError("cannot read " + file.string() + ": " + ec.message());
  if (size > kMaxDescriptorBytes)
    throw DescriptorError(file.string() + " is too large for a descriptor");
  std::ifstream in(file, std::ios::binary);
  if (!in)
    throw DescriptorError("cannot open " + file.string());
  std::ostringstream text;
  text << in.rdbuf();
  return parseBehaviorDescriptor(text.str());
}

bool isValidBehaviorPath(std::string_view path) {
  if (path.empty() || path.front() == '/' || path.back() == '/')
    return false;
  std::size_t start = 0;
  while (start <= path.size()) {
    const std::size_t end = std::min(path.find('/', start), path.size());
    const std::string_view part = path.substr(start, end - start);
    if (part.empty() || part == "." || part == ".." || part.find('\\') != std::string_view::npos)
      return false;
    start = end + 1;
  }
  return path.find('\0') == std::string_view::npos;
}

ScannedLibrary scanBehaviorLibrary(const fs::path& root) {
  ScannedLibrary out;
  std::error_code ec;
  if (!fs::is_directory(root, ec))
    return out;
  auto it =
      fs::recursive_directory_iterator(root, fs::directory_options::skip_permission_denied, ec);
  for (; !ec && it != fs::recursive_directory_iterator(); it.increment(ec)) {
    if (it->path().filename() != kBehaviorFileName || !it->is_regular_file(ec))
      continue;
    const std::string path = it->path().parent_path().lexically_relative(root).generic_string();
    if (!isValidBehaviorPath(path)) {
      out.rejected.emplace(path, "a descriptor must lie in a behaviour folder under the root");
      continue;
    }
    try {
      out.behaviors.emplace(path, readBehaviorDescriptor(it->path()));
    } catch (const DescriptorError& e) {
      out.rejected.emplace(path, e.what());
    }
  }
  return out;
}

}  // namespace robotsim
