#include "host/base/param_text.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <nlohmann/json.hpp>
#include <sstream>

#include "host/base/nearest_match.h"

namespace calmframe {
namespace {

bool SameWord(const std::string& a, const std::string& b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](unsigned char x, unsigned char y) {
    return std::tolower(x) == std::tolower(y);
  });
}

}  // namespace

bool IsControl(const HX_ParamDef& param) {
  return !KindText(param).empty() && (param.ui_flags & HX_PARAM_UI_HIDDEN) == 0;
}

std::string KindText(const HX_ParamDef& param) {
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      return "slider";
    case HX_PARAM_POPUP:
      return "popup";
    case HX_PARAM_CHECKBOX:
      return "checkbox";
    default:
      return "";
  }
}

std::vector<std::string> PopupItems(const HX_ParamDef& param) {
  std::vector<std::string> items;
  std::istringstream text(param.u.pd.items ? param.u.pd.items : "");
  for (std::string item; std::getline(text, item, '|');) items.push_back(item);
  return items;
}

std::string NumberText(double number) {
  char text[32];
  std::snprintf(text, sizeof text, "%g", number);
  return text;
}

double WrittenNumber(float number) {
  char text[32];
  *std::to_chars(text, text + sizeof text - 1, number).ptr = 0;
  return std::strtod(text, nullptr);
}

double DefaultOf(const HX_ParamDef& param) {
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      return WrittenNumber(param.u.fs.default_value);
    case HX_PARAM_POPUP:
      return param.u.pd.default_value;
    default:
      return param.u.bd.default_value;
  }
}

bool IsChanged(const HX_ParamDef& param, double value) {
  return static_cast<float>(value) != static_cast<float>(DefaultOf(param));
}

nlohmann::ordered_json DeclarationJson(const HX_ParamDef& param) {
  nlohmann::ordered_json json;
  json["kind"] = KindText(param);
  if (param.kind == HX_PARAM_FLOAT_SLIDER) {
    json["min"] = WrittenNumber(param.u.fs.valid_min);
    json["max"] = WrittenNumber(param.u.fs.valid_max);
  } else if (param.kind == HX_PARAM_POPUP) {
    json["items"] = PopupItems(param);
  }
  json["default"] = DefaultOf(param);
  return json;
}

std::string ValueText(const HX_ParamDef& param, double value) {
  if (param.kind == HX_PARAM_CHECKBOX) return value != 0 ? "on" : "off";
  if (param.kind == HX_PARAM_POPUP) {
    const std::vector<std::string> items = PopupItems(param);
    const auto index = static_cast<std::size_t>(value) - 1;
    if (index < items.size()) return items[index];
  }
  return NumberText(value);
}

const HX_ParamDef* FindParam(const std::string& name, const std::vector<HX_ParamDef>& declared) {
  const auto found = std::find_if(
      declared.begin(), declared.end(),
      [&name](const HX_ParamDef& param) { return IsControl(param) && SameWord(param.name, name); });
  return found == declared.end() ? nullptr : &*found;
}

std::string UnknownParamText(const std::string& name, const std::vector<HX_ParamDef>& declared) {
  std::vector<std::string> names;
  for (const HX_ParamDef& param : declared) {
    if (IsControl(param)) names.push_back(param.name);
  }
  const std::string nearest = NearestMatch(name, names);
  return "there is no parameter '" + name + "'" +
         (nearest.empty() ? "; calmframe params lists them" : "; did you mean '" + nearest + "'?");
}

double ParamValueOf(const HX_ParamDef& param, const std::string& text) {
  // Whatever the locale, which a program around a library may have set.
  double number = 0;
  const char* const begin = text.c_str() + (text[0] == '+' ? 1 : 0);
  const char* const end = text.c_str() + text.size();
  const auto read = std::from_chars(begin, end, number);
  const bool is_number = read.ec == std::errc() && read.ptr == end && std::isfinite(number);
  const auto refuse = [&](const std::string& why) -> double {
    throw ParamRefused(std::string(param.name) + ": " + why);
  };
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER: {
      const double least = WrittenNumber(param.u.fs.valid_min);
      const double most = WrittenNumber(param.u.fs.valid_max);
      if (is_number && number >= least && number <= most) return number;
      return refuse(text + " is out of range: " + NumberText(least) + " to " + NumberText(most));
    }
    case HX_PARAM_CHECKBOX:
      if (SameWord(text, "on") || SameWord(text, "true") || text == "1") return 1;
      if (SameWord(text, "off") || SameWord(text, "false") || text == "0") return 0;
      return refuse("'" + text + "' is neither on nor off");
    default: {
      const std::vector<std::string> items = PopupItems(param);
      for (std::size_t i = 0; i < items.size(); ++i) {
        if (SameWord(items[i], text)) return static_cast<double>(i + 1);
      }
      if (is_number && number == std::floor(number) && number >= 1 &&
          number <= static_cast<double>(items.size())) {
        return number;
      }
      return refuse(NoneOf(text, items));
    }
  }
}

}  // namespace calmframe
