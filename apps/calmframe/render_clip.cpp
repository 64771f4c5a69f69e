#include "apps/calmframe/render_clip.h"

#include <algorithm>
#include <condition_variable>
#include <cstdint>
#include <exception>
#include <map>
#include <memory>
#include <mutex>
#include <nlohmann/json.hpp>
#include <thread>
#include <utility>
#include <vector>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/thumbnails.h"
#include "host/effects/renderer.h"
#include "host/stabilize/drawing.h"
#include "host/stabilize/failures.h"
#include "host/timeline/layer.h"

namespace calmframe {
namespace {

// Frames of the range, rendered ahead on threads of its own, each of which has a render side of
// the effect.
class RenderAhead {
 public:
  RenderAhead(SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings)
      : clip_(clip),
        settings_(settings),
        end_(static_cast<std::int64_t>(range.end)),
        window_(settings.threads + 2),
        next_(static_cast<std::int64_t>(range.first)),
        taken_(next_) {
    try {
      threads_.reserve(static_cast<std::size_t>(settings.threads));
      for (int i = 0; i < settings.threads; ++i) threads_.emplace_back([this] { RenderFrames(); });
    } catch (...) {
      Stop();
      throw;
    }
  }
  ~RenderAhead() { Stop(); }
  RenderAhead(const RenderAhead&) = delete;
  RenderAhead& operator=(const RenderAhead&) = delete;

  // In ascending order. Throws what its render threw.
  DrawnFrame Take(std::int64_t frame) {
    std::unique_lock lock(mutex_);
    taken_ = frame;
    changed_.notify_all();
    changed_.wait(lock, [&] { return failure_ || done_.count(frame) > 0; });
    if (failure_) std::rethrow_exception(failure_);
    DrawnFrame drawn = std::move(done_.at(frame));
    done_.erase(frame);
    return drawn;
  }

 private:
  void Stop() {
    {
      const std::lock_guard lock(mutex_);
      stopped_ = true;
    }
    changed_.notify_all();
    for (std::thread& thread : threads_) thread.join();
  }

  void RenderFrames() {
    try {
      const std::unique_ptr<host::Renderer> renderer = clip_.drawn().MakeRenderer();
      std::unique_lock lock(mutex_);
      while (true) {
        changed_.wait(lock, [&] { return stopped_ || failure_ || next_ < taken_ + window_; });
        if (stopped_ || failure_ || next_ >= end_) return;
        const std::int64_t frame = next_++;
        lock.unlock();
        // First, since the render asks for the same one.
        const host::PicturePtr shot = HasShot(frame) ? Shot(frame) : nullptr;
        // The lines of a smaller frame are of both fields.
        const media::FieldOrder order =
            settings_.downsample > 1 ? media::FieldOrder::progressive : clip_.info().field_order;
        host::SteadyFrame steady =
            host::DrawFrame(*renderer, frame, settings_.depth, order, settings_.downsample);
        DrawnFrame drawn{std::move(steady.pixels), shot, std::move(steady.banner)};
        lock.lock();
        done_[frame] = std::move(drawn);
        changed_.notify_all();
      }
    } catch (...) {
      const std::lock_guard lock(mutex_);
      if (!failure_) failure_ = std::current_exception();
      changed_.notify_all();
    }
  }

  bool HasShot(std::int64_t frame) const {
    return settings_.shots || settings_.shot_of == static_cast<std::size_t>(frame);
  }

  host::PicturePtr Shot(std::int64_t frame) const {
    const boost::shared_ptr<const host::LayerState> layer =
        clip_.effect().shared()->layer()->state();
    host::PicturePtr shot = layer->source->Fetch(std::int64_t{layer->start_frame} + frame,
                                                 host::KindOfDepth(settings_.depth));
    if (!shot) throw SolveFailure("frame " + std::to_string(frame) + ": the clip has none such");
    return shot;
  }

