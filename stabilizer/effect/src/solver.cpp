#include "stabilizer/effect/src/solver.h"

#include <algorithm>
#include <atomic>
#include <boost/make_shared.hpp>
#include <new>
#include <stdexcept>
#include <utility>

#include "platform/tessel/debug.h"
#include "platform/tessel/threads.h"
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

// All that the task touches.
class Solver::Core {
 public:
  Core(Inputs solve_inputs, boost::function<void()> notify_owner)
      : inputs(std::move(solve_inputs)), notify(std::move(notify_owner)) {}

  void Run();

  const Inputs inputs;
  bool warperSupplied = false;
  std::vector<marrow::stabilization::factorization_window> factorizationWindows;
  std::vector<marrow::stabilization::transition_record> transitionWindows;
  boost::shared_ptr<stabilizer_global> globalData;
  boost::shared_ptr<const CPWarper> warper;
  boost::shared_ptr<const cropper> cropperResult;
  const boost::function<void()> notify;
  std::atomic<std::uint32_t> state{not_started};
  bool outOfMemory = false;  // before the state is failed
  std::atomic<std::int64_t> cancelFlag{0};
  std::atomic<std::uint64_t> cancelPolls{0};
  std::atomic<float> progressShare{0};
  tessel::threads::CompletionEvent completion;

 private:
  void Execute();
  void RunFactorization();
  void MakeWarperUsingFactorization(CPWarper& newWarper);
  boost::shared_ptr<cropper> MakeCropper();
  progress_functor MakeProgressFunctor();
  void Poll();
  void ReportShare(float begin, float length, std::uint64_t framesDone);
};

Solver::Solver(std::uint32_t width, std::uint32_t height,
               const marrow::tracking::AllFeatures& features, std::uint32_t frameMapRadius,
               const SolverParamsRecord& parameters, bool needsCropper,
               boost::function<void()> notify)
    : core_(boost::make_shared<Core>(
          Inputs{width, height, features, frameMapRadius, parameters, needsCropper},
          std::move(notify))) {}

// A task that has begun is waited for, since its notification may be of something that goes with
// the owner. One that begins later finds the flag at its first poll.
Solver::~Solver() {
  core_->cancelFlag.exchange(1);
  if (started_ && GetState() != not_started) core_->completion.Wait();
}

void Solver::SetExistingWarper(boost::shared_ptr<const CPWarper> existing) {
  if (!existing) return;
  core_->warperSupplied = true;
  core_->warper = std::move(existing);
}

void Solver::Start() {
  started_ = true;
  tessel::threads::GetCPUBoundExecutor().Post([core = core_] { core->Run(); });
}

void Solver::Run() {
  core_->Run();
}

void Solver::Cancel() {
  core_->cancelFlag.store(1);
}

void Solver::Wait() {
  core_->completion.Wait();
}

bool Solver::WaitFor(std::chrono::milliseconds time) {
  return core_->completion.WaitFor(time);
}

Solver::State Solver::GetState() const {
  return static_cast<State>(core_->state.load(std::memory_order_acquire));
}

float Solver::GetProgress() const {
  return core_->progressShare.load(std::memory_order_relaxed);
}

std::uint64_t Solver::GetPollCount() const {
  return core_->cancelPolls.load(std::memory_order_relaxed);
}

bool Solver::OutOfMemory() const {
  return core_->outOfMemory;
}

const Solver::Inputs& Solver::inputs() const {
  return core_->inputs;
}

bool Solver::warper_supplied() const {
  return core_->warperSupplied;
}

const boost::shared_ptr<const CPWarper>& Solver::GetWarper() const {
  return core_->warper;
}

const boost::shared_ptr<const cropper>& Solver::GetCropper() const {
  return core_->cropperResult;
}

const std::vector<marrow::stabilization::factorization_window>& Solver::GetFactorizationWindows()
    const {
  return core_->factorizationWindows;
}

const std::vector<marrow::stabilization::transition_record>& Solver::GetTransitionWindows() const {
  return core_->transitionWindows;
}

