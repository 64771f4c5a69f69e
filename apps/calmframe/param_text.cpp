#include "apps/calmframe/param_text.h"

#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <sstream>

namespace calmframe {

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

std::string ValueText(const HX_ParamDef& param, double value) {
  if (param.kind == HX_PARAM_CHECKBOX) return value != 0 ? "on" : "off";
  if (param.kind == HX_PARAM_POPUP) {
    const std::vector<std::string> items = PopupItems(param);
    const auto index = static_cast<std::size_t>(value) - 1;
    if (index < items.size()) return items[index];
  }
  return NumberText(value);
}

}  // namespace calmframe
