#include "apps/calmframe/sample_clip.h"

#include <algorithm>
#include <cstddef>
#include <memory>
#include <vector>

#include "apps/calmframe/failures.h"
#include "platform/tessel/threads.h"
#include "synthetic/scene.h"

namespace calmframe {
namespace {

constexpr int kWidth = 1280;
constexpr int kHeight = 720;

void End(Progress shown, ProgressLine& progress) {
  shown.done = shown.total;
  shown.ends = true;
  progress.Show(shown);
}

// A walk down a street with the camera held in the hand.
synthetic::scene Street(int frames) {
  synthetic::scene_options options;
  options.width = kWidth;
  options.height = kHeight;
  options.frame_count = frames;
  return synthetic::scene(synthetic::street(options.seed), synthetic::handheld_path({}), options);
}

}  // namespace

void DrawSample(const std::string& path, int frames, const media::EncodeSettings& encode,
                int threads, ProgressLine& progress) {
  const tessel::threads::ProcessorLimit limit(threads);
  media::ClipInfo info;
  info.width = kWidth;
  info.height = kHeight;
  info.frame_rate = {30, 1};
  info.frame_count = static_cast<std::size_t>(frames);
  const auto writer = media::ClipWriter::Create(path, info, kWidth, kHeight, encode);
  const synthetic::scene scene = Street(frames);
  constexpr int kAtOnce = 8;
  constexpr std::size_t kPixels = std::size_t{kWidth} * kHeight;
  constexpr std::ptrdiff_t kRowBytes = kWidth * sizeof(HX_Pixel8);
  std::vector<HX_Pixel8> pixels(kAtOnce * kPixels);
  Progress shown{"drawing", 0, static_cast<double>(frames), "frames", "", false};
  for (int first = 0; first < frames; first += kAtOnce) {
    if (InterruptAsked()) throw Interrupted();
    shown.done = first;
    progress.Show(shown);
    const auto count = static_cast<std::size_t>(std::min(kAtOnce, frames - first));
    tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
        [&](std::size_t i) {
          scene.render(first + static_cast<int>(i), &pixels[i * kPixels], kWidth);
        },
        count);
    for (std::size_t i = 0; i < count; ++i) {
      writer->Write(static_cast<std::size_t>(first) + i, &pixels[i * kPixels], kRowBytes);
    }
  }
  writer->Finish();
  End(shown, progress);
}

}  // namespace calmframe
