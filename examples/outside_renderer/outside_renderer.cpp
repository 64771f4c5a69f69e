// A renderer outside of the plug-in, on a thread of its own, beside the plug-in's own renders.
//
//   outside_renderer CLIP OUTPUT_DIR [--start N] [--frames N] [--software]
//
// has the host library analyse and solve the clip, on a layer that leaves out as many frames as
// --start says (none); draws the layer's first N frames (30) once by the plug-in and once by
// drawing/, which knows the plug-in's exports and no more; tells how far they are apart and how
// fast each was; and leaves a frame of both beside each other, framing_N.ppm for each value of
// Framing. It draws with OpenGL where there is one, in plain C++ elsewhere and with --software.

#include <CLI/CLI.hpp>
#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <functional>
#include <future>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "examples/outside_renderer/comparison.h"
#include "host/effects/session.h"

namespace {

using namespace calmframe;
using outside::Framing;
using outside::Picture;

struct Options {
  std::string clip, output_dir;
  std::int32_t start = 0, frames = 30;
  bool software = false;
};

// Disk ids of the effect's controls.
enum : std::int32_t {
  kActionSafeMargin = 3,
  kMaximumScale = 4,
  kAdditionalScale = 16,
  kFraming = 22
};
constexpr int kReady = 8;  // the status of an effect whose frames can be drawn

struct Drawn {
  std::string by;
  std::vector<Picture> frames;
  double per_second = 0;
};

double FramesPerSecond(std::int32_t frames, const std::function<void(std::int32_t)>& draw) {
  draw(0);  // what is made once and used again
  const auto begin = std::chrono::steady_clock::now();
  for (std::int32_t frame = 0; frame < frames; ++frame) draw(frame);
  return frames / std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

std::unique_ptr<outside::FrameDrawer> MakeDrawer(bool software) {
  if (!software) {
    try {
      return outside::MakeGlDrawer();
    } catch (const std::runtime_error& error) {
      std::printf("no OpenGL: %s\n", error.what());
    }
  }
  return outside::MakePlainDrawer();
}

// On a thread of its own. It is given the block's address, the layer's frames, where they begin in
// the source and what the controls say; everything else comes from the exports.
Drawn DrawOutside(const outside::Exports& exports, const void* block,
                  const outside::Controls& controls, const std::vector<host::PicturePtr>& sources,
                  std::int32_t start_frame, bool software) {
  const auto drawer = MakeDrawer(software);
  Drawn drawn{drawer->name(), std::vector<Picture>(sources.size()), 0};
  const auto draw = [&](std::int32_t frame) {
    outside::SolvedFrame solved;
    if (!outside::ReadFrame(exports, block, frame, start_frame, solved)) {
      throw std::runtime_error("the plug-in lets nobody draw frame " + std::to_string(frame));
    }
    const host::Picture& source = *sources[static_cast<std::size_t>(frame)];
    drawer->Draw(outside::MeshOf(solved, controls),
                 {source.row<HX_Pixel8>(0), source.row_bytes(), source.width(), source.height()},
                 drawn.frames[static_cast<std::size_t>(frame)]);
  };
  drawn.per_second = FramesPerSecond(static_cast<std::int32_t>(sources.size()), draw);
  return drawn;
}

Drawn DrawByPlugin(host::Effect& effect, std::int32_t frames) {
  const auto renderer = effect.MakeRenderer();
  Drawn drawn{"the plug-in", {}, 0};
  const auto draw = [&](std::int32_t frame) {
    const host::RenderedFrame rendered = renderer->Direct({frame});
    if (!rendered.pixels) throw std::runtime_error(rendered.result.Line("the plug-in's render"));
    return rendered.pixels;
  };
  for (std::int32_t frame = 0; frame < frames; ++frame)
    drawn.frames.push_back(outside::CopyOf(draw(frame)->world()));
  drawn.per_second = FramesPerSecond(frames, [&](std::int32_t frame) { draw(frame); });
  return drawn;
}

float Fraction(const host::Effect& effect, std::int32_t disk_id) {
  return static_cast<float>(effect.Param(effect.IndexOf(disk_id))->u.fs.value / 100);
}

class Comparing {
 public:
  explicit Comparing(const Options& options)
      : options_(options), host_(CALMFRAME_PLUGIN, Settings()), session_(host_) {
    const auto clip = host::OpenClip(options.clip);
    const host::SourceInfo& info = clip->info();
    if (info.field_type != HX_FIELD_PROGRESSIVE || info.width < 2 || info.height < 2) {
      throw std::runtime_error(options.clip + ": only progressive clips are drawn here");
    }
    controls_.pixel_aspect_num = info.pixel_aspect.num;
    controls_.pixel_aspect_den = static_cast<std::int32_t>(info.pixel_aspect.den);
    if (options.start >= info.frame_count) {
      throw std::runtime_error(options.clip + ": has no frame " + std::to_string(options.start));
    }
    layer_ = boost::make_shared<host::Layer>(clip);
    layer_->Change([&](host::LayerState& state) {
      state.start_frame = options.start;
      state.length -= options.start;
    });
    const std::int32_t frames = std::min(options.frames, layer_->state()->length);
    for (std::int32_t frame = 0; frame < frames; ++frame) {
      sources_.push_back(clip->Fetch(options.start + frame, host::PixelKind::argb8));
    }
    effect_ = &session_.Apply(layer_);
    if (!effect_->creation().ok()) throw std::runtime_error(effect_->creation().Line(options.clip));
  }

  void Run() {
    const outside::Exports exports(host_.library().path());
    Settle();
    for (const auto framing : {Framing::stabilize_only, Framing::crop, Framing::crop_auto_scale}) {
      effect_->SetParam(effect_->IndexOf(kFraming), static_cast<double>(framing));
      Settle();
      controls_.framing = framing;
      controls_.action_safe_margin = Fraction(*effect_, kActionSafeMargin);
      controls_.maximum_scale = Fraction(*effect_, kMaximumScale);
      controls_.additional_scale = Fraction(*effect_, kAdditionalScale);
      const Drawn theirs = DrawByPlugin(*effect_, static_cast<std::int32_t>(sources_.size()));

      // The block stays while the effect does, which goes on ticking.
      auto drawing = std::async(std::launch::async, DrawOutside, std::cref(exports),
                                effect_->opaque_data(), controls_, std::cref(sources_),
                                layer_->state()->start_frame, options_.software);
      while (drawing.wait_for(std::chrono::milliseconds(50)) != std::future_status::ready) {
        session_.Tick();
      }
      Tell(framing, theirs, drawing.get());
    }
  }

 private:
  static host::HostSettings Settings() {
    host::HostSettings settings;
    settings.media.cache_bytes = std::size_t{1} << 30;  // all frames, so that only drawing is timed
    return settings;
  }

  void Settle() {
    session_.TickUntilSettled(std::chrono::hours(1));
    if (host::Session::StatusOf(*effect_) != kReady) {
      const auto messages = effect_->TakeMessages();
      throw std::runtime_error(options_.clip + ": " +
                               (messages.empty() ? "no solve" : messages.back()));
    }
  }

  void Tell(Framing framing, const Drawn& theirs, const Drawn& ours) const {
    outside::Comparison worst{0, 1};
    for (std::size_t frame = 0; frame < theirs.frames.size(); ++frame) {
      const auto comparison = outside::Compare(theirs.frames[frame], ours.frames[frame]);
      worst.largest = std::max(worst.largest, comparison.largest);
      worst.share = std::min(worst.share, comparison.share);
    }
    const std::size_t middle = theirs.frames.size() / 2;
    const std::string path =
        options_.output_dir + "/framing_" + std::to_string(static_cast<int>(framing)) + ".ppm";
    outside::WriteBeside(path, theirs.frames[middle], ours.frames[middle]);
    std::printf(
        "framing %d: largest difference %d of 255 over at least %.0f%% of a frame; %.1f "
        "frames a second by %s, %.1f by %s\n",
        static_cast<int>(framing), worst.largest, worst.share * 100, theirs.per_second,
        theirs.by.c_str(), ours.per_second, ours.by.c_str());
  }

  const Options options_;
  host::Host host_;
  host::Session session_;
  boost::shared_ptr<host::Layer> layer_;
  host::Effect* effect_ = nullptr;
  std::vector<host::PicturePtr> sources_;
  outside::Controls controls_;
};

}  // namespace

int main(int argc, char** argv) {
  CLI::App program("Draws a clip's steadied frames outside of the plug-in, and compares them");
  Options options;
  program.add_option("CLIP", options.clip)->required();
  program.add_option("OUTPUT_DIR", options.output_dir)->required();
  program.add_option("--start", options.start)->check(CLI::Range(0, 1000000));
  program.add_option("--frames", options.frames)->check(CLI::Range(1, 1000));
  program.add_flag("--software", options.software);
  CLI11_PARSE(program, argc, argv);
  try {
    Comparing(options).Run();
    return 0;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "outside_renderer: %s\n", error.what());
    return 1;
  }
}
