#pragma once

#include <array>
#include <cstdint>

#include "effect/parameter_reader.h"
#include "stabilizer/effect/src/parameter_table.h"

namespace kelp::effect {

// The stabilizer's parameters without a host: each at its default until set, by index.
class ParameterValues final : public ParameterReader {
 public:
  explicit ParameterValues(bool shows_experimental = true)
      : shows_experimental_(shows_experimental) {
    for (std::int32_t index = 0; index < kParamCount; ++index) {
      (*this)[index] = GetParamDefault(index);
    }
  }
  double& operator[](std::int32_t index) { return values_.at(static_cast<std::size_t>(index)); }

 private:
  std::int32_t IndexOf(std::int32_t id) const override {
    const std::int32_t index = ParamIdToIndex(id);
    return index == kNoParam ? id : index;
  }
  bool IsAbsent(std::int32_t index) const override {
    return !shows_experimental_ && IsExperimentalIndex(index);
  }
  double Default(std::int32_t index) const override { return GetParamDefault(index); }
  double Value(std::int32_t index) const override {
    return values_.at(static_cast<std::size_t>(index));
  }

  std::array<double, kParamCount> values_{};
  const bool shows_experimental_;
};

}  // namespace kelp::effect
