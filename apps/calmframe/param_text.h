#pragma once

#include <string>
#include <vector>

#include "platform/hx/hx_params.h"

namespace calmframe {

// A parameter that the user sets: it has a value and is not the effect's own note.
bool IsControl(const HX_ParamDef& param);

// "slider", "popup", "checkbox"; of others the empty text.
std::string KindText(const HX_ParamDef& param);

std::vector<std::string> PopupItems(const HX_ParamDef& param);

// As short as it can be for six digits.
std::string NumberText(double number);

// Of one that has a value.
double DefaultOf(const HX_ParamDef& param);

// A value as --param takes it.
std::string ValueText(const HX_ParamDef& param, double value);

}  // namespace calmframe
