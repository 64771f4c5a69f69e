#include "host/stabilize/framing.h"

#include <algorithm>
#include <cmath>
#include <memory>

#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

constexpr double kMostBlack = 0.001;  // of a frame

// The share of the picture that stays black because the controls stop its enlargement, 0 to 1.
double BlackShare(const SteadyClip& clip, double width, const CropWindow& crop) {
  const auto value = [&clip](const auto& control) { return clip.ValueOf(control.disk_id); };
  // Whoever asks for a border or a smaller picture has one.
  if (value(HX_FRAMING) != kCropAutoScale || value(HX_ACTION_SAFE_MARGIN) > 0 ||
      value(HX_ADDITIONAL_SCALE) < 100) {
    return 0;
  }
  const double most = value(HX_MAXIMUM_SCALE) / 100 * value(HX_ADDITIONAL_SCALE) / 100;
  return 1 - std::min(1.0, most * crop.width / width) *
                 std::min(1.0, most * crop.height / clip.info().height);
}

}  // namespace

CropTrouble CropTroubleOf(SteadyClip& clip) {
  using Kind = CropTrouble::Kind;
  if (!Crops(clip.ValueOf(HX_FRAMING.disk_id))) return {};
  const std::unique_ptr<CropWindow> crop = clip.Crop();
  if (!crop || crop->width <= 0 || crop->height <= 0) return {.kind = Kind::nothing_seen};
  const media::ClipInfo& info = clip.info();
  const double width = static_cast<double>(info.width) *
                       static_cast<double>(info.pixel_aspect.num) /
                       static_cast<double>(info.pixel_aspect.den);
  constexpr double kBlack = 0.02;  // of the picture; less is a line at its edge
  if (const double black = BlackShare(clip, width, *crop); black > kBlack) {
    // The additional scale enlarges what the maximum scale has let through.
    const double needed = std::max(width / crop->width, double(info.height) / crop->height) * 100 /
                          clip.ValueOf(HX_ADDITIONAL_SCALE.disk_id);
    return {Kind::black, *crop, black, std::ceil(100 * needed)};
  }
  constexpr double kSmall = 0.4;  // of a side
  if (crop->width >= kSmall * width && crop->height >= kSmall * info.height) return {};
  return {.kind = Kind::small, .window = *crop};
}

std::string TroubleText(const CropTrouble& trouble) {
  using Kind = CropTrouble::Kind;
  const std::string window =
      std::to_string(trouble.window.width) + "x" + std::to_string(trouble.window.height);
  switch (trouble.kind) {
    case Kind::none:
      return "";
    case Kind::nothing_seen:
      return "no part of the picture stays in view; Framing \"Stabilize Only\" or less Smoothness "
             "may help";
    case Kind::black:
      return std::to_string(std::lround(100 * trouble.black)) +
             " % of the picture stays black: the crop window is " + window +
             "; more Maximum Scale would fill it, less Smoothness crops less";
    default:
      return "only " + window + " pixels stay in view; less Smoothness keeps more";
  }
}

bool Follows(SteadyClip& clip, const WindowSettings& settings) {
  using Kind = WindowSettings::Kind;
  const auto value = [&clip](const auto& control) { return clip.ValueOf(control.disk_id); };
  const double framing = value(HX_FRAMING);
  const bool may_follow = (framing == kCropAutoScale || framing == kSynthesizeEdges) &&
                          value(HX_ACTION_SAFE_MARGIN) == 0 && value(HX_ADDITIONAL_SCALE) > 0;
  // Whoever sets how calm the path is has it so, as far as the effect goes.
  const bool as_it_comes =
      value(HX_SMOOTHNESS) == HX_SMOOTHNESS.default_value &&
      value(HX_CROP_LESS_SMOOTH_MORE) == HX_CROP_LESS_SMOOTH_MORE.default_value &&
      value(HX_RESULT) == kSmoothMotion;
  // Such a window was chosen before, and the controls are those that were chosen with it.
  const bool chosen = clip.choice() != nullptr;
  const bool asked = settings.kind == Kind::follow || settings.most_zoom > 0 || settings.zoom_speed;
  if (asked && !may_follow) {
    throw WindowRefused(
        "a window that follows the picture needs a framing that crops and scales or fills the "
        "edges, and no margin");
  }
  // Still smoothed as it was set, the picture is shown by windows that follow it where the effect's
  // own would show black. Without motion it would have to move.
  const auto leaves_black = [&] {
    return value(HX_RESULT) == kSmoothMotion && clip.Measure().most_black > kMostBlack;
  };
  return may_follow && settings.kind != Kind::steady &&
         (asked || (!settings.as_set && (chosen || as_it_comes || leaves_black())));
}

CropTrouble ChooseFraming(SteadyClip& clip, const WindowSettings& settings, Watcher& watcher) {
  if (!Follows(clip, settings)) {
    if (clip.ForgetChoice()) clip.Work(watcher);
    clip.HoldStill(settings.still, watcher);
    return CropTroubleOf(clip);
  }
  clip.FollowPicture(
      {.most_zoom = settings.most_zoom > 0 ? settings.most_zoom
                                           : clip.ValueOf(HX_MAXIMUM_SCALE.disk_id) / 100,
       .zoom_speed = settings.zoom_speed.value_or(FollowRequest().zoom_speed),
       .may_choose = !settings.as_set,
       .still = settings.still},
      watcher);
  return {};
}

}  // namespace calmframe::host
