#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "stabilization/crop/cropper.h"
#include "stabilizer/render/clip_warps.h"
#include "stabilizer/render/render_geometry.h"
#include "stabilizer/render/render_settings.h"

// Where the picture lies in its output, and how large.
namespace marrow::render {

// The renderer of a clip at a render scale; see Renderer.
Renderer makeRenderer(const ClipWarps& warps, double scaleX, double scaleY);

// The scale at which the picture is shown: additional_scale, with a crop window times what fitZoom
// finds; that also sets the renderer's output rectangle.
double getZoom(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
               Renderer& renderer);

// Whether the crop window, as shown, is under two fifths of the frame in either direction.
bool isOvercropped(const ClipWarps& warps, const cropper& crop, const RenderSettings& settings,
                   Renderer& renderer);

// The warps' plane as a crop window that leaves nothing out.
crop_rect wholePlane(const Renderer& renderer);

struct OutputRect {
  std::int32_t width;
  std::int32_t height;
  std::int32_t origin_x;  // of the frame's top left in the output
  std::int32_t origin_y;
};

// The output's size for a frame of width x height output pixels. Without a crop the whole plane of
// the warps is shown, the frame in its middle.
OutputRect setupOutputRect(Framing framing, const Renderer& renderer, std::int32_t width,
                           std::int32_t height);

// The frame's outline in the output, pairs x, y of every border vertex: top row left to right,
// right column downwards, bottom row right to left, left column upwards, corners twice.
std::vector<float> outlinePolygon(const ClipWarps& warps, std::size_t frame,
                                  const Renderer& renderer, const RenderSettings& settings,
                                  double setupOriginX, double setupOriginY);

}  // namespace marrow::render
