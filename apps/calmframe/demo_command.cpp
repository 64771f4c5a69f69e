#include "apps/calmframe/demo_command.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <vector>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "host/media/clip.h"
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

void WriteSample(const std::string& path, int frames, const media::EncodeSettings& encode,
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

}  // namespace

DemoCommand::DemoCommand(CLI::App& program)
    : Command(AddCommand(
          program, "demo",
          "Make a shaky sample, steady it, and show both side by side\n\n"
          "Draws a walk down a street of its own making and leaves shaky.mp4, steady.mp4 and "
          "side-by-side.mp4 in DIR, over those of an earlier demo.",
          "Examples:\n"
          "  calmframe demo\n"
          "  calmframe demo still --frames 60 --result no-motion")) {
  AddFolder(parser_, "DIR", directory_, "Where the three clips go");
  TellDefault(*AddNumber<int>(
                  parser_, "--frames", [this](int frames) { frames_ = frames; }, "N", 2, 100000,
                  "Length of the sample, 30 frames a second"),
              std::to_string(frames_));
  AddControlFlags(parser_, controls_);
  AddOutputFlags(parser_, flags_);
  AddRunFlags(parser_, run_);
}

std::vector<std::string> DemoCommand::Kept() const {
  const std::filesystem::path directory(directory_);
  return {directory / "shaky.mp4", directory / "steady.mp4", directory / "side-by-side.mp4"};
}

void DemoCommand::Run() {
  ProgressLine progress(run_.progress_form());
  std::error_code error;
  const bool made = std::filesystem::create_directories(directory_, error);
  if (error) {
    throw media::Failure(media::Failure::Side::output, directory_ + ": " + error.message());
  }
  const std::vector<std::string> files = Kept();
  const std::string &shaky = files[0], &steady = files[1], &both = files[2];
  OutputFlags flags = flags_;
  flags.encode.overwrite = true;  // the directory is the demo's own
  flags.side_by_side = both;
  flags.labels_sides = true;

  try {
    WriteSample(shaky, frames_, flags.encode, run_.threads, progress);
    Stabilize(shaky, steady, "", {}, {.kind = host::ShotRequest::Kind::one}, controls_, flags,
              run_.threads, progress);
  } catch (...) {
    if (made) std::filesystem::remove(directory_, error);  // where nothing is in it
    throw;
  }
  if (run_.progress_form() == ProgressLine::Form::line) {
    std::fprintf(stderr, "wrote %s, %s and %s\n", shaky.c_str(), steady.c_str(), both.c_str());
  }
}

}  // namespace calmframe
