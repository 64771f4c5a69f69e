#include "stabilizer/effect/src/stabilizer_strings.h"

#include <iterator>

namespace kelp::effect {
namespace {

// Those that name a parameter have room for 31 bytes.
constexpr const char* kLiterals[] = {
    "$$$/OV/Stabilizer/LStr/0000=Calmframe, v%d.%d#{cr}#{cr}Stabilizes footage without manual "
    "tracking.",
    "",
    "$$$/OV/Stabilizer/LStr/0002=Not enough memory to allocate stabilizer data.",
    "",
    "",
    "$$$/OV/Stabilizer/LStr/0005=Stabilization finished:",
    "$$$/OV/Stabilizer/LStr/0006=%d%% (frame %d%s of %d)",
    "$$$/OV/Stabilizer/LStr/0007=Stabilizer analysis canceled.",
    "$$$/OV/Stabilizer/LStr/0008=Time remaining: %d minutes",
    "$$$/OV/Stabilizer/LStr/0009=Time remaining: %d seconds",
    "",
    "",
    "$$$/OV/Stabilizer/LStr/0012=Stabilization",
    "$$$/OV/Stabilizer/LStr/0013=Result",
    "$$$/OV/Stabilizer/LStr/0014=Smooth Motion|No Motion",
    "$$$/OV/Stabilizer/LStr/0015=Smoothness",
    "$$$/OV/Stabilizer/LStr/0016=Method",
    "$$$/OV/Stabilizer/LStr/0017=Position|Position, Scale, Rotation|Perspective|Subspace Warp",
    "$$$/OV/Stabilizer/LStr/0018=Borders",
    "$$$/OV/Stabilizer/LStr/0019=Framing",
    "$$$/OV/Stabilizer/LStr/0020=Stabilize Only|Stabilize, Crop|Stabilize, Crop, "
    "Auto-scale|Stabilize, Synthesize Edges",
    "$$$/OV/Stabilizer/LStr/0021=Auto-scale",
    "$$$/OV/Stabilizer/LStr/0022=Maximum Scale",
    "$$$/OV/Stabilizer/LStr/0023=Action-safe Margin",
    "$$$/OV/Stabilizer/LStr/0024=Additional Scale",
    "$$$/OV/Stabilizer/LStr/0025=Advanced",
    "",
    "$$$/OV/Stabilizer/LStr/0027=Rolling Shutter Ripple",
    "$$$/OV/Stabilizer/LStr/0028=Automatic Reduction|Enhanced Reduction",
    "$$$/OV/Stabilizer/LStr/0029=Crop Less <-> Smooth More",
    "$$$/OV/Stabilizer/LStr/0030=Synthesis Input Range (seconds)"
    "{{*COMMENT*}}must be 31 or fewer bytes",
    "$$$/OV/Stabilizer/LStr/0031=Synthesis Edge Feather",
    "$$$/OV/Stabilizer/LStr/0032=Synthesis Edge Cropping",
    "$$$/OV/Stabilizer/LStr/0033=Left",
    "$$$/OV/Stabilizer/LStr/0034=Top",
    "$$$/OV/Stabilizer/LStr/0035=Right",
    "$$$/OV/Stabilizer/LStr/0036=Bottom",
    "$$$/OV/Stabilizer/LStr/0037=Hide Warning Banner",
    "$$$/OV/Stabilizer/LStr/0038=Time remaining: %d minute",
    nullptr};
static_assert(std::size(kLiterals) == kStringMinuteLeft + 2);

constexpr HX_StringTable kStrings = {std::size(kLiterals), 4700, kLiterals};

}  // namespace

const HX_StringTable& StabilizerStringTable() {
  return kStrings;
}

const char* StabilizerStatusLiteral(std::int32_t status) {
  switch (status) {
    case 2:
      return "$$$/Plugin/Stabilizer/FrameOutsideRange=Frame not analyzed for stabilization; click "
             "Analyze.";
    case 5:
      return "$$$/Plugin/Stabilizer/MotionAnalysisInProgress=Stabilizing (step 2 of 2)";
    case 6:
    case 7:
      return "$$$/Plugin/Stabilizer/MotionAnalysisInProgressSubsequent=Stabilizing";
    case 10:
      return "$$$/Plugin/Stabilizer/StabilizationFailed=Stabilization failed.";
    case 11:
      return "$$$/Plugin/Stabilizer/GeneralFailure=Unable to stabilize.";
    case 12:
      return "$$$/Plugin/Stabilizer/Overcropped=To avoid extreme cropping set Framing to "
             "Stabilize Only or adjust other parameters.";
    default:
      return nullptr;
  }
}

}  // namespace kelp::effect
