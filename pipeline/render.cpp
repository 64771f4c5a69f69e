#include <algorithm>
#include <boost/make_shared.hpp>
#include <cstring>
#include <map>

#include "pipeline/host_operations.h"
#include "pipeline/pictures.h"
#include "pipeline/stabilize.h"
#include "stabilizer/effect/src/render_rules.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "stabilizer/render/frame_renderer.h"

namespace calmframe::pipeline {
namespace {

constexpr char kRendering[] = "rendering";

// Copies the part of `from` that lies in `to`, whose top left is at (origin_x, origin_y) of `from`;
// the rest is cleared.
template <class Pixel>
void CopyWindow(const WorldX<Pixel>& from, int origin_x, int origin_y, WorldX<Pixel>& to) {
  to.clear();
  const int x0 = std::max(0, -origin_x);
  const int x1 = std::min(to.width(), from.width() - origin_x);
  if (x0 >= x1) return;
  for (int y = std::max(0, -origin_y); y < std::min(to.height(), from.height() - origin_y); ++y) {
    std::memcpy(to.row(y) + x0, from.row(y + origin_y) + origin_x + x0,
                sizeof(Pixel) * static_cast<std::size_t>(x1 - x0));
  }
}

// Holds the pictures within `margin` of one that is rendered, so that renders in order read the
// clip in order.
template <class Pixel>
class ClipSource final : public SourceFrames<Pixel> {
 public:
  ClipSource(media::ClipReader& reader, std::int64_t margin)
      : reader_(reader), margin_(static_cast<std::size_t>(margin)) {}
  boost::shared_ptr<const WorldX<Pixel>> Fetch(std::size_t picture) override {
    if (margin_ == 0) return reader_.Read(picture);
    boost::shared_ptr<const WorldX<Pixel>> world = held_[picture];
    if (!world) {
      const WorldX<Pixel>& read = *reader_.Read(picture);
      const auto copy = boost::make_shared<WorldX<Pixel>>(read.width(), read.height());
      CopyWindow(read, 0, 0, *copy);
      world = held_[picture] = copy;
    }
    const std::size_t behind = std::min(picture, 2 * margin_);
    held_.erase(held_.begin(), held_.lower_bound(picture - behind));
    return world;
  }
  const Pictures& pictures() const { return reader_.pictures(); }

 private:
  PictureReader<Pixel> reader_;
  const std::size_t margin_;
  std::map<std::size_t, boost::shared_ptr<const WorldX<Pixel>>> held_;
};

// Renders pictures at the clip's size.
template <class Pixel>
class PictureRenderer {
 public:
  PictureRenderer(media::ClipReader& reader, const Solution& solution,
                  const kelp::effect::Controls& controls)
      : sources_(reader, kelp::effect::MakeMargin(controls, GeometryOf(reader.info()))),
        warps_(solution.warper),
        crop_(solution.crop),
        settings_(kelp::effect::MakeRenderSettings(controls, GeometryOf(reader.info()))),
        renderer_(MakeRenderer(warps_, 1.0f / GeometryOf(reader.info()).pixel_aspect(), 1.0f)),
        rect_(setupOutputRect(settings_.framing, renderer_, reader.info().width,
                              reader.info().height)),
        whole_(rect_.width, rect_.height) {
    if (crop_ && (crop_->cropWidth <= 0 || crop_->cropHeight <= 0)) {
      throw SolveFailure(
          "no part of the picture stays in view; set --framing stabilize-only or adjust other "
          "flags");
    }
  }

  bool Overcropped() { return crop_ && isOvercropped(warps_, *crop_, settings_, renderer_); }

  const Pictures& pictures() const { return sources_.pictures(); }

  void Render(std::size_t picture, WorldX<Pixel>& output) {
    const bool same = rect_.width == output.width() && rect_.height == output.height();
    WorldX<Pixel>& target = same ? output : whole_;
    if (!renderFrame(warps_, crop_.get(), settings_, renderer_, picture, sources_, operations_,
                     target)) {
      throw SolveFailure("a frame has no warp");
    }
    if (!same) CopyWindow(whole_, rect_.origin_x, rect_.origin_y, output);
  }

 private:
  ClipSource<Pixel> sources_;
  HostOperations<Pixel> operations_;
  const CPWarperWarps warps_;
  const boost::shared_ptr<const cropper> crop_;
  const RenderSettings settings_;
  Renderer renderer_;
  const OutputRect rect_;
  WorldX<Pixel> whole_;
};

template <class Pixel>
void RenderAs(media::ClipReader& reader, const Solution& solution,
              const kelp::effect::Controls& controls, media::ClipWriter& writer,
              Listener& listener) {
  const media::ClipInfo& info = reader.info();
  PictureRenderer<Pixel> renderer(reader, solution, controls);
  if (renderer.Overcropped()) {
    listener.Warn(
        "To avoid extreme cropping set Framing to Stabilize Only or adjust other parameters.");
  }
  const Pictures& pictures = renderer.pictures();
  WorldX<Pixel> output(info.width, info.height);
  WorldX<Pixel> field(pictures.interlaced() ? info.width : 0, info.height);
  const auto total = static_cast<double>(info.frame_count);
  for (std::size_t frame = 0; frame < info.frame_count; ++frame) {
    if (listener.Cancelled()) throw Interrupted();
    listener.Progress(kRendering, static_cast<double>(frame), total, "frames");
    if (pictures.interlaced()) {
      for (std::size_t picture = 2 * frame; picture < 2 * frame + 2; ++picture) {
        renderer.Render(picture, field);
        CopyField(field, pictures.parity_of(picture), output);
      }
    } else {
      renderer.Render(frame, output);
    }
    writer.Write(frame, output.data(), output.row_bytes());
  }
  listener.Progress(kRendering, total, total, "frames");
}

}  // namespace

void Render(media::ClipReader& reader, const Solution& solution,
            const kelp::effect::Controls& controls, int depth, media::ClipWriter& writer,
            Listener& listener) {
  if (depth == 0) depth = reader.info().bit_depth > 8 ? 16 : 8;
  switch (depth) {
    case 8:
      return RenderAs<HX_Pixel8>(reader, solution, controls, writer, listener);
    case 16:
      return RenderAs<HX_Pixel16>(reader, solution, controls, writer, listener);
    default:
      return RenderAs<HX_PixelFloat>(reader, solution, controls, writer, listener);
  }
}

}  // namespace calmframe::pipeline
