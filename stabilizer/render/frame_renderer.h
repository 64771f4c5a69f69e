#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

#include "stabilization/crop/cropper.h"
#include "stabilization/warp/var_vector.h"
#include "stabilizer/render/deblur.h"
#include "stabilizer/render/edge_preparation.h"
#include "stabilizer/render/frame_mesh.h"
#include "stabilizer/render/renderer.h"
#include "stabilizer/render/source_frames.h"
#include "stabilizer/render/world.h"

// The popup's values.
enum class Framing : std::int32_t {
  stabilize_only = 1,
  crop = 2,
  crop_auto_scale = 3,
  synthesize_edges = 4
};

inline bool crops(Framing framing) {
  return framing == Framing::crop || framing == Framing::crop_auto_scale;
}

// A solved clip as the renderer needs it. Read-only; any thread may call.
class ClipWarps {
 public:
  virtual ~ClipWarps() = default;
  virtual std::size_t frameCount() const = 0;
  virtual const marrow::stabilization::VarVector& frameWarp(std::size_t frame) const = 0;
  // The rest grid of source frame M as it lies in the output of frame N, into `warp`; false where
  // no motion between the two is known.
  virtual bool warpedGridOfFrame(std::size_t M, std::size_t N,
                                 marrow::stabilization::VarVector& warp) const = 0;
  virtual marrow::stabilization::frame_bounds unionBounds() const = 0;
  virtual std::int32_t frameWidth() const = 0;  // square pixels
  virtual std::int32_t frameHeight() const = 0;
  virtual std::int32_t gridCols() const = 0;
  virtual std::int32_t gridRows() const = 0;
};

// What a render has its host do on frame buffers. Failures are thrown and leave the render.
template <class Pixel>
class WorldOperations {
 public:
  virtual ~WorldOperations() = default;
  // Composes `from`, its top left at pixel (x, y) of `to`, behind what `to` holds: what is opaque
  // there stays, what is transparent is filled. Where `from` is transparent nothing
  // changes but colours without alpha, which become 0.
  virtual void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) = 0;
  // All four channels, edges repeated; radius in pixels; both worlds are of one size.
  virtual void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) = 0;
};

struct RenderSettings {
  Framing framing = Framing::crop_auto_scale;
  float action_safe = 0.0f;       // fraction of the frame
  float maximum_scale = 1.5f;     // fraction; for crop_auto_scale alone
  float additional_scale = 1.0f;  // fraction, above 0
  // What the given output differs by from the one that setupOutputRect asked for, in pixels: the
  // output's origin plus the setup's.
  double shift_x = 0.0;
  double shift_y = 0.0;
  // For synthesize_edges alone.
  std::int64_t synthesis_range = 0;  // frames on each side
  EdgeSettings edges{};
  double alpha_boost = 1.0;  // see synthesizeEdges
  DeblurSettings deblur = {};
};

// The renderer of a clip at a render scale; see Renderer.
Renderer MakeRenderer(const ClipWarps& warps, float scaleX, float scaleY);

// The scale at which the picture is shown: additional_scale, with a crop window times what fitZoom
// finds; that also sets the renderer's output rectangle.
double GetZoom(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
               Renderer& renderer);

// Whether the crop window, as shown, is under two fifths of the frame in either direction.
bool isOvercropped(const ClipWarps& warps, const cropper& crop, const RenderSettings& settings,
                   Renderer& renderer);

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

// The render of one frame, as its passes share it. All referents outlive it.
template <class Pixel>
struct FramePass {
  const ClipWarps& warps;
  const RenderSettings& settings;
  const Renderer& renderer;
  SourceFrames<Pixel>& sources;
  WorldOperations<Pixel>& operations;
  std::size_t frame;   // the one that the output is of
  crop_rect cropRect;  // of that frame, scaled
  double zoom;
};

// Source frame M's mesh in an output of width x height pixels: by its own record where it is the
// pass's frame, else as it lies in that frame's output. Nothing where no motion is known.
template <class Pixel>
std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>& pass, std::size_t M, int width,
                                     int height);

// Draws a frame through its mesh over what `output` holds or, with `clears`, over transparent
// black; with `only`, at least what lies in those tiles. The strips run on all processors; their
// number never shows in the result.
template <class Pixel>
void drawMesh(const FrameMesh& mesh, const WorldX<Pixel>& source, WorldX<Pixel>& output,
              const TileMap* only = nullptr, bool clears = false);

// Draws source frame M over what `output` holds or, with `clears`, over transparent black. False,
// with nothing fetched, where no motion is known.
template <class Pixel>
bool drawFrame(const FramePass<Pixel>& pass, std::size_t M, WorldX<Pixel>& output,
               bool clears = false);

// Clears the output and draws the stabilized frame, deblurred where settings say so. `crop` may be
// null. False, with nothing done,
// where the clip has no record of the frame.
template <class Pixel>
bool renderFrame(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
                 Renderer& renderer, std::size_t frame, SourceFrames<Pixel>& sources,
                 WorldOperations<Pixel>& operations, WorldX<Pixel>& output);
