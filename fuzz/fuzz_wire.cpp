// Fuzzes the decoder of incoming messages: every frame a peer can send (the header, the
// body of the kinds that carry one, the member table of a registration), then checks that
// what decodes encodes back to the same value.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "ko/wire.hpp"

namespace {

// Encoded, decoded and encoded again, a value must give the same bytes and the same type
// (bytes rather than values: a NaN is not equal to itself).
void checkRoundTrip(const ko::AnyValue& value) {
  const std::string bytes = ko::wire::encodeValue(value);
  const ko::AnyValue back = ko::wire::decodeValue(bytes);
  if (ko::wire::encodeValue(back) != bytes || back.signature() != value.signature())
    std::abort();
}

}  // namespace

// The input: two bytes, the header frame's length L (big-endian), then the header frame (cut
// at the input's end), then the rest as the body frame when there is any.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 2)
    return 0;
  const std::string_view all(reinterpret_cast<const char*>(data) + 2, size - 2);
  const std::size_t headerSize =
      std::min<std::size_t>(all.size(), (std::size_t{data[0]} << 8) | data[1]);
  std::vector<std::string_view> frames{all.substr(0, headerSize)};
  if (headerSize < all.size())
    frames.push_back(all.substr(headerSize));
  try {
    const ko::wire::Message m = ko::wire::decodeMessage(frames);
    (void)ko::wire::decodeHeader(ko::wire::encodeHeader(m.header));
    checkRoundTrip(m.body);
    if (m.header.kind == ko::wire::MessageKind::Register) {
      const auto meta = ko::wire::metaObjectFromValue(m.body);
      checkRoundTrip(ko::wire::metaObjectToValue(meta));
    }
  } catch (const ko::wire::DecodeError&) {
  }
  // Each frame alone, as a value.
  for (const auto frame : frames) {
    try {
      checkRoundTrip(ko::wire::decodeValue(frame));
    } catch (const ko::wire::DecodeError&) {
    } catch (const ko::Error&) {
    }
  }
  return 0;
}
