#pragma once

#include <string>

#include "analysis/effect/analysis_effect.h"

// The banner over a frame: a band across all of it, a little above its middle, with a text in its
// middle. Slanted stripes are work in progress, a flat bar is something for the user to do.
namespace kelp::analysis::effect {

// Where things go, in pixels of the render, (0, 0) being the layer's top left.
struct BannerLayout {
  double text_scale = 1;  // of the image
  std::int32_t text_width = 0, text_height = 0;
  std::int32_t band_width = 0, band_height = 0, band_top = 0;
  std::int32_t text_x = 0, text_y = 0;
};

// image_width, image_height: of the unscaled text. layer_width, layer_height: at full resolution.
// downsample: the render's horizontal ratio, above 0.
BannerLayout LayOutBanner(std::int32_t image_width, std::int32_t image_height,
                          std::int32_t layer_width, std::int32_t layer_height, double downsample);

// Fills a clear 8-bit BGRA world. Equal colours make one bar, others stripes; the alpha of the
// first one is that of every pixel.
void PaintBand(HX_World& band, const tesselui::drawbot::Color& first,
               const tesselui::drawbot::Color& second);

// What the record's banner says, in the user's language; empty for a status without a text.
std::string BannerText(AnalysisEffect& effect, const StatusRecord& record);

// Draws the record's banner over the output, of any depth; nothing for a status without a text. On
// the render's thread. Whether the user wants it is the caller's to ask. Throws the host's code.
void DrawBanner(AnalysisEffect& effect, const StatusRecord& record, HX_World& output);

}  // namespace kelp::analysis::effect
