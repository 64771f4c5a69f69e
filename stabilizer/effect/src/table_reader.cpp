#include "stabilizer/effect/src/table_reader.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace kelp::effect {
namespace {

std::int32_t IndexOf(std::int32_t id) {
  const std::int32_t index = ParamIdToIndex(id);
  return index == kNoParam ? id : index;
}

// A host may hand over anything.
std::int32_t Truncate(double value) {
  using limits = std::numeric_limits<std::int32_t>;
  if (std::isnan(value)) return 0;
  return static_cast<std::int32_t>(
      std::clamp(value, static_cast<double>(limits::min()), static_cast<double>(limits::max())));
}

}  // namespace

ParameterValues::ParameterValues() {
  for (std::int32_t i = 0; i < kParamCount; ++i) (*this)[i] = GetParamDefault(i);
}

double TableReader::GetFloatParam(std::int32_t id) const {
  const std::int32_t index = IndexOf(id);
  return IsParamAbsent(index) ? GetParamDefault(index) : source_.Value(index);
}

std::int32_t TableReader::GetIntParam(std::int32_t id) const {
  const std::int32_t index = IndexOf(id);
  return Truncate(IsParamAbsent(index) ? GetParamDefault(index) : source_.Value(index) + 0.5);
}

bool TableReader::GetBoolParam(std::int32_t id) const {
  return GetFloatParam(id) != 0;
}

std::int32_t TableReader::GetPopupParam(std::int32_t id) const {
  return Truncate(GetFloatParam(id));
}

}  // namespace kelp::effect
