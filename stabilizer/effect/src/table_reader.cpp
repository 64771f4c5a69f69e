#include "stabilizer/effect/src/table_reader.h"

namespace kelp::effect {

ParameterValues::ParameterValues() {
  for (std::int32_t i = 0; i < kParamCount; ++i) (*this)[i] = GetParamDefault(i);
}

std::int32_t TableReader::IndexOf(std::int32_t id) const {
  const std::int32_t index = ParamIdToIndex(id);
  return index == kNoParam ? id : index;
}

}  // namespace kelp::effect
