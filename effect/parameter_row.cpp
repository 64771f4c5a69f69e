#include "effect/parameter_row.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

namespace kelp::effect {

ParameterTexts::ParameterTexts(std::function<const char*(std::int32_t)> numbered)
    : numbered_(std::move(numbered)) {}

const char* ParameterTexts::Get(const ParameterText& text) {
  if (text.number >= 0) {
    const char* found = numbered_(text.number);
    return found ? found : "";
  }
  const auto [entry, added] = localized_.try_emplace(text.literal);
  if (added) entry->second = tessel::config::Localizer::Localize(text.literal);
  return entry->second.c_str();
}

HX_ParamDef MakeParamDef(const ParameterRow& row, ParameterTexts& texts) {
  HX_ParamDef def;
  std::memset(&def, 0, sizeof def);
  def.disk_id = row.disk_id;
  def.kind = row.kind;
  def.flags = row.flags;
  def.ui_flags = row.ui_flags;
  const std::string name = tessel::utility::CutToBytes(texts.Get(row.name), HX_PARAM_NAME_SIZE - 1);
  std::memcpy(def.name, name.c_str(), name.size());

  const auto whole_default = static_cast<std::int32_t>(row.default_value);
  switch (row.kind) {
    case HX_PARAM_FLOAT_SLIDER: {
      HX_FloatSlider& slider = def.u.fs;
      slider.value = row.default_value;
      slider.default_value = static_cast<float>(row.default_value);
      slider.valid_min = row.valid.min;
      slider.valid_max = row.valid.max;
      slider.slider_min = row.slider.min;
      slider.slider_max = row.slider.max;
      slider.tolerance = 0.05f;
      slider.precision = row.format.precision;
      slider.display = row.format.display;
      break;
    }
    case HX_PARAM_POPUP: {
      HX_Popup& popup = def.u.pd;
      popup.value = popup.default_value = whole_default;
      popup.items = texts.Get(row.text);
      const std::string items = popup.items;
      popup.count = 1 + static_cast<std::int32_t>(std::count(items.begin(), items.end(), '|'));
      break;
    }
    case HX_PARAM_CHECKBOX:
      def.u.bd.value = def.u.bd.default_value = whole_default;
      break;
    case HX_PARAM_BUTTON:
      def.u.button.label = texts.Get(row.text);
      break;
    default:
      break;
  }
  return def;
}

double ValueOf(const HX_ParamDef& param) {
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      return param.u.fs.value;
    case HX_PARAM_POPUP:
      return param.u.pd.value;
    case HX_PARAM_CHECKBOX:
      return param.u.bd.value;
    default:
      return 0;
  }
}

}  // namespace kelp::effect
