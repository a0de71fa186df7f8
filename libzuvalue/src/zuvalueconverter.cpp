#include "zu/zuvalueconverter.h"

#include <cstdint>
#include <utility>

#include "zu/zuerror.h"

namespace ZU {

namespace {

[[noreturn]] void conversionError(const char* description) {
  ZU_THROW_ERROR("ZUValue", "conversion", description);
}

ZUValue pair(ZUValue first, ZUValue second) {
  ZUValue p;
  p.arraySetSize(2);
  p[0] = std::move(first);
  p[1] = std::move(second);
  return p;
}

ZUValue fromList(const ko::AnyValue::List& items) {
  ZUValue out;
  out.arraySetSize(static_cast<int>(items.size()));
  for (std::size_t i = 0; i < items.size(); ++i) {
    out[static_cast<int>(i)] = fromAnyReference(items[i]);
  }
  return out;
}

}  // namespace

ko::AnyValue toAnyReference(const ZUValue& value) {
  switch (value.getType()) {
    case ZUValue::TypeArray: {
      ko::AnyValue::List items;
      const int n = value.arraySize();
      items.reserve(static_cast<std::size_t>(n));
      for (int i = 0; i < n; ++i)
        items.push_back(toAnyReference(value[i]));
      return ko::AnyValue::list(std::move(items));
    }
    case ZUValue::TypeBool:
      return ko::AnyValue::boolean(value.asBool());
    case ZUValue::TypeInt:
      return ko::AnyValue::integer(value.asInt(), 4, true);
    case ZUValue::TypeFloat:
      return ko::AnyValue::floating(value.asFloat(), 4);
    case ZUValue::TypeString:
      return ko::AnyValue(value.asString());
    case ZUValue::TypeBinary:
      return ko::AnyValue::raw(value.asBinary());
    default:  // Invalid, Object
      return ko::AnyValue::makeVoid();
  }
}

ZUValue fromAnyReference(const ko::AnyValue& value) {
  switch (value.kind()) {
    case ko::Kind::None:
      conversionError("NULL type");
    case ko::Kind::Void:
      return ZUValue();
    case ko::Kind::Int: {
      const ko::AnyValue::Int& i = value.asInt();
      if (i.size == 0)
        return ZUValue::makeBool(i.value != 0);
      return ZUValue(static_cast<std::int32_t>(static_cast<std::uint32_t>(i.value)));
    }
    case ko::Kind::Float:
      return ZUValue(static_cast<float>(value.asFloat().value));
    case ko::Kind::String:
      return ZUValue(value.asString());
    case ko::Kind::List:
      return fromList(value.asList());
    case ko::Kind::Map: {
      const ko::AnyValue::Map& entries = value.asMap();
      ZUValue out;
      out.arraySetSize(static_cast<int>(entries.size()));
      for (std::size_t i = 0; i < entries.size(); ++i) {
        out[static_cast<int>(i)] =
            pair(fromAnyReference(entries[i].first), fromAnyReference(entries[i].second));
      }
      return out;
    }
    case ko::Kind::Tuple: {
      const ko::AnyValue::Tuple& tuple = value.asTuple();
      if (tuple.memberNames.empty())
        return fromList(tuple.members);
      if (tuple.memberNames.size() != tuple.members.size()) {
        conversionError("Mismatch struct size. size(variableName) != size(value)");
      }
      ZUValue out;
      out.arraySetSize(static_cast<int>(tuple.members.size()));
      for (std::size_t i = 0; i < tuple.members.size(); ++i) {
        out[static_cast<int>(i)] =
            pair(ZUValue(tuple.memberNames[i]), fromAnyReference(tuple.members[i]));
      }
      return out;
    }
    case ko::Kind::Dynamic:
      return fromAnyReference(value.asDynamic());
    case ko::Kind::Raw: {
      ZUValue out;
      out.binaryRef() = value.asRaw().bytes;
      return out;
    }
    case ko::Kind::Object:
      conversionError("object type not handled");
    case ko::Kind::Pointer:
      if (value.asPointer().object)
        conversionError("object type not handled");
      conversionError("pointer type not handled");
    case ko::Kind::VarArgs:
      return fromList(value.asVarArgs());
    case ko::Kind::Iterator:
      conversionError("iterator type not handled");
    case ko::Kind::Unknown:
      conversionError("unknown type not handled");
    case ko::Kind::Function:
    case ko::Kind::Signal:
    case ko::Kind::Property:
      conversionError("Signal and Property not handled");
  }
  conversionError("unknown type not handled");
}

}  // namespace ZU
