#include "host/effects/param_table.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <utility>

#include "platform/tessel/guid.h"

namespace calmframe::host {
namespace {

void SetValue(HX_ParamDef& param, double value) {
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER: {
      const HX_FloatSlider& slider = param.u.fs;
      param.u.fs.value =
          std::clamp<double>(value, slider.valid_min, std::max(slider.valid_min, slider.valid_max));
      break;
    }
    case HX_PARAM_POPUP:
      param.u.pd.value = static_cast<std::int32_t>(
          std::clamp<double>(std::round(value), 1, std::max(1, param.u.pd.count)));
      break;
    case HX_PARAM_CHECKBOX:
      param.u.bd.value = value != 0.0 ? 1 : 0;
      break;
    default:
      break;
  }
}

}  // namespace

std::optional<double> ValueOf(const HX_ParamDef& param) {
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      return param.u.fs.value;
    case HX_PARAM_POPUP:
      return param.u.pd.value;
    case HX_PARAM_CHECKBOX:
      return param.u.bd.value;
    default:
      return std::nullopt;
  }
}

ParamTable::ParamTable(std::vector<HX_ParamDef> declared) : params_(std::move(declared)) {}

std::size_t ParamTable::size() const {
  std::lock_guard lock(mutex_);
  return params_.size();
}

std::optional<HX_ParamDef> ParamTable::At(std::int32_t index) const {
  std::lock_guard lock(mutex_);
  if (index < 0 || static_cast<std::size_t>(index) >= params_.size()) return std::nullopt;
  return params_[static_cast<std::size_t>(index)];
}

std::vector<HX_ParamDef> ParamTable::All() const {
  std::lock_guard lock(mutex_);
  return params_;
}

std::int32_t ParamTable::IndexOf(std::int32_t disk_id) const {
  std::lock_guard lock(mutex_);
  for (std::size_t i = 1; i < params_.size(); ++i) {
    if (params_[i].disk_id == disk_id) return static_cast<std::int32_t>(i);
  }
  return -1;
}

bool ParamTable::SetByUser(std::int32_t index, double value) {
  std::lock_guard lock(mutex_);
  if (index < 1 || static_cast<std::size_t>(index) >= params_.size()) return false;
  HX_ParamDef& param = params_[static_cast<std::size_t>(index)];
  if (std::isnan(value) || !ValueOf(param)) return false;
  SetValue(param, value);
  return true;
}

bool ParamTable::SetByPlugin(std::int32_t index, const HX_ParamDef& param) {
  std::lock_guard lock(mutex_);
  if (index < 1 || static_cast<std::size_t>(index) >= params_.size()) return false;
  params_[static_cast<std::size_t>(index)].u = param.u;
  return true;
}

void ParamTable::Append(const HX_ParamDef& param) {
  std::lock_guard lock(mutex_);
  params_.push_back(param);
}

bool ParamTable::UpdateUI(std::int32_t index, const HX_ParamDef& param) {
  std::lock_guard lock(mutex_);
  if (index < 1 || static_cast<std::size_t>(index) >= params_.size()) return false;
  HX_ParamDef& own = params_[static_cast<std::size_t>(index)];
  std::memcpy(own.name, param.name, sizeof(own.name));
  own.name[sizeof(own.name) - 1] = '\0';
  own.flags = param.flags;
  own.ui_flags = param.ui_flags;
  return true;
}

ParamValues ParamTable::Values() const {
  ParamValues values;
  for (const HX_ParamDef& param : All()) {
    if (const std::optional<double> value = ValueOf(param)) values[param.disk_id] = *value;
  }
  return values;
}

void ParamTable::SetValues(const ParamValues& values) {
  std::lock_guard lock(mutex_);
  for (HX_ParamDef& param : params_) {
    const auto found = values.find(param.disk_id);
    if (found != values.end() && !std::isnan(found->second)) SetValue(param, found->second);
  }
}

std::string ParamTable::SettingsText() const {
  tessel::utility::Guid hash;
  for (const HX_ParamDef& param : All()) {
    const std::optional<double> value = ValueOf(param);
    if (!value || param.ui_flags & HX_PARAM_UI_HIDDEN) continue;
    hash = MixHash(hash, &param.disk_id, sizeof(param.disk_id));
    hash = MixHash(hash, &*value, sizeof(*value));
  }
  return hash.ToText();
}

}  // namespace calmframe::host
