#pragma once

#include <cstdint>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

// Texts for the user, and failures that carry one. Any thread.
namespace tessel::config {

// A keyed literal is "$$$/Path/Of/Key=English text{{*COMMENT*}}note for translators", UTF-8.
class Localizer {
 public:
  // The text for the key in the table that is set, else the literal's own; without the comment,
  // with
  // #{cr} as a line break, #{ldquo} and #{rdquo} as curly quotes, #{copy} as the copyright sign. A
  // text that does not begin with "$$$/" or has no "=" is given back unchanged.
  static std::string Localize(const std::string& literal);
  static std::u16string LocalizeUTF16(const std::string& literal);

  // Texts by key ("$$$/Path/Of/Key") in the user's language; an empty table leaves the English
  // ones.
  static void SetTable(std::map<std::string, std::string> table);
};

// A numbered table of literals, localised once. Read-only from then on.
class StringTable {
 public:
  // A null literal is the table's end; an empty one keeps its place.
  StringTable(const char* const* literals, std::uint32_t count);
  // "" for a kept place, null outside the table; valid as long as the table.
  const char* Get(std::int32_t index) const;

 private:
  std::vector<std::string> texts_;
};

// what() is the localised text.
class Error : public std::runtime_error {
 public:
  Error(std::int32_t code, const std::string& text) : std::runtime_error(text), code_(code) {}
  std::int32_t code() const { return code_; }

 private:
  std::int32_t code_;
};

// Reports the failure on the trace channel "ThrowError" at level 1 and throws Error.
[[noreturn]] void ThrowError(const std::string& literal, std::int32_t code = 0);

}  // namespace tessel::config