void Solver::Core::Run() {
  state.store(running);
  State end = finished;
  try {
    Execute();
    if (inputs.needsCropper) cropperResult = MakeCropper();
  } catch (const CancelException&) {
    end = cancelled;
  } catch (const std::bad_alloc&) {
    outOfMemory = true;
    end = failed;
  } catch (...) {
    end = failed;
  }
  state.store(end, std::memory_order_release);
  if (notify) notify();
  completion.Signal();
}

void Solver::Core::Execute() {
  Poll();
  if (warper) {
    warper = warper->withFrameMap(inputs.frameMapRadius, MakeProgressFunctor());
    return;
  }
  auto global = boost::make_shared<stabilizer_global>();
  FillStabilizerGlobal(*global, static_cast<std::uint64_t>(inputs.features.feature_count),
                       static_cast<std::uint64_t>(inputs.features.frame_count), inputs.features,
                       inputs.parameters.pixel_aspect);
  Poll();
  factorizationWindows.clear();
  transitionWindows.clear();
  globalData = std::move(global);
  RunFactorization();
  Poll();
  auto newWarper = boost::make_shared<CPWarper>(inputs.features.frame_count,
                                                static_cast<std::int32_t>(inputs.width),
                                                static_cast<std::int32_t>(inputs.height));
  MakeWarperUsingFactorization(*newWarper);
  warper = std::move(newWarper);
}

void Solver::Core::RunFactorization() {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "RunFactorization()");
  const progress_functor poll = MakeProgressFunctor();
  const auto progress = [this, &poll] {
    poll();
    std::uint64_t done = 0;
    if (!factorizationWindows.empty()) done = factorizationWindows.back().end;
    if (!transitionWindows.empty()) done = std::max(done, transitionWindows.back().end);
    ReportShare(0.0f, kFactorizationShare, done);
  };
  if (!stabilizer_main(*globalData, inputs.parameters, transitionWindows, factorizationWindows,
                       static_cast<int>(inputs.width), static_cast<int>(inputs.height), progress)) {
    throw std::runtime_error("failure returned from stabilizer_main");
  }
}

void Solver::Core::MakeWarperUsingFactorization(CPWarper& newWarper) {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "MakeWarperUsingFactorization()");
  const progress_functor poll = MakeProgressFunctor();
  newWarper.buildDisplacements(std::exchange(globalData, {}), factorizationWindows,
                               transitionWindows, inputs.parameters, poll);
  // The warper has what it needs of them.
  for (marrow::stabilization::factorization_window& window : factorizationWindows) {
    window.overlap_rows = {};
    window.coefficients = {};
  }
  newWarper.drive([this, &poll, &newWarper] {
    poll();
    ReportShare(kFactorizationShare, kWarperShare, newWarper.frameWarpCount());
  });
  newWarper.makeFrameMap(inputs.frameMapRadius, poll);
}

boost::shared_ptr<cropper> Solver::Core::MakeCropper() {
  const tessel::debug::TimingEntry timing(kChannel, kTimingLevel, "RunCropper()");
  const progress_functor poll = MakeProgressFunctor();
  std::uint64_t frames = 0;
  return RunCropper(inputs.parameters, static_cast<std::size_t>(inputs.features.frame_count),
                    *warper, [this, &poll, &frames] {
                      poll();
                      ReportShare(kFactorizationShare + kWarperShare, kCropperShare, ++frames);
                    });
}

progress_functor Solver::Core::MakeProgressFunctor() {
  return [this] { Poll(); };
}

void Solver::Core::Poll() {
  cancelPolls.fetch_add(1, std::memory_order_relaxed);
  std::int64_t expected = 0;
  if (!cancelFlag.compare_exchange_strong(expected, 0)) throw CancelException();
}

void Solver::Core::ReportShare(float begin, float length, std::uint64_t framesDone) {
  const float share =
      begin +
      length * std::min(1.0f, static_cast<float>(framesDone) /
                                  static_cast<float>(std::max(inputs.features.frame_count, 1)));
  // A rank that fails starts over; what a person sees does not go back.
  if (share > progressShare.load(std::memory_order_relaxed)) {
    progressShare.store(share, std::memory_order_relaxed);
  }
}
