#include "host/stabilize/framing.h"

#include <algorithm>
#include <cmath>
#include <memory>

#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

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

CropTrouble ChooseFraming(SteadyClip& clip, const WindowSettings& settings, Watcher& watcher) {
  using Kind = WindowSettings::Kind;
  const auto value = [&clip](const auto& control) { return clip.ValueOf(control.disk_id); };
  const bool fills = value(HX_FRAMING) == kSynthesizeEdges;
  const bool may_follow = (value(HX_FRAMING) == kCropAutoScale || fills) &&
                          value(HX_ACTION_SAFE_MARGIN) == 0 && value(HX_ADDITIONAL_SCALE) > 0;
  // Whoever sets how calm the path is has it so, as far as the effect goes; filled edges are asked
  // for to show the frame as it is, whole.
  const auto given = [&](const auto& control) {
    const Choice* choice = clip.choice();
    return choice && choice->given.count(control.disk_id) > 0 ? choice->given.at(control.disk_id)
                                                              : value(control);
  };
  const bool as_it_comes =
      given(HX_SMOOTHNESS) == HX_SMOOTHNESS.default_value &&
      given(HX_CROP_LESS_SMOOTH_MORE) == HX_CROP_LESS_SMOOTH_MORE.default_value &&
      given(HX_RESULT) == kSmoothMotion;
  const bool asked = settings.kind == Kind::follow || settings.most_zoom > 0;
  if (asked && !may_follow) {
    throw WindowRefused(
        "a window that follows the picture needs a framing that crops and scales or fills the "
        "edges, and no margin");
  }
  if (settings.kind == Kind::steady || !may_follow ||
      !(asked || (as_it_comes && !fills && !settings.as_set))) {
    if (clip.choice()) {  // it was made for windows that follow
      clip.ForgetChoice();
      clip.Work(watcher);
    }
    clip.HoldStill(settings.still, watcher);
    return CropTroubleOf(clip);
  }
  clip.FollowPicture(
      {.most_zoom = settings.most_zoom > 0 ? settings.most_zoom : value(HX_MAXIMUM_SCALE) / 100,
       .may_choose = !settings.as_set,
       .still = settings.still},
      watcher);
  return {};
}

}  // namespace calmframe::host
