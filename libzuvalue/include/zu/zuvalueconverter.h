#pragma once
// Conversions between ZUValue and the ko framework's AnyValue, so that ZUValues can
// travel through ko calls, events and signals. Both are pure functions of their
// argument and may be called from any thread.

#include <string>

#include "ko/anyvalue.hpp"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"

namespace ZU {

// Invalid and Object give a void value; Array a list; Bool a boolean; Int a 32-bit
// integer; Float a 32-bit float; String a string; Binary a raw buffer.
ko::AnyValue toAnyReference(const ZUValue& value);

// The ZUValue form of a ko value: maps become arrays of [key, value] pairs, named
// tuples arrays of [name, value] pairs, raw buffers Binaries. Kinds that have no
// ZUValue form raise ZUError (module "ZUValue", method "conversion").
ZUValue fromAnyReference(const ko::AnyValue& value);

}  // namespace ZU

namespace ko {

// A ZUValue travels through ko as a dynamic value: as a parameter or result of a bound
// method its signature is "m", so it accepts any argument.
template <>
struct TypeSignature<ZU::ZUValue> {
  static std::string get() { return "m"; }
};

template <>
struct ValueConverter<ZU::ZUValue> {
  static AnyValue toAny(const ZU::ZUValue& value) { return ZU::toAnyReference(value); }
};

// A kind that has no ZUValue form is reported as a ko conversion failure, so that a bad
// argument or result is described like any other.
template <>
struct ValueReader<ZU::ZUValue> {
  static ZU::ZUValue read(const AnyValue& value) {
    try {
      return ZU::fromAnyReference(value);
    } catch (const ZU::ZUError& e) {
      throw ConversionError(e.description());
    }
  }
};

}  // namespace ko
