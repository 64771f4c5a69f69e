#include "studio/wire/encoding.h"

#include <cctype>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <string>

namespace calmframe::studio {
namespace {

constexpr int kMostCrf = 63;
constexpr std::size_t kMostOptions = 32;
constexpr std::size_t kLongest = 512;  // of an option

std::string WordOf(const nlohmann::json& json, const char* what) {
  const nlohmann::json word = json.value(what, nlohmann::json(""));
  if (!word.is_string()) throw std::invalid_argument(std::string(what) + ": is a word");
  const std::string text = word.get<std::string>();
  for (const char letter : text) {
    if (std::isalnum(static_cast<unsigned char>(letter)) == 0 && letter != '_' && letter != '-') {
      throw std::invalid_argument("'" + text + "': is no " + what);
    }
  }
  return text;
}

}  // namespace

nlohmann::json JsonOf(const media::EncodeSettings& settings) {
  return {{"crf", settings.crf},
          {"codec", settings.codec},
          {"preset", settings.preset},
          {"options", settings.options},
          {"overwrite", settings.overwrite}};
}

media::EncodeSettings EncodeSettingsOf(const nlohmann::json& json) {
  media::EncodeSettings settings;
  const nlohmann::json crf = json.value("crf", nlohmann::json(settings.crf));
  if (!crf.is_number_integer() || crf < 0 || crf > kMostCrf) {
    throw std::invalid_argument("quality: is a number from 0 to " + std::to_string(kMostCrf));
  }
  settings.crf = crf.get<int>();
  settings.codec = WordOf(json, "codec");
  settings.preset = WordOf(json, "preset");
  settings.overwrite = json.value("overwrite", nlohmann::json(false)) == true;
  const nlohmann::json options = json.value("options", nlohmann::json::array());
  if (!options.is_array() || options.size() > kMostOptions) {
    throw std::invalid_argument("options are a list of at most " + std::to_string(kMostOptions));
  }
  for (const nlohmann::json& option : options) {
    const std::string text = option.is_string() ? option.get<std::string>() : "";
    const std::size_t sign = text.find('=');
    if (sign == 0 || sign == std::string::npos || text.size() > kLongest) {
      throw std::invalid_argument("option '" + text.substr(0, 40) + "': is none like tune=grain");
    }
    // Some encoders write statistics where they are told to.
    if (text.find('/') != std::string::npos || text.find('\0') != std::string::npos) {
      throw std::invalid_argument("option '" + text.substr(0, sign) + "': a page's names no file");
    }
    settings.options.push_back(text);
  }
  return settings;
}

}  // namespace calmframe::studio
