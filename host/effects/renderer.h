#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "host/effects/instance.h"
#include "host/pixels/world_buffer.h"

namespace calmframe::host {

struct RenderRequest {
  std::int64_t frame = 0;  // of the layer, counted from its in-point
  int bit_depth = 8;       // 8 or 16; 32 on the planned path alone
  HX_Ratio downsample{1, 1};
  // Part of the frame that is wanted, in layer coordinates at render scale; none: the whole.
  std::optional<HX_Rect> part = {};
  bool second_field = false;  // of an interlaced layer's frame: half a frame later
};

struct RenderedFrame {
  CommandResult result;
  // Origin: its top left in layer coordinates at render scale. Null when a command failed and where
  // there is nothing to draw.
  std::shared_ptr<WorldBuffer> pixels;
  HX_Rect full_rect{};                    // all that the effect has to show for the frame
  int layer_width = 0, layer_height = 0;  // at render scale
  // What the effect's banner over the frame says, drawn or hidden; empty: it has none.
  std::string banner;
  std::uint64_t generation = 0;  // of the effect when the render began; see TimelineEffect

  // What the layer's own rectangle shows of it, clear where there is nothing.
  std::shared_ptr<WorldBuffer> OnLayer() const;
};

// A render-side instance of an effect. For one thread at a time; any number of renderers of one
// effect work at once.
class Renderer {
 public:
  // See Effect::MakeRenderer. result() tells whether the plug-in made the instance; where it could
  // not, each frame tries again, and still comes, as the plug-in can, or fails for that reason. A
  // frame that there is no memory for has HX_ERR_MEMORY.
  Renderer(Host& host, std::shared_ptr<TimelineEffect> effect);
  ~Renderer();
  Renderer(const Renderer&) = delete;
  Renderer& operator=(const Renderer&) = delete;

  const CommandResult& result() const { return result_; }

  // Prepare and render: the effect tells the size of its output and gets its input. It draws the
  // whole of it, since it has no way to tell whether it can draw a part alone.
  RenderedFrame Direct(const RenderRequest& request);
  // Plan and render: the effect orders the frames it needs.
  RenderedFrame Planned(const RenderRequest& request);

 private:
  void MakeInstance();
  void DrawDirect(const RenderRequest& request, RenderedFrame& rendered);
  void DrawPlanned(const RenderRequest& request, RenderedFrame& rendered);
  template <class Draw>
  RenderedFrame Render(const RenderRequest& request, bool planned, const Draw& draw);

  Host& host_;
  const std::shared_ptr<Instance> instance_;
  CommandResult result_;
};

}  // namespace calmframe::host
