#pragma once

#include <cstdint>

#include "platform/hx/hx_effect.h"

// The stabilizer's texts for the user. All are keyed literals, which the host's string table or
// tessel::config::Localizer turns into plain text.
namespace kelp::effect {

// Entries of the numbered table.
enum StringNumber : std::int32_t {
  kStringAbout = 0,  // %d.%d: version
  kStringOutOfMemory = 2,
  kStringFinished = 5,
  kStringFrameProgress = 6,  // %d %% (frame %d%s of %d)
  kStringCanceled = 7,
  kStringMinutesLeft = 8,
  kStringSecondsLeft = 9,
  kStringStabilization = 12,
  kStringResult = 13,
  kStringResultItems = 14,
  kStringSmoothness = 15,
  kStringMethod = 16,
  kStringMethodItems = 17,
  kStringBorders = 18,
  kStringFraming = 19,
  kStringFramingItems = 20,
  kStringAutoScale = 21,
  kStringMaximumScale = 22,
  kStringActionSafeMargin = 23,
  kStringAdditionalScale = 24,
  kStringAdvanced = 25,
  kStringRollingShutterRipple = 27,
  kStringRollingShutterRippleItems = 28,
  kStringCropLessSmoothMore = 29,
  kStringSynthesisInputRange = 30,
  kStringSynthesisEdgeFeather = 31,
  kStringSynthesisEdgeCropping = 32,
  kStringLeft = 33,
  kStringTop = 34,
  kStringRight = 35,
  kStringBottom = 36,
  kStringHideWarningBanner = 37,
  kStringMinuteLeft = 38
};

// Table 4700, for HX_Callbacks.open_strings. Static.
const HX_StringTable& StabilizerStringTable();

// The stabilizer's own wording of a frame's status; null where it has none and the analysis'
// wording counts.
const char* StabilizerStatusLiteral(std::int32_t status);

// As messages name the effect.
inline constexpr char kEffectName[] = "Calmframe";

// @0: the present scale in percent.
inline constexpr char kAutoScaleReadout[] =
    "$$$/Plugin/Stabilizer/AutoScaleReadout=Auto-scale (@0%)";

// What a project's data is refused with.
inline constexpr char kVersionTooOld[] =
    "$$$/Plugin/Stabilizer/Error/VersionTooOld=Calmframe requires re-analysis because the project "
    "data is from an old version.";
inline constexpr char kVersionTooNew[] =
    "$$$/Plugin/Stabilizer/Error/VersionTooNew=Calmframe requires re-analysis because the project "
    "data is from a newer version.";
inline constexpr char kBadSerializedData[] =
    "$$$/Plugin/Stabilizer/Error/BadSerializedData=Calmframe requires re-analysis because saved "
    "data has been damaged.";
inline constexpr char kGridMismatch[] =
    "$$$/Plugin/Stabilizer/Error/GridMismatch=Calmframe requires re-analysis because of an old "
    "project format.";

}  // namespace kelp::effect
