#include "effect/parameter_reader.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "platform/tessel/debug.h"

namespace kelp::effect {
namespace {

// A host may hand over anything.
std::int32_t Truncate(double value) {
  using limits = std::numeric_limits<std::int32_t>;
  if (std::isnan(value)) return 0;
  return static_cast<std::int32_t>(
      std::clamp(value, static_cast<double>(limits::min()), static_cast<double>(limits::max())));
}

}  // namespace

double ParameterReader::GetFloatParam(std::int32_t id) const {
  const std::int32_t index = IndexOf(id);
  return IsAbsent(index) ? Default(index) : Value(index);
}

std::int32_t ParameterReader::GetIntParam(std::int32_t id) const {
  const std::int32_t index = IndexOf(id);
  return Truncate(IsAbsent(index) ? Default(index) : Value(index) + 0.5);
}

bool ParameterReader::GetBoolParam(std::int32_t id) const {
  return GetFloatParam(id) != 0;
}

std::int32_t ParameterReader::GetPopupParam(std::int32_t id) const {
  return Truncate(GetFloatParam(id));
}

bool ShowsExperimentalParameters() {
  static const bool shows =
      tessel::debug::DebugDatabase::GetBool("ShowExperimentalEffectParameters");
  return shows;
}

}  // namespace kelp::effect
