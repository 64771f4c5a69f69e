#include "library/control_set.h"

#include <charconv>
#include <nlohmann/json.hpp>
#include <optional>

#include "host/base/nearest_match.h"
#include "host/base/param_text.h"
#include "library/refusal.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::library {
namespace {

// Throws Refusal.
double NumberOf(const std::string& name, const std::string& text, double least, double most) {
  double number = 0;
  const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
  if (read.ec != std::errc() || read.ptr != text.data() + text.size() ||
      !(number >= least && number <= most)) {
    throw Refusal(CALMFRAME_ERROR_ARGUMENT, name + ": '" + text + "' is out of range: " +
                                                NumberText(least) + " to " + NumberText(most));
  }
  return number;
}

// The place of the text among the choices. Throws Refusal.
std::size_t ItemOf(const std::string& name, const std::string& text,
                   const std::vector<std::string>& choices) {
  for (std::size_t i = 0; i < choices.size(); ++i) {
    if (choices[i] == text) return i;
  }
  throw Refusal(CALMFRAME_ERROR_ARGUMENT, name + ": " + NoneOf(text, choices));
}

}  // namespace

ControlSet::ControlSet(const std::vector<HX_ParamDef>& declared) : declared_(declared) {
  for (HX_ParamDef& param : declared_) {
    if (param.kind != HX_PARAM_POPUP || !param.u.pd.items) continue;
    param.u.pd.items = items_.emplace_back(param.u.pd.items).c_str();
  }
}

bool ControlSet::SetWindow(const std::string& name, const std::string& value) {
  using Kind = host::WindowSettings::Kind;
  constexpr Kind kKinds[] = {Kind::by_controls, Kind::follow, Kind::steady};
  constexpr host::Still kStill[] = {host::Still::automatic, host::Still::background,
                                    host::Still::subject};
  if (name == "window") {
    window_.kind = kKinds[ItemOf(name, value, {"auto", "follow", "steady"})];
  } else if (name == "zoom-at-most") {
    window_.most_zoom = value == "0" ? 0 : NumberOf(name, value, 1, 100);
  } else if (name == "zoom-speed") {
    window_.zoom_speed.reset();
    if (!value.empty()) window_.zoom_speed = NumberOf(name, value, 0, 1000);
  } else if (name == "steady") {
    window_.still = kStill[ItemOf(name, value, {"auto", "background", "subject"})];
  } else if (name == "as-set") {
    window_.as_set = ItemOf(name, value, {"off", "on"}) == 1;
  } else {
    return false;
  }
  return true;
}

void ControlSet::Set(const std::string& name, const std::string& value) {
  if (SetWindow(name, value)) return;
  const HX_ParamDef* const param = FindParam(name, declared_);
  if (!param) throw Refusal(CALMFRAME_ERROR_ARGUMENT, UnknownParamText(name, declared_));
  values_[param->disk_id] = ParamValueOf(*param, value);
}

std::string ControlSet::Json() const {
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  for (std::size_t index = 0; index < declared_.size(); ++index) {
    const HX_ParamDef& param = declared_[index];
    if (!IsControl(param)) continue;
    nlohmann::ordered_json json;
    json["name"] = param.name;
    json.update(DeclarationJson(param));
    json["experimental"] = index >= static_cast<std::size_t>(HX_FIRST_EXPERIMENTAL);
    const auto value = values_.find(param.disk_id);
    json["value"] = nullptr;
    if (value != values_.end()) json["value"] = value->second;
    list.push_back(std::move(json));
  }
  return list.dump();
}

}  // namespace calmframe::library
