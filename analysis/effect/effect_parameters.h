#pragma once

#include "analysis/effect/analysis_effect.h"
#include "effect/param_checkout.h"
#include "effect/parameter_reader.h"
#include "effect/parameter_row.h"

namespace kelp::analysis::effect {

inline constexpr std::int32_t kNoIndex = -1;

// The parameters of an effect's host at the time of its call, for the rules that read them.
class EffectParameters final : public kelp::effect::ParameterReader {
 public:
  explicit EffectParameters(AnalysisEffect& effect) : effect_(effect) {}

 private:
  std::int32_t IndexOf(std::int32_t id) const override {
    const std::int32_t index = effect_.ParamIdToIndex(id);
    return index == kNoIndex ? id : index;
  }
  bool IsAbsent(std::int32_t index) const override { return effect_.IsParamAbsent(index); }
  double Default(std::int32_t index) const override { return effect_.GetParamDefault(index); }
  double Value(std::int32_t index) const override {
    return kelp::effect::ValueOf(*kelp::effect::ParamCheckout(effect_.context(), index));
  }

  AnalysisEffect& effect_;
};

}  // namespace kelp::analysis::effect
