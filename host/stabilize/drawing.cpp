#include "host/stabilize/drawing.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstring>

#include "host/stabilize/control_items.h"
#include "host/stabilize/failures.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

// The lines of one parity (0: lines 0, 2, 4 ...).
void CopyField(const WorldBuffer& from, int parity, WorldBuffer& to) {
  const auto bytes =
      static_cast<std::size_t>(BytesPerPixel(from.world().format) * from.world().width);
  for (int y = parity; y < to.world().height; y += 2) {
    std::memcpy(to.row<std::uint8_t>(y), from.row<std::uint8_t>(y), bytes);
  }
}

bool SynthesizesEdges(const SteadyClip& clip) {
  return clip.ValueOf(HX_FRAMING.disk_id) == kSynthesizeEdges;
}

// Frames on either side that a render looks at.
double NeighboursOf(const SteadyClip& clip) {
  const media::Ratio rate = clip.info().frame_rate;
  return SynthesizesEdges(clip)
             ? std::round(clip.ValueOf(HX_SYNTHESIS_INPUT_RANGE.disk_id) *
                          static_cast<double>(rate.num) / static_cast<double>(rate.den))
             : 0.0;
}

// Renders in order come back to the frames about them: a cache that holds these spares decoding the
// clip anew from a key frame for each.
void MakeRoomForNeighbours(SteadyClip& clip, int depth, int threads) {
  constexpr double kMost = 2.0 * (1 << 30);
  const double neighbours = NeighboursOf(clip);
  if (neighbours == 0) return;
  const double frame = static_cast<double>(clip.info().width) * clip.info().height * depth / 2;
  const double frames = 2 * neighbours + threads + 4;
  clip.host().media().SetCacheBytes(static_cast<std::size_t>(std::min(frames * frame, kMost)));
}

}  // namespace

// Layers of soft edges, one on the other, add up the rounding of each: 8 bits leave a dark rim.
int DepthFor(const SteadyClip& clip) {
  return clip.info().bit_depth > 8 || SynthesizesEdges(clip) ? 16 : 8;
}

void PrepareDrawing(SteadyClip& clip, int depth, int threads, bool warning_banner) {
  MakeRoomForNeighbours(clip, depth, threads);
  Effect& drawn = clip.drawn();
  const CommandResult told =
      drawn.SetParam(drawn.IndexOf(HX_HIDE_WARNING_BANNER.disk_id), warning_banner ? 0 : 1);
  if (!told.ok()) throw SolveFailure(told.Line(clip.path()));
}

// The fields of an interlaced frame were shot one after the other, so each is rendered for its own
// instant and gives its lines.
SteadyFrame DrawFrame(Renderer& renderer, std::int64_t frame, int depth, media::FieldOrder order,
                      int downsample) {
  const auto render = [&](bool second_field) {
    RenderRequest request;
    request.frame = frame;
    request.second_field = second_field;
    request.bit_depth = depth;
    request.downsample = {1, static_cast<std::uint32_t>(downsample)};
    const RenderedFrame rendered = renderer.Planned(request);
    if (!rendered.result.ok()) {
      throw SolveFailure(rendered.result.Line("frame " + std::to_string(frame)));
    }
    return SteadyFrame{rendered.OnLayer(), rendered.banner};
  };
  SteadyFrame first = render(false);
  if (order == media::FieldOrder::progressive) return first;
  const SteadyFrame second = render(true);
  CopyField(*second.pixels, order == media::FieldOrder::top_first ? 1 : 0, *first.pixels);
  if (first.banner.empty()) first.banner = second.banner;
  return first;
}

}  // namespace calmframe::host
