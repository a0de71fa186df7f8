#include "ko/json.hpp"

#include <limits>

namespace ko {

AnyValue fromJsonValue(const nlohmann::ordered_json& json) {
  using V = nlohmann::ordered_json::value_t;
  switch (json.type()) {
    case V::null:
    case V::discarded:
      return AnyValue();
    case V::boolean:
      return AnyValue::boolean(json.get<bool>());
    case V::number_integer: {
      const auto v = json.get<std::int64_t>();
      if (v >= std::numeric_limits<std::int32_t>::min() &&
          v <= std::numeric_limits<std::int32_t>::max())
        return AnyValue::integer(v, 4, true);
      return AnyValue::integer(v, 8, true);
    }
    case V::number_unsigned: {
      const auto v = json.get<std::uint64_t>();
      if (v <= static_cast<std::uint64_t>(std::numeric_limits<std::int32_t>::max()))
        return AnyValue::integer(static_cast<std::int64_t>(v), 4, true);
      if (v <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()))
        return AnyValue::integer(static_cast<std::int64_t>(v), 8, true);
      return AnyValue::integer(static_cast<std::int64_t>(v), 8, false);
    }
    case V::number_float:
      return AnyValue::floating(json.get<double>(), 8);
    case V::string:
      return AnyValue(json.get_ref<const std::string&>());
    case V::array: {
      AnyValue::List items;
      items.reserve(json.size());
      for (const auto& e : json)
        items.push_back(fromJsonValue(e));
      return AnyValue::list(std::move(items));
    }
    case V::object: {
      AnyValue::Map entries;
      entries.reserve(json.size());
      for (const auto& [k, v] : json.items())
        entries.emplace_back(AnyValue(k), fromJsonValue(v));
      return AnyValue::map(std::move(entries));
    }
    case V::binary: {
      const auto& b = json.get_binary();
      return AnyValue::raw(std::vector<std::uint8_t>(b.begin(), b.end()));
    }
  }
  return AnyValue();
}

AnyValue fromJson(std::string_view text) {
  using Json = nlohmann::ordered_json;
  bool tooDeep = false;
  // Refuse deep nesting while parsing: the conversion below recurses once per level.
  auto limit = [&tooDeep](int depth, Json::parse_event_t, Json&) {
    if (depth > kMaxJsonDepth)
      tooDeep = true;
    return !tooDeep;
  };
  try {
    Json json = Json::parse(text.begin(), text.end(), limit);
    if (tooDeep) {
      throw JsonError("JSON nested deeper than " + std::to_string(kMaxJsonDepth) + " levels");
    }
    return fromJsonValue(json);
  } catch (const nlohmann::json::exception& e) {
    throw JsonError(e.what());
  }
}

nlohmann::ordered_json toJson(const AnyValue& value) {
  using J = nlohmann::ordered_json;
  switch (value.kind()) {
    case Kind::Int: {
      const auto& i = value.asInt();
      if (i.size == 0)
        return J(i.value != 0);
      if (!i.isSigned && i.size == 8)
        return J(static_cast<std::uint64_t>(i.value));
      return J(i.value);
    }
    case Kind::Float:
      return J(value.asFloat().value);
    case Kind::String:
      return J(value.asString());
    case Kind::List:
    case Kind::VarArgs: {
      J arr = J::array();
      for (const auto& e : value.kind() == Kind::List ? value.asList() : value.asVarArgs())
        arr.push_back(toJson(e));
      return arr;
    }
    case Kind::Map: {
      const auto& m = value.asMap();
      bool stringKeys = true;
      for (const auto& e : m)
        stringKeys = stringKeys && e.first.kind() == Kind::String;
      if (stringKeys) {
        J obj = J::object();
        for (const auto& [k, v] : m)
          obj[k.asString()] = toJson(v);
        return obj;
      }
      J arr = J::array();
      for (const auto& [k, v] : m)
        arr.push_back(J::array({toJson(k), toJson(v)}));
      return arr;
    }
    case Kind::Tuple: {
      const auto& t = value.asTuple();
      if (!t.memberNames.empty() && t.memberNames.size() == t.members.size()) {
        J obj = J::object();
        for (std::size_t k = 0; k < t.members.size(); ++k)
          obj[t.memberNames[k]] = toJson(t.members[k]);
        return obj;
      }
      J arr = J::array();
      for (const auto& e : t.members)
        arr.push_back(toJson(e));
      return arr;
    }
    case Kind::Dynamic:
      return toJson(value.asDynamic());
    case Kind::Raw: {
      J arr = J::array();
      for (auto b : value.asRaw().bytes)
        arr.push_back(b);
      return arr;
    }
    default:
      return J();
  }
}

}  // namespace ko
