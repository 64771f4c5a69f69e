#pragma once

#include <nlohmann/json_fwd.hpp>
#include <stdexcept>
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

// A bound or default of a record, which are in single precision, as it was written: the shortest
// decimal number that it stands for, 0.0045 and not 0.00449999981.
double WrittenNumber(float number);

// Of one that has a value.
double DefaultOf(const HX_ParamDef& param);
// Whether the value, of a project or of the user, differs from it by more than single precision.
bool IsChanged(const HX_ParamDef& param, double value);

// What a control is, for programs: "kind", "min" and "max" of a slider or "items" of a popup, and
// "default".
nlohmann::ordered_json DeclarationJson(const HX_ParamDef& param);

// A value as ParamValueOf takes it.
std::string ValueText(const HX_ParamDef& param, double value);

// A value that a parameter doesn't take; one line that begins with its name.
class ParamRefused : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};
// What a text sets a parameter to: a number within its range, the name or number of an item, or
// on, true, 1, off, false, 0. Case doesn't count. Throws ParamRefused.
double ParamValueOf(const HX_ParamDef& param, const std::string& text);

// The control of that name, case apart; null without.
const HX_ParamDef* FindParam(const std::string& name, const std::vector<HX_ParamDef>& declared);
// "there is no parameter 'smothness'; did you mean 'Smoothness'?"
std::string UnknownParamText(const std::string& name, const std::vector<HX_ParamDef>& declared);

}  // namespace calmframe
