#include "platform/tessel/serialization.h"

#include <cmath>

#include "platform/tessel/utility.h"

namespace tessel::serialization {
namespace {

constexpr char kWrapper[] = "SerializerWrappedObject";

// The library would write null for these.
void RefuseNonFinite(const Value& value) {
  if (value.is_number_float() && !std::isfinite(value.get<double>())) {
    throw Error("a number that is not finite");
  }
  if (!value.is_structured()) return;
  for (const Value& member : value) RefuseNonFinite(member);
}

}  // namespace

std::u16string GetJSONString(const Value& value) {
  RefuseNonFinite(value);
  try {
    return utility::ToUTF16(value.is_object() ? value.dump() : Value{{kWrapper, value}}.dump());
  } catch (const nlohmann::json::exception& e) {
    throw Error(e.what());
  }
}

Value JSONParse(const std::u16string& text) {
  Value value = Value::parse(utility::ToUTF8(text), nullptr, /*allow_exceptions=*/false);
  if (value.is_discarded()) throw Error("no JSON");
  if (!value.is_object()) throw Error("no JSON object");
  if (value.size() == 1 && value.contains(kWrapper)) return Value(std::move(value[kWrapper]));
  return value;
}

const Value& Member(const Value& object, const std::string& key) {
  if (!object.is_object()) throw WrongType(key);
  const auto found = object.find(key);
  if (found == object.end()) throw MissingKey(key);
  return *found;
}

const Value& GetObject(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (!member.is_object()) throw WrongType(key);
  return member;
}

std::string GetString(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (!member.is_string()) throw WrongType(key);
  return member.get<std::string>();
}

bool GetBool(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (!member.is_boolean()) throw WrongType(key);
  return member.get<bool>();
}

double GetFloat(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (!member.is_number()) throw WrongType(key);
  return member.get<double>();
}

}  // namespace tessel::serialization
