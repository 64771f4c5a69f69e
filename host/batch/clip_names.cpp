#include "host/batch/clip_names.h"

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <vector>

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;

constexpr char kStem[] = "{stem}";
constexpr char kExtension[] = "{ext}";

void ReplaceFrom(std::string& text, const std::string& word, const std::string& by) {
  for (std::size_t at = 0; (at = text.find(word, at)) != std::string::npos; at += by.size()) {
    text.replace(at, word.size(), by);
  }
}

// Fowler, Noll and Vo's hash, FNV-1a of 64 bits.
std::uint64_t HashOf(const std::string& bytes) {
  std::uint64_t hash = 0xcbf29ce484222325;
  for (const char c : bytes) hash = (hash ^ static_cast<std::uint8_t>(c)) * 0x100000001b3;
  return hash;
}

}  // namespace

std::string OutputName(const std::string& name_template, const std::string& below,
                       const std::string& clip) {
  const fs::path path(clip);
  std::string name;
  // A stem may have braces of its own, so that each part of the template is looked at once.
  for (std::size_t at = 0; at < name_template.size();) {
    if (name_template.compare(at, sizeof kStem - 1, kStem) == 0) {
      name += path.stem().string();
      at += sizeof kStem - 1;
    } else if (name_template.compare(at, sizeof kExtension - 1, kExtension) == 0) {
      name += path.extension().string();
      at += sizeof kExtension - 1;
    } else {
      name += name_template[at++];
    }
  }
  return (fs::path(below) / name).lexically_normal().string();
}

std::string TemplateTrouble(const std::string& name_template) {
  const fs::path path(name_template);
  std::string rest = name_template;
  ReplaceFrom(rest, kStem, "");
  ReplaceFrom(rest, kExtension, "");
  if (rest.find_first_of("{}") != std::string::npos) {
    return "'" + name_template + "' has a word in braces that is neither {stem} nor {ext}";
  }
  if (path.is_absolute() || path.filename().empty() ||
      std::find(path.begin(), path.end(), "..") != path.end()) {
    return "'" + name_template + "' is no name of a file below the folder that --to names";
  }
  if (std::any_of(path.begin(), path.end(),
                  [](const fs::path& part) { return part.native().starts_with('.'); })) {
    return "'" + name_template + "' would hide the files";
  }
  return "";
}

std::string TaskId(const std::string& output) {
  constexpr std::size_t kReadable = 64;
  std::string id = output.substr(output.size() > kReadable ? output.size() - kReadable : 0);
  for (char& c : id) {
    const bool plain = std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '.';
    if (static_cast<unsigned char>(c) >= 128 || !plain) c = '_';
  }
  char hash[20];
  std::snprintf(hash, sizeof hash, "-%016llx", static_cast<unsigned long long>(HashOf(output)));
  return id + hash;
}

nlohmann::ordered_json JsonOfBytes(const std::string& bytes) {
  nlohmann::ordered_json text = bytes;
  try {
    (void)text.dump();
    return text;
  } catch (const nlohmann::json::type_error&) {
    return std::vector<std::uint8_t>(bytes.begin(), bytes.end());
  }
}

std::string BytesOf(const nlohmann::ordered_json& json) {
  if (!json.is_array()) return json.get<std::string>();
  std::string bytes;
  for (const auto& byte : json) bytes.push_back(static_cast<char>(WholeOf(byte)));
  return bytes;
}

std::int64_t WholeOf(const nlohmann::ordered_json& json) {
  if (json.is_number_integer()) return json.get<std::int64_t>();
  throw nlohmann::json::type_error::create(302, "a whole number is wanted", nullptr);
}

}  // namespace calmframe::batch
