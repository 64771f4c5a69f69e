#pragma once

#include <cstdint>
#include <limits>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <string>
#include <type_traits>

// JSON for persisted records. Objects keep the order of their keys. Texts are UTF-8 within a value.
namespace tessel::serialization {

using Value = nlohmann::ordered_json;

class Error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

class MissingKey : public Error {
 public:
  explicit MissingKey(const std::string& key) : Error("missing key: " + key) {}
};

class WrongType : public Error {
 public:
  explicit WrongType(const std::string& key) : Error("wrong type or range: " + key) {}
};

// Integers keep all 64 bits and finite floats their bits; others can't be written. A value that is
// not an object becomes the one member "SerializerWrappedObject" of one. Throws Error.
std::u16string GetJSONString(const Value& value);
// Undoes GetJSONString. Throws Error for what is not one JSON object.
Value JSONParse(const std::u16string& text);

// Member `key` of an object, of exactly the type asked for: integers within T's range, floats from
// any number. Throws MissingKey or WrongType.
const Value& Member(const Value& object, const std::string& key);
const Value& GetObject(const Value& object, const std::string& key);
std::string GetString(const Value& object, const std::string& key);
bool GetBool(const Value& object, const std::string& key);
double GetFloat(const Value& object, const std::string& key);

template <typename T>
T GetInteger(const Value& object, const std::string& key) {
  static_assert(std::is_integral_v<T> && !std::is_same_v<T, bool>);
  const Value& member = Member(object, key);
  if (member.is_number_unsigned()) {
    const auto number = member.get<std::uint64_t>();
    if (number <= static_cast<std::uint64_t>(std::numeric_limits<T>::max())) {
      return static_cast<T>(number);
    }
  } else if (member.is_number_integer()) {
    const auto number = member.get<std::int64_t>();
    if (std::is_signed_v<T> && number < 0 &&
        number >= static_cast<std::int64_t>(std::numeric_limits<T>::min())) {
      return static_cast<T>(number);
    }
    if (number >= 0 && static_cast<std::uint64_t>(number) <=
                           static_cast<std::uint64_t>(std::numeric_limits<T>::max())) {
      return static_cast<T>(number);
    }
  }
  throw WrongType(key);
}

}  // namespace tessel::serialization
