#pragma once

#include <cstdint>

namespace calmframe::host {

// Indices of the plug-in's controls; from kDeblur on with the experimental parameters alone.
enum : std::int32_t {
  kAnalyze = 1,
  kCancel = 2,
  kGroup = 3,
  kResult = 4,
  kSmoothness = 5,
  kMethod = 6,
  kFraming = 9,
  kAutoScale = 10,
  kMaximumScale = 11,
  kActionSafeMargin = 12,
  kAdditionalScale = 14,
  kDetailedAnalysis = 17,
  kRollingShutterRipple = 18,
  kCropLessSmoothMore = 19,
  kSynthesisInputRange = 20,
  kSynthesisEdgeFeather = 21,
  kSynthesisLeft = 23,
  kSynthesisTop = 24,
  kSynthesisBottom = 26,
  kHideBanner = 28,
  kStatusCounter = 30,
  kRank = 59,
  kDeblur = 84,
  kDeblurFrameRange = 85,
  kDeblurComparisonBlur = 87,
  kShowDeblurMap = 90,
  kDeblurDebug = 91,
  kAlignedFrame = 92,
  kShowTracks = 95,
  kSaveTracks = 96
};

}  // namespace calmframe::host
