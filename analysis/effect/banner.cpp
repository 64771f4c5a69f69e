#include "analysis/effect/banner.h"

#include <algorithm>
#include <cmath>

#include "analysis/effect/banner_cache.h"
#include "effect/world.h"
#include "platform/tessel/config.h"

namespace kelp::analysis::effect {
namespace {

using kelp::effect::kOver;
using kelp::effect::ScopedWorld;
using kelp::effect::ThrowIfFailed;
using tesselui::drawbot::Color;

constexpr std::int32_t kTextRoom = 80;      // pixels beside the text, both sides together
constexpr std::int32_t kWidestText = 1200;  // a longer one may be wider than the frame
constexpr double kRise = -24.0;             // of the band from the middle, at full resolution
constexpr double kSlant = 1.414;            // of a stripe: its run to its rise

std::int32_t Ceil(double value) {
  return static_cast<std::int32_t>(std::ceil(value));
}

bool Equal(const Color& a, const Color& b) {
  return a.red == b.red && a.green == b.green && a.blue == b.blue && a.alpha == b.alpha;
}

Color Opaque(Color color) {
  color.alpha = 1;
  return color;
}

// Stripes from the bottom left to the top right, into the two paths by turns. Each begins a pixel
// before the last one ends, so that no gap shows between their smoothed edges.
void AddStripes(double width, double height, tesselui::drawbot::Path (&paths)[2]) {
  const double half = std::round(height / 2);
  const double stripe = half * kSlant;
  const double slant = height * kSlant;
  int turn = 0;
  for (double x = -(slant * half); x < width; x += stripe - 1) {
    tesselui::drawbot::Path& path = paths[turn];
    path.MoveTo(x, height);
    path.LineTo(x + stripe, height);
    path.LineTo(x + slant + stripe, 0);
    path.LineTo(x + slant, 0);
    path.Close();
    turn = 1 - turn;
  }
}

void WriteAlpha(HX_World& world, std::uint8_t alpha) {
  for (std::int32_t y = 0; y < world.height; ++y) {
    std::uint8_t* pixel =
        static_cast<std::uint8_t*>(world.data) + std::ptrdiff_t{world.row_bytes} * y;
    for (std::int32_t x = 0; x < world.width; ++x) pixel[4 * x + 3] = alpha;
  }
}

boost::shared_ptr<const BannerImage> GetImage(AnalysisEffect& effect, const StatusRecord& record) {
  const std::string text = BannerText(effect, record);
  if (text.empty()) return {};
  StatusRecord key = record;
  if (key.status != FrameStatus::GeneralFailure) key.text.clear();
  const boost::shared_ptr<std::mutex> mutex = effect.GetBannerCacheLock();
  const std::lock_guard<std::mutex> lock(*mutex);
  return effect.GetBannerCache()->Get(key, text);
}

}  // namespace

std::string BannerText(AnalysisEffect& effect, const StatusRecord& record) {
  const char* const literal = effect.GetStatusMessage(record.status);
  if (literal == nullptr) return {};
  const bool own = record.status == FrameStatus::GeneralFailure && !record.text.empty();
  return tessel::config::Localizer::Localize(own ? record.text : literal);
}

BannerLayout LayOutBanner(std::int32_t image_width, std::int32_t image_height,
                          std::int32_t layer_width, std::int32_t layer_height, double downsample) {
  BannerLayout layout;
  const std::int32_t room = std::min(image_width + kTextRoom, kWidestText);
  layout.text_scale = room > layer_width ? static_cast<double>(layer_width) / room : downsample;
  layout.text_width = image_width;
  layout.text_height = image_height;
  if (layout.text_scale < 1) {
    layout.text_width = Ceil(image_width * layout.text_scale);
    layout.text_height = Ceil(image_height * layout.text_scale);
  }
  layout.band_width = Ceil(layer_width * downsample);
  layout.band_height = 2 * layout.text_height;
  const std::int32_t middle = (Ceil(layer_height * downsample) - layout.band_height) / 2;
  layout.band_top = static_cast<std::int32_t>(middle + layout.text_scale * kRise);
  layout.text_x = (layout.band_width - layout.text_width) / 2;
  layout.text_y = layout.band_top + layout.text_height / 2;
  return layout;
}

void PaintBand(HX_World& band, const Color& first, const Color& second) {
  tesselui::drawbot::Surface surface(band.data, band.row_bytes, band.width, band.height);
  tesselui::drawbot::Path paths[2];
  if (Equal(first, second)) {
    paths[0].AddRect(0, 0, band.width, band.height);
  } else {
    AddStripes(band.width, band.height, paths);
  }
  // Opaque while it is drawn: the stripes overlap.
  surface.FillPath(paths[0], {Opaque(first)});
  surface.FillPath(paths[1], {Opaque(second)});
  surface.Flush();
  const auto alpha = static_cast<std::uint8_t>(first.alpha * 255);
  if (alpha != 255) WriteAlpha(band, alpha);
}

void DrawBanner(AnalysisEffect& effect, const StatusRecord& record, HX_World& output) {
  const boost::shared_ptr<const BannerImage> image = GetImage(effect, record);
  if (!image) return;
  const kelp::effect::HostContext& context = effect.context();
  const HX_InData& in = *context.in;
  const double downsample = static_cast<double>(in.downsample_x.num) / in.downsample_x.den;
  const BannerLayout layout =
      LayOutBanner(image->width(), image->height(), in.width, in.height, downsample);
  const auto compose = [&](const HX_World& world, std::int32_t x, std::int32_t y) {
    ThrowIfFailed(in.cb->transfer(in.effect_ref, &world, &kOver, nullptr, x - output.origin_x,
                                  y - output.origin_y, &output));
  };

  ScopedWorld band(context, layout.band_width, layout.band_height, true, HX_FORMAT_BGRA8);
  Color first, second;
  effect.GetBannerColors(record.status, &first, &second);
  PaintBand(*band.get(), first, second);
  compose(*band.get(), 0, layout.band_top);

  const HX_World text = image->world();
  if (layout.text_scale < 1) {
    ScopedWorld small(context, layout.text_width, layout.text_height, true, HX_FORMAT_BGRA8);
    ThrowIfFailed(in.cb->copy_world(in.effect_ref, &text, small.get(), nullptr, nullptr));
    compose(*small.get(), layout.text_x, layout.text_y);
  } else {
    compose(text, layout.text_x, layout.text_y);
  }
}

}  // namespace kelp::analysis::effect
