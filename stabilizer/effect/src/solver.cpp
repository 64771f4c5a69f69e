#include "stabilizer/effect/src/solver.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <stdexcept>

#include "platform/tessel/debug.h"
#include "stabilization/stabilizer_main.h"

using marrow::stabilization::CPWarper;
using marrow::stabilization::progress_functor;
using marrow::stabilization::SolverParamsRecord;
using marrow::stabilization::stabilizer_global;

namespace {
constexpr char kChannel[] = "Subspace Stabilizer";
constexpr int kTimingLevel = 5;

// Where a stage lies in the whole, for GetProgress; shares of the time of a 300-frame clip.
constexpr float kFactorizationShare = 0.45f;
constexpr float kWarperShare = 0.5f;
constexpr float kCropperShare = 0.05f;
}  // namespace

Solver::Solver(std::uint32_t frame_width, std::uint32_t frame_height,
               const marrow::tracking::AllFeatures& all_features, std::uint32_t frame_map_radius,
               const SolverParamsRecord& solver_parameters, bool needs_cropper,
               boost::function<void()> notify_owner)
    : width(frame_width),
      height(frame_height),
      features(all_features),
      frameMapRadius(frame_map_radius),
      parameters(solver_parameters),
      needsCropper(needs_cropper),
      notify(std::move(notify_owner)),
      completion(boost::make_shared<tessel::threads::CompletionEvent>()) {}

// A posted task touches this object until it signals, so it is waited for whether or not it has
// begun: one that begins late sees the flag at its first poll.
Solver::~Solver() {
  cancelFlag.exchange(1);
  if (started) completion->Wait();
}

void Solver::SetExistingWarper(boost::shared_ptr<CPWarper> existing) {
  if (!existing) return;
  warperSupplied = true;
  warper = std::move(existing);
}

void Solver::Start() {
  started = true;
  tessel::threads::GetCPUBoundExecutor().Post([this] { Run(); });
}

void Solver::Run() {
  // The event outlives the object, whose owner may drop it as soon as the event is signalled.
  const boost::shared_ptr<tessel::threads::CompletionEvent> done = completion;
  state.store(running);
  State end = finished;
  try {
    Execute();
    if (needsCropper) cropperResult = MakeCropper();
  } catch (const CancelException&) {
    end = cancelled;
  } catch (...) {
    end = failed;
  }
  state.store(end, std::memory_order_release);
  if (notify) notify();
  done->Signal();
}

void Solver::Execute() {
  if (warper) {
    warper->makeFrameMap(frameMapRadius, MakeProgressFunctor());
    return;
  }
  auto global = boost::make_shared<stabilizer_global>();
  FillStabilizerGlobal(*global, static_cast<std::uint64_t>(features.feature_count),
                       static_cast<std::uint64_t>(features.frame_count), features,
                       parameters.pixel_aspect);
  Poll();
  factorizationWindows.clear();
  transitionWindows.clear();
  globalData = std::move(global);
  RunFactorization();
  Poll();
  auto newWarper = boost::make_shared<CPWarper>(
      features.frame_count, static_cast<std::int32_t>(width), static_cast<std::int32_t>(height));
  MakeWarperUsingFactorization(*newWarper);
  warper = std::move(newWarper);
}

void Solver::RunFactorization() {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "RunFactorization()");
  const progress_functor poll = MakeProgressFunctor();
  const auto progress = [this, &poll] {
    poll();
    std::uint64_t done = 0;
    if (!factorizationWindows.empty()) done = factorizationWindows.back().end;
    if (!transitionWindows.empty()) done = std::max(done, transitionWindows.back().end);
    ReportShare(0.0f, kFactorizationShare, done);
  };
  if (!stabilizer_main(*globalData, parameters, transitionWindows, factorizationWindows,
                       static_cast<int>(width), static_cast<int>(height), progress)) {
    throw std::runtime_error("failure returned from stabilizer_main");
  }
}

void Solver::MakeWarperUsingFactorization(CPWarper& newWarper) {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "MakeWarperUsingFactorization()");
  const progress_functor poll = MakeProgressFunctor();
  newWarper.buildDisplacements(globalData, factorizationWindows, transitionWindows, parameters,
                               poll);
  newWarper.drive([this, &poll, &newWarper] {
    poll();
    ReportShare(kFactorizationShare, kWarperShare, newWarper.frameWarpCount());
  });
  newWarper.makeFrameMap(frameMapRadius, poll);
}

boost::shared_ptr<cropper> Solver::MakeCropper() {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "RunCropper()");
  const progress_functor poll = MakeProgressFunctor();
  std::uint64_t frames = 0;
  return RunCropper(parameters, static_cast<std::size_t>(features.frame_count), *warper,
                    [this, &poll, &frames] {
                      poll();
                      ReportShare(kFactorizationShare + kWarperShare, kCropperShare, ++frames);
                    });
}

progress_functor Solver::MakeProgressFunctor() {
  return [this] { Poll(); };
}

void Solver::Poll() {
  cancelPolls.fetch_add(1, std::memory_order_relaxed);
  std::int64_t expected = 0;
  if (!cancelFlag.compare_exchange_strong(expected, 0)) throw CancelException();
}

void Solver::ReportShare(float begin, float length, std::uint64_t framesDone) {
  const float share =
      begin + length * std::min(1.0f, static_cast<float>(framesDone) /
                                          static_cast<float>(std::max(features.frame_count, 1)));
  // A rank that fails starts over; what a person sees does not go back.
  if (share > progressShare.load(std::memory_order_relaxed)) {
    progressShare.store(share, std::memory_order_relaxed);
  }
}
