#pragma once

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <limits>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

// JSON for persisted records. Objects keep the order of their keys. Texts are UTF-8 within a value.
namespace tessel::serialization {

// A value of its own: those of the JSON library need memory to be destroyed.
class Value {
 public:
  // A type of its own: where all of a variant's are known to move without failing, libstdc++ 12
  // takes it for whole even after a copy that failed.
  struct Array : std::vector<Value> {
    using std::vector<Value>::vector;
  };
  using Members = std::vector<std::pair<std::string, Value>>;  // keys are unique
  // Integers from 0 on are the unsigned ones.
  using Content = std::variant<std::nullptr_t, bool, std::int64_t, std::uint64_t, double,
                               std::string, Array, Members>;

  Value() = default;
  Value(std::nullptr_t) {}
  Value(bool value) : content_(value) {}
  template <std::integral T>
  Value(T value) {
    if (value < T{0}) {
      content_ = static_cast<std::int64_t>(value);
    } else {
      content_ = static_cast<std::uint64_t>(value);
    }
  }
  Value(double value) : content_(value) {}
  Value(const char* text) : content_(std::string(text)) {}
  Value(std::string text) : content_(std::move(text)) {}
  // An object of pairs that begin with a text, else an array.
  Value(std::initializer_list<Value> values);
  static Value array(std::initializer_list<Value> values) { return Value(Content(Array(values))); }
  static Value object() { return Value(Content(Members())); }
  explicit Value(Content content) : content_(std::move(content)) {}

  const Content& content() const { return content_; }
  template <class T>
  const T* as() const {
    return std::get_if<T>(&content_);
  }
  // Of an object: the member, null where there is none; that of a key, made if need be.
  const Value* find(const std::string& key) const;
  bool contains(const std::string& key) const { return find(key) != nullptr; }
  Value& operator[](const std::string& key);
  // Of an array: one more.
  void push_back(Value value) { std::get<Array>(content_).push_back(std::move(value)); }

  bool operator==(const Value& other) const { return content_ == other.content_; }

 private:
  Content content_ = nullptr;
};

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
// Undoes GetJSONString. Throws Error for what is not one JSON object, and for more than 100 levels.
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
  if (const auto* whole = member.as<std::uint64_t>(); whole && std::in_range<T>(*whole)) {
    return static_cast<T>(*whole);
  }
  if (const auto* negative = member.as<std::int64_t>(); negative && std::in_range<T>(*negative)) {
    return static_cast<T>(*negative);
  }
  throw WrongType(key);
}

}  // namespace tessel::serialization