  SteadyClip& clip_;
  const RenderSettings settings_;
  const std::int64_t end_;
  const std::int64_t window_;  // frames that may be ahead of the one wanted
  std::mutex mutex_;           // guards all below but the threads
  std::condition_variable changed_;
  std::int64_t next_, taken_;
  std::map<std::int64_t, DrawnFrame> done_;
  std::exception_ptr failure_;
  bool stopped_ = false;
  std::vector<std::thread> threads_;
};

// Of so many frames, the numbers of those with a banner by what it says.
std::vector<std::string> BannerLines(const std::map<std::string, std::size_t>& banners,
                                     std::size_t frames) {
  std::vector<std::string> lines;
  for (const auto& [text, count] : banners) {
    lines.push_back(std::to_string(count) + " of " + std::to_string(frames) +
                    (frames == 1 ? " frame" : " frames") +
                    " could not be steadied as asked: " + text);
  }
  return lines;
}

}  // namespace

std::vector<std::string> RenderFrames(
    SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
    const std::string& stage, ProgressLine& progress,
    const std::function<void(std::size_t, const DrawnFrame&)>& take,
    const std::function<void()>& finish) {
  RenderSettings own = settings;
  if (own.depth == 0) own.depth = host::DepthFor(clip);
  if (own.threads == 0) {
    own.threads = static_cast<int>(std::max(1u, std::thread::hardware_concurrency()));
  }
  constexpr int kMostInWork = 8;  // each holds some frames; the strips of one use all processors
  own.threads = std::min(own.threads, kMostInWork);
  host::PrepareDrawing(clip, own.depth, own.threads, own.warning_banner);
  std::map<std::string, std::size_t> banners;
  RenderAhead frames(clip, range, own);
  Progress shown{stage, 0, static_cast<double>(range.end - range.first), "frames", "", false};
  for (std::size_t frame = range.first; frame < range.end; ++frame) {
    if (InterruptAsked()) throw Interrupted();
    shown.done = static_cast<double>(frame - range.first);
    progress.Show(shown);
    const DrawnFrame made = [&] {
      try {
        return frames.Take(static_cast<std::int64_t>(frame));
      } catch (const host::SolveFailure&) {
        clip.CheckMedia();  // of a frame that could not be read it isn't the plug-in's
        throw;
      }
    }();
    if (!made.banner.empty()) ++banners[made.banner];
    take(frame, made);
  }
  clip.CheckMedia();
  if (finish) {
    shown.says = "encoding the last frames";
    shown.lasts = true;
    progress.Show(shown);
    finish();
    shown.says.clear();
  }
  shown.done = shown.total;
  shown.ends = true;
  progress.Show(shown);
  return BannerLines(banners, range.end - range.first);
}

void Write(media::ClipWriter& writer, std::size_t frame, const host::WorldBuffer& pixels) {
  const std::ptrdiff_t row_bytes = pixels.world().row_bytes;
  switch (pixels.world().format) {
    case HX_FORMAT_ARGB8:
      return writer.Write(frame, pixels.row<HX_Pixel8>(0), row_bytes);
    case HX_FORMAT_ARGB16:
      return writer.Write(frame, pixels.row<HX_Pixel16>(0), row_bytes);
    default:
      return writer.Write(frame, pixels.row<HX_PixelFloat>(0), row_bytes);
  }
}

void TellLosses(const media::ClipWriter& writer, const SideBySide* both, ProgressLine& progress) {
  for (const std::string& line : writer.warnings()) progress.Warn(line);
  if (!both) return;
  for (const std::string& line : both->warnings()) progress.Warn(line);
}

void RenderClip(SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
                std::size_t at, bool last, std::optional<std::size_t> thumbnail,
                media::ClipWriter& writer, SideBySide* both, ProgressLine& progress) {
  RenderSettings own = settings;
  own.shots = both != nullptr;
  if (thumbnail && *thumbnail >= at) own.shot_of = *thumbnail - at + range.first;
  const auto finish = [&] {
    writer.Finish();
    if (both) both->Finish();
  };
  const std::vector<std::string> said = RenderFrames(
      clip, range, own, "rendering", progress,
      [&](std::size_t frame, const DrawnFrame& drawn) {
        const std::size_t to = frame - range.first + at;
        Write(writer, to, *drawn.pixels);
        if (both) both->Write(to, *drawn.shot, *drawn.pixels);
        if (to == thumbnail) {
          progress.Item(
              "", Thumbnails(WorldOf(*drawn.shot), drawn.pixels->world(), clip.info().pixel_aspect),
              false);
        }
      },
      last ? std::function<void()>(finish) : nullptr);
  for (const std::string& line : said) progress.Warn(line);
  if (last) TellLosses(writer, both, progress);
}

}  // namespace calmframe
