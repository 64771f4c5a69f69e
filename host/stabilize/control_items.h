#pragma once

#include <cstdint>

namespace calmframe::host {

// Items of HX_FRAMING, of HX_RESULT, and of HX_METHOD.
inline constexpr double kStabilizeOnly = 1, kCrop = 2, kCropAutoScale = 3, kSynthesizeEdges = 4;
inline constexpr double kSmoothMotion = 1, kNoMotion = 2;
inline constexpr double kPositionScaleRotation = 2;
// Disk id of an experts' parameter.
inline constexpr std::int32_t kAlphaBoost = 283;
inline bool Crops(double framing) {
  return framing == kCrop || framing == kCropAutoScale;
}

}  // namespace calmframe::host
