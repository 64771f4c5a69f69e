#include "stabilizer/effect/src/render_rules.h"

#include <algorithm>
#include <cmath>

#include "stabilizer/effect/src/parameter_table.h"

namespace kelp::effect {

using marrow::render::DeblurSettings;

namespace {

DeblurSettings GetDeblurSettings(const ParameterReader& params) {
  DeblurSettings deblur;
  if (!params.GetBoolParam(kDeblurIndex)) return deblur;
  deblur.range = static_cast<std::int32_t>(params.GetFloatParam(kDeblurFrameRangeIndex));
  deblur.frame_threshold = params.GetFloatParam(kDeblurFrameThresholdIndex);
  deblur.comparison_blur = static_cast<float>(params.GetFloatParam(kDeblurComparisonBlurIndex));
  const double threshold = params.GetFloatParam(kDeblurPixelThresholdIndex) / 100.0;
  const double softness = params.GetFloatParam(kDeblurPixelSoftnessIndex) / 100.0;
  deblur.pixel_threshold = static_cast<float>(threshold);
  deblur.pixel_limit = static_cast<float>(threshold + softness);
  deblur.show_map = params.GetBoolParam(kShowDeblurMapIndex);
  deblur.debug = static_cast<DeblurDebug>(params.GetPopupParam(kDeblurDebugIndex));
  deblur.aligned_frame = params.GetFloatParam(kAlignedFrameIndex);
  return deblur;
}

}  // namespace

RenderSettings GetRenderSettings(const ParameterReader& params) {
  RenderSettings settings;
  settings.framing = static_cast<Framing>(params.GetPopupParam(kFramingIndex));
  settings.action_safe = static_cast<float>(params.GetFloatParam(kActionSafeMarginIndex) / 100.0);
  settings.maximum_scale = static_cast<float>(params.GetFloatParam(kMaximumScaleIndex) / 100.0);
  settings.additional_scale =
      static_cast<float>(params.GetFloatParam(kAdditionalScaleIndex) / 100.0);
  const auto value = [&params](std::int32_t index) { return params.GetFloatParam(index); };
  settings.edges = {value(kSynthesisLeftIndex), value(kSynthesisTopIndex),
                    value(kSynthesisRightIndex), value(kSynthesisBottomIndex),
                    value(kSynthesisEdgeFeatherIndex)};
  settings.alpha_boost = value(kSynthesisAlphaBoostIndex);
  settings.deblur = GetDeblurSettings(params);
  return settings;
}

std::uint32_t MarginInFrames(const ParameterReader& params, double frame_rate) {
  if (static_cast<Framing>(params.GetPopupParam(kFramingIndex)) != Framing::synthesize_edges) {
    return 0;
  }
  constexpr double kMost = 2147483647.0;
  const double frames = std::round(params.GetFloatParam(kSynthesisInputRangeIndex) * frame_rate);
  return frames > 0 ? static_cast<std::uint32_t>(std::min(frames, kMost)) : 0;
}

}  // namespace kelp::effect
