#include "pipeline/stabilize.h"

#include <algorithm>
#include <chrono>
#include <memory>

#include "pipeline/clip_frame_source.h"
#include "pipeline/pictures.h"
#include "stabilizer/effect/src/render_rules.h"
#include "stabilizer/effect/src/solver.h"
#include "tracking/tracking_run.h"

namespace calmframe::pipeline {
namespace {

using kelp::effect::ClipGeometry;
using kelp::effect::Controls;
using marrow::tracking::AllFeatures;

constexpr char kAnalyzing[] = "analyzing";
constexpr char kSolving[] = "solving";

}  // namespace

ClipGeometry GeometryOf(const media::ClipInfo& info) {
  ClipGeometry clip;
  clip.width = static_cast<std::uint32_t>(info.width);
  clip.height = static_cast<std::uint32_t>(info.height);
  clip.pixel_aspect_num = info.pixel_aspect.num;
  clip.pixel_aspect_den = info.pixel_aspect.den;
  clip.frame_rate =
      static_cast<double>(info.frame_rate.num) / static_cast<double>(info.frame_rate.den);
  return clip;
}

AllFeatures Analyze(media::ClipReader& reader, const Controls& controls, Listener& listener) {
  const ClipGeometry clip = GeometryOf(reader.info());
  const auto total = static_cast<double>(Pictures(reader.info()).count());
  ClipFrameSource source(reader, [&](std::size_t picture) {
    if (listener.Cancelled()) throw Interrupted();
    listener.Progress(kAnalyzing, static_cast<double>(picture), total, "frames");
  });
  AllFeatures features;
  TrackFrames(source, MakeSelectorParams(controls, clip), MakeTrackerParams(controls, clip),
              features);
  listener.Progress(kAnalyzing, total, total, "frames");
  return features;
}

Solution Solve(const AllFeatures& features, const ClipGeometry& clip, const Controls& controls,
               Listener& listener) {
  Solver solver(clip.square_width(), clip.height, features,
                kelp::effect::MakeMargin(controls, clip), MakeSolverParams(controls, clip),
                crops(controls.framing));
  listener.Progress(kSolving, 0, 1, "");
  solver.Start();
  while (!solver.WaitFor(std::chrono::milliseconds(50))) {
    if (listener.Cancelled()) solver.Cancel();
    listener.Progress(kSolving, std::min(solver.GetProgress(), 0.999f), 1, "");
  }
  if (solver.GetState() == Solver::cancelled) throw Interrupted();
  if (solver.GetState() != Solver::finished) {
    throw SolveFailure("the motion of this clip could not be solved");
  }
  listener.Progress(kSolving, 1, 1, "");
  return {solver.GetWarper(), solver.GetCropper(), solver.GetFactorizationWindows(),
          solver.GetTransitionWindows()};
}

void Stabilize(const std::string& input, const Controls& controls, const Output& output,
               Listener& listener) {
  const std::unique_ptr<media::ClipReader> reader = media::ClipReader::Open(input);
  const media::ClipInfo& info = reader->info();
  if (!info.warning.empty()) listener.Warn(info.warning);
  // A tracking window of the least size needs that much.
  constexpr int kLeastSide = 20;
  if (info.width < kLeastSide || info.height < kLeastSide) {
    throw media::Failure(media::Failure::Side::input, input + ": " + std::to_string(info.width) +
                                                          " by " + std::to_string(info.height) +
                                                          " pixels are too few to stabilize");
  }
  // Made first, so that an output that cannot be written costs nobody an analysis.
  const std::unique_ptr<media::ClipWriter> writer =
      media::ClipWriter::Create(output.path, info, info.width, info.height, output.encode);
  const AllFeatures features = Analyze(*reader, controls, listener);
  const Solution solution = Solve(features, GeometryOf(info), controls, listener);
  Render(*reader, solution, controls, output.depth, *writer, listener);
  writer->Finish();
  for (const std::string& line : writer->warnings()) listener.Warn(line);
}

}  // namespace calmframe::pipeline
