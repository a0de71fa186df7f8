#pragma once
// Conversions between ZUValue and the ko framework's AnyValue, so that ZUValues can
// travel through ko calls, events and signals. Both are pure functions of their
// argument and may be called from any thread.

#include "ko/anyvalue.hpp"
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
