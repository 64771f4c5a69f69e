#include "apps/calmframe/demo_command.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <vector>

#include "apps/calmframe/caption.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "host/media/clip.h"
#include "platform/tessel/threads.h"
#include "synthetic/scene.h"

namespace calmframe {
namespace {

constexpr int kWidth = 1280;
constexpr int kHeight = 720;
constexpr int kSeam = 8;  // pixels of black where the pictures of a side-by-side meet

media::EncodeSettings Encoding(const media::EncodeSettings& wanted) {
  media::EncodeSettings settings = wanted;
  settings.overwrite = true;  // the directory is the demo's own
  return settings;
}

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

void WriteSideBySide(const std::string& left_path, const std::string& right_path,
                     const std::string& path, const media::EncodeSettings& encode,
                     ProgressLine& progress) {
  const auto left = media::ClipReader::Open(left_path);
  const auto right = media::ClipReader::Open(right_path);
  media::ClipInfo info = left->info();
  const int width = info.width;
  const auto writer = media::ClipWriter::Create(path, info, 2 * width, info.height, encode);
  const std::ptrdiff_t row_bytes = 2 * width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8));
  const std::size_t row_pixels = 2 * static_cast<std::size_t>(width);
  std::vector<HX_Pixel8> pixels(row_pixels * static_cast<std::size_t>(info.height));
  HX_Pixel8* left_half = pixels.data();
  HX_Pixel8* right_half = left_half + width;
  Progress shown{"pairing", 0, static_cast<double>(info.frame_count), "frames", "", false};
  for (std::size_t f = 0; f < info.frame_count; ++f) {
    if (InterruptAsked()) throw Interrupted();
    shown.done = static_cast<double>(f);
    progress.Show(shown);
    left->Read(f, left_half, row_bytes);
    right->Read(f, right_half, row_bytes);
    DrawCaption("SHAKY", left_half, row_pixels, width, info.height);
    DrawCaption("STEADY", right_half, row_pixels, width, info.height);
    for (std::size_t y = 0; y < static_cast<std::size_t>(info.height); ++y) {
      std::fill_n(right_half + y * row_pixels - kSeam / 2, kSeam, HX_Pixel8{255, 0, 0, 0});
    }
    writer->Write(f, pixels.data(), row_bytes);
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
  flags.encode = Encoding(flags_.encode);

  try {
    WriteSample(shaky, frames_, flags.encode, run_.threads, progress);
    Stabilize(shaky, steady, "", {}, controls_, flags, run_.threads, progress);
    WriteSideBySide(shaky, steady, both, flags.encode, progress);
  } catch (...) {
    if (made) std::filesystem::remove(directory_, error);  // where nothing is in it
    throw;
  }
  if (run_.progress_form() == ProgressLine::Form::line) {
    std::fprintf(stderr, "wrote %s, %s and %s\n", shaky.c_str(), steady.c_str(), both.c_str());
  }
}

}  // namespace calmframe
