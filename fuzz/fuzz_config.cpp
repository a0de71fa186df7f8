// Fuzzes the configuration record with arbitrary JSON: the value form, both tag
// tables and the printed form, on a fresh configuration for every input.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <ostream>
#include <stdexcept>
#include <streambuf>
#include <string_view>

#include "ko/json.hpp"
#include "ko/log.hpp"
#include "mokuto/mokutoconfig.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace {

class NullBuffer : public std::streambuf {
 protected:
  int overflow(int c) override { return traits_type::not_eof(c); }
};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
  ko::log::setLevel("*", ko::log::Silent);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  ko::AnyValue any;
  try {
    any = ko::fromJson(std::string_view(reinterpret_cast<const char*>(data), size));
  } catch (const ko::JsonError&) {
    return 0;
  }
  // Every JSON document has a ZUValue form; a ZUError here is a finding.
  const ZU::ZUValue value = ZU::fromAnyReference(any);
  if (ZU::fromAnyReference(ZU::toAnyReference(value)).toString(1) != value.toString(1)) {
    std::abort();
  }

  ZU::MokutoConfig config;
  config.fromZUValue(value);
  config.updateWordsToTags(value);
  try {
    config.updateTagsToAnimations(value);
  } catch (const std::out_of_range&) {
    // A path shorter than the package: the caller is told, what came before stays.
  }
  for (const auto& tagToAnimations : config.tagsToAnimations) {
    for (const auto& entry : tagToAnimations) {
      if (entry.second.empty())
        std::abort();
    }
  }

  NullBuffer buffer;
  std::ostream out(&buffer);
  out << config << value.toString(3);
  return 0;
}
