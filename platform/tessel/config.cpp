#include "platform/tessel/config.h"

#include <algorithm>
#include <boost/algorithm/string/replace.hpp>
#include <mutex>
#include <shared_mutex>
#include <utility>

#include "platform/tessel/debug.h"
#include "platform/tessel/utility.h"

namespace tessel::config {
namespace {

constexpr char kKeyStart[] = "$$$/";
constexpr char kComment[] = "{{*COMMENT*}}";
constexpr std::pair<const char*, const char*> kEntities[] = {
    {"#{cr}", "\n"}, {"#{ldquo}", "\u201c"}, {"#{rdquo}", "\u201d"}, {"#{copy}", "\u00a9"}};

struct Table {
  std::shared_mutex mutex;
  std::map<std::string, std::string> texts;  // guarded by mutex
};

Table& table() {
  static Table& instance = *new Table;  // background threads may outlive static objects
  return instance;
}

std::string Resolve(std::string text) {
  text.erase(std::min(text.find(kComment), text.size()));
  for (const auto& [entity, value] : kEntities) boost::replace_all(text, entity, value);
  return text;
}

}  // namespace

std::string Localizer::Localize(const std::string& literal) {
  const std::size_t equals = literal.find('=');
  if (literal.rfind(kKeyStart, 0) != 0 || equals == std::string::npos) return literal;
  {
    std::shared_lock<std::shared_mutex> lock(table().mutex);
    const auto found = table().texts.find(literal.substr(0, equals));
    if (found != table().texts.end()) return Resolve(found->second);
  }
  return Resolve(literal.substr(equals + 1));
}

std::u16string Localizer::LocalizeUTF16(const std::string& literal) {
  return utility::ToUTF16(Localize(literal));
}

void Localizer::SetTable(std::map<std::string, std::string> texts) {
  std::unique_lock<std::shared_mutex> lock(table().mutex);
  table().texts = std::move(texts);
}

StringTable::StringTable(const char* const* literals, std::uint32_t count) {
  for (std::uint32_t i = 0; i < count && literals[i]; ++i) {
    texts_.push_back(Localizer::Localize(literals[i]));
  }
}

const char* StringTable::Get(std::int32_t index) const {
  if (index < 0 || static_cast<std::size_t>(index) >= texts_.size()) return nullptr;
  return texts_[static_cast<std::size_t>(index)].c_str();
}

void ThrowError(const std::string& literal, std::int32_t code) {
  const std::string text = Localizer::Localize(literal);
  debug::Trace("ThrowError", 1, std::to_string(code) + " " + text);
  throw Error(code, text);
}

}  // namespace tessel::config
