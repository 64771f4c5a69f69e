#include "platform/tessel/serialization.h"

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>

#include "platform/tessel/utility.h"

namespace tessel::serialization {
namespace {

constexpr char kWrapper[] = "SerializerWrappedObject";
constexpr std::size_t kDeepest = 100;

using Leaf = nlohmann::json;  // never a structured one; see Value

void Write(const Value& value, std::string& text) {
  const auto write = [&text]<class T>(const T& content) {
    if constexpr (std::is_same_v<T, Value::Array>) {
      text += '[';
      for (const Value& element : content) {
        if (text.back() != '[') text += ',';
        Write(element, text);
      }
      text += ']';
    } else if constexpr (std::is_same_v<T, Value::Members>) {
      text += '{';
      for (const auto& [key, member] : content) {
        if (text.back() != '{') text += ',';
        text += Leaf(key).dump() + ':';
        Write(member, text);
      }
      text += '}';
    } else {
      if constexpr (std::is_same_v<T, double>) {
        // The library would write null for these.
        if (!std::isfinite(content)) throw Error("a number that is not finite");
      }
      text += Leaf(content).dump();
    }
  };
  std::visit(write, value.content());
}

Value::Content ContentOf(std::initializer_list<Value> values) {
  Value::Members members;
  for (const Value& value : values) {
    const auto* const pair = value.as<Value::Array>();
    const auto* const key = pair && pair->size() == 2 ? (*pair)[0].as<std::string>() : nullptr;
    if (!key) return Value::Array(values);
    members.emplace_back(*key, (*pair)[1]);
  }
  return members;
}

// Builds a value of what the library's parser meets.
class Builder final : public nlohmann::json_sax<Leaf> {
 public:
  Value Take() { return std::move(root_); }

  bool null() override { return Add(nullptr); }
  bool boolean(bool value) override { return Add(value); }
  bool number_integer(number_integer_t value) override { return Add(value); }
  bool number_unsigned(number_unsigned_t value) override { return Add(value); }
  bool number_float(number_float_t value, const string_t&) override { return Add(value); }
  bool string(string_t& text) override { return Add(std::move(text)); }
  bool binary(binary_t&) override { return false; }
  bool start_object(std::size_t) override { return Open(Value::object()); }
  bool key(string_t& text) override {
    key_ = std::move(text);
    return true;
  }
  bool end_object() override { return Close(); }
  bool start_array(std::size_t) override { return Open(Value::array({})); }
  bool end_array() override { return Close(); }
  bool parse_error(std::size_t, const std::string&, const Leaf::exception&) override {
    return false;
  }

 private:
  Value& Place() {
    if (open_.empty()) return root_;
    Value& parent = *open_.back();
    if (parent.as<Value::Members>()) return parent[key_];
    parent.push_back({});
    return const_cast<Value&>(parent.as<Value::Array>()->back());
  }
  bool Add(Value value) {
    Place() = std::move(value);
    return true;
  }
  bool Open(Value value) {
    if (open_.size() == kDeepest) return false;
    Value& place = Place();
    place = std::move(value);
    open_.push_back(&place);  // stays where it is while it is open
    return true;
  }
  bool Close() {
    open_.pop_back();
    return true;
  }

  Value root_;
  std::vector<Value*> open_;  // from the root on
  std::string key_;
};

}  // namespace

Value::Value(std::initializer_list<Value> values) : content_(ContentOf(values)) {}

const Value* Value::find(const std::string& key) const {
  const Members* const members = as<Members>();
  if (!members) return nullptr;
  const auto found = std::find_if(members->begin(), members->end(),
                                  [&](const auto& member) { return member.first == key; });
  return found == members->end() ? nullptr : &found->second;
}

Value& Value::operator[](const std::string& key) {
  if (const Value* const found = find(key)) return const_cast<Value&>(*found);
  return std::get<Members>(content_).emplace_back(key, Value()).second;
}

std::u16string GetJSONString(const Value& value) {
  std::string text;
  try {
    Write(value.as<Value::Members>() ? value : Value{{kWrapper, value}}, text);
  } catch (const nlohmann::json::exception& e) {
    throw Error(e.what());
  }
  return utility::ToUTF16(text);
}

Value JSONParse(const std::u16string& text) {
  Builder builder;
  if (!Leaf::sax_parse(utility::ToUTF8(text), &builder)) throw Error("no JSON");
  Value value = builder.Take();
  const auto* const members = value.as<Value::Members>();
  if (!members) throw Error("no JSON object");
  if (members->size() == 1 && members->front().first == kWrapper) {
    return Value(members->front().second);
  }
  return value;
}

const Value& Member(const Value& object, const std::string& key) {
  if (!object.as<Value::Members>()) throw WrongType(key);
  const Value* const member = object.find(key);
  if (!member) throw MissingKey(key);
  return *member;
}

const Value& GetObject(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (!member.as<Value::Members>()) throw WrongType(key);
  return member;
}

std::string GetString(const Value& object, const std::string& key) {
  const auto* const text = Member(object, key).as<std::string>();
  if (!text) throw WrongType(key);
  return *text;
}

bool GetBool(const Value& object, const std::string& key) {
  const auto* const value = Member(object, key).as<bool>();
  if (!value) throw WrongType(key);
  return *value;
}

double GetFloat(const Value& object, const std::string& key) {
  const Value& member = Member(object, key);
  if (const auto* number = member.as<double>()) return *number;
  if (const auto* number = member.as<std::uint64_t>()) return static_cast<double>(*number);
  if (const auto* number = member.as<std::int64_t>()) return static_cast<double>(*number);
  throw WrongType(key);
}

}  // namespace tessel::serialization
