#include "studio/worker/panel.h"

#include <nlohmann/json.hpp>
#include <string>

#include "host/base/param_text.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::studio {
namespace {

std::string KindOf(const HX_ParamDef& param) {
  switch (param.kind) {
    case HX_PARAM_GROUP_START:
      return "group";
    case HX_PARAM_GROUP_END:
      return "end";
    case HX_PARAM_BUTTON:
      return "button";
    default:
      return KindText(param);
  }
}

nlohmann::json RowOf(const HX_ParamDef& param, bool expert) {
  nlohmann::json row = {{"id", param.disk_id},
                        {"kind", KindOf(param)},
                        {"name", param.name},
                        {"enabled", (param.ui_flags & HX_PARAM_UI_DISABLED) == 0},
                        {"expert", expert}};
  if (param.kind == HX_PARAM_GROUP_START) row["closed"] = (param.flags & HX_PARAM_FLAG_CLOSED) != 0;
  if (param.kind == HX_PARAM_BUTTON && param.u.button.label) row["label"] = param.u.button.label;
  if (!IsControl(param)) return row;
  row.update(DeclarationJson(param));
  row["value"] = host::ValueOf(param).value_or(0.0);
  if (param.kind == HX_PARAM_FLOAT_SLIDER) {
    const HX_FloatSlider& slider = param.u.fs;
    row["from"] = WrittenNumber(slider.slider_min);
    row["to"] = WrittenNumber(slider.slider_max);
    row["digits"] = slider.precision;
    row["percent"] = slider.display == 1;
  }
  return row;
}

}  // namespace

nlohmann::json PanelOf(host::SteadyClip& clip) {
  nlohmann::json rows = nlohmann::json::array();
  const auto count = static_cast<std::int32_t>(clip.host().declarations().size());
  for (std::int32_t index = 1; index < count; ++index) {
    const auto param = clip.effect().Param(index);
    if (!param || (param->ui_flags & HX_PARAM_UI_HIDDEN) != 0 || KindOf(*param).empty()) continue;
    rows.push_back(RowOf(*param, index >= HX_FIRST_EXPERIMENTAL));
  }
  return rows;
}

}  // namespace calmframe::studio
