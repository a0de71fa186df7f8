#pragma once
// JSON decoding into ko values, and the reverse, for call arguments written as text
// ("^call(ZUMemory.raiseEvent(\"faceSeen\", 1))") and for the wire and timeline formats.
//
// null -> void, true/false -> boolean, integers -> 32-bit integers when they fit,
// otherwise 64-bit, numbers with a fraction or exponent -> double, strings -> string,
// arrays -> list, objects -> map with string keys in document order.

#include <stdexcept>
#include <string_view>

#include <nlohmann/json.hpp>

#include "ko/anyvalue.hpp"

namespace ko {

class JsonError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

constexpr int kMaxJsonDepth = 128;

// Throws JsonError with the decoder's message (position included) on malformed text,
// and on text nested deeper than kMaxJsonDepth.
AnyValue fromJson(std::string_view text);
AnyValue fromJsonValue(const nlohmann::ordered_json& json);

// Values with no JSON form (objects, pointers, opaque kinds) become null; raw buffers
// become arrays of byte values; tuples with member names become objects.
nlohmann::ordered_json toJson(const AnyValue& value);

}  // namespace ko
