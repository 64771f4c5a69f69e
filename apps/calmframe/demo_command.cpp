#include "apps/calmframe/demo_command.h"

#include <cstdio>
#include <filesystem>
#include <vector>

#include "apps/calmframe/flags.h"
#include "apps/calmframe/sample_clip.h"
#include "host/media/clip.h"

namespace calmframe {
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
    DrawSample(shaky, frames_, flags.encode, run_.threads, progress);
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
