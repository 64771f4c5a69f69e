#include "analysis/effect/track_colors.h"

#include <algorithm>
#include <cmath>
#include <random>

namespace kelp::analysis::effect {

using tesselui::drawbot::Color;

namespace {

constexpr double kSaturation = 0.6;
constexpr float kFillAlpha = 0.65f;
constexpr float kHotAlpha = 0.75f;  // of what the mouse is over, and of what is selected
constexpr float kDimmed = 0.6f;     // fill to line

std::int32_t Fixed(double value) {
  return static_cast<std::int32_t>(std::lround(value * 65536));
}

Color Dimmed(const Color& color) {
  const auto dimmed = [](float c) { return std::min(c * kDimmed, 1.0f); };
  return {dimmed(color.red), dimmed(color.green), dimmed(color.blue), kFillAlpha};
}

Color HalfWayToWhite(const Color& color) {
  const auto lighter = [](float c) { return c + (1 - c) / 2; };
  return {lighter(color.red), lighter(color.green), lighter(color.blue), kFillAlpha};
}

}  // namespace

int TrackHueNumber(std::int32_t id) {
  std::minstd_rand generator(static_cast<std::uint32_t>(id) * 9301u);
  return static_cast<int>(generator() % kTrackHues);
}

double TrackHue(int number) {
  constexpr double kRange = 300, kYellowsFrom = 30, kYellows = 60;
  const double hue = std::fmod(static_cast<double>(number) / kTrackHues * 997, kRange);
  return hue > kYellowsFrom ? hue + kYellows : hue;
}

const Color& TrackPalette::LineColor(std::size_t which) {
  std::optional<Color>& color = lines_[which];
  if (!color) {
    const double hue = which == kTrackHues ? kSelectedHue : TrackHue(static_cast<int>(which));
    const std::int32_t hls[3] = {Fixed(hue / 360), Fixed(1), Fixed(kSaturation)};
    HX_Pixel8 rgb{};
    kelp::effect::ThrowIfFailed(context_.in->cb->hls_to_rgb(context_.in->effect_ref, hls, &rgb));
    color = Color{static_cast<float>(rgb.red) / 255, static_cast<float>(rgb.green) / 255,
                  static_cast<float>(rgb.blue) / 255, 1};
  }
  return *color;
}

TrackColors TrackPalette::ColorsOf(std::int32_t id, bool selected, bool hovered) {
  const std::size_t which =
      selected ? std::size_t{kTrackHues} : static_cast<std::size_t>(TrackHueNumber(id));
  TrackColors colors;
  colors.line = LineColor(which);
  colors.fill = selected ? HalfWayToWhite(colors.line) : Dimmed(colors.line);
  if (hovered) {
    colors.line = colors.fill;
    colors.fill = {1, 1, 1, kHotAlpha};
  }
  if (selected) colors.line.alpha = colors.fill.alpha = kHotAlpha;
  return colors;
}

}  // namespace kelp::analysis::effect
