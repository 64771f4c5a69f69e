#pragma once

#include <atomic>
#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <chrono>
#include <cstdint>
#include <exception>
#include <vector>

#include "platform/tessel/threads.h"
#include "stabilization/cp_warper.h"
#include "stabilization/cropper.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

// Turns the tracked features of a clip into a finished stabilization. One object lives for one
// solve. Its owner starts it, polls its state and takes the results; dropping it cancels it and
// waits until its task has ended.
class Solver {
 public:
  // Thrown by the cancellation poll alone, caught at the top of the task.
  class CancelException : public std::exception {};

  // Written by the task, except not_started; never changed after finished, cancelled or failed.
  enum State : std::uint32_t {
    not_started = 0,
    running = 1,
    finished = 2,
    cancelled = 3,
    failed = 4
  };

  // width, height: the analysed frame in square pixels. features: shared, must not change while the
  // solve runs. notify is called from the task once, when the state is final, before waiters wake;
  // it must not drop the Solver.
  Solver(std::uint32_t width, std::uint32_t height, const marrow::tracking::AllFeatures& features,
         std::uint32_t frameMapRadius, const marrow::stabilization::SolverParamsRecord& parameters,
         bool needsCropper, boost::function<void()> notify = {});
  virtual ~Solver();
  Solver(const Solver&) = delete;
  Solver& operator=(const Solver&) = delete;

  // Hands over a warper of an earlier solve that is still valid: the solve then only rebuilds its
  // frame map. The warper must have been driven in this process, or frameMapRadius be 0. Null
  // changes nothing.
  void SetExistingWarper(boost::shared_ptr<marrow::stabilization::CPWarper> warper);

  // Posts Run to the CPU-bound executor and returns.
  void Start();
  // The task itself: lets no exception out.
  void Run();

  // Asks the task to end; it does at its next poll. Any thread.
  void Cancel() { cancelFlag.store(1); }
  // Waits until a started task has ended.
  void Wait() { completion->Wait(); }
  bool WaitFor(std::chrono::milliseconds time) { return completion->WaitFor(time); }
  State GetState() const { return static_cast<State>(state.load(std::memory_order_acquire)); }
  // A rough share of the work done, 0 to 1, never falling. Any thread.
  float GetProgress() const { return progressShare.load(std::memory_order_relaxed); }

  // Results. To be read once the state is finished.
  const boost::shared_ptr<marrow::stabilization::CPWarper>& GetWarper() const { return warper; }
  const boost::shared_ptr<cropper>& GetCropper() const { return cropperResult; }
  const std::vector<marrow::stabilization::factorization_window>& GetFactorizationWindows() const {
    return factorizationWindows;
  }
  const std::vector<marrow::stabilization::transition_record>& GetTransitionWindows() const {
    return transitionWindows;
  }

 private:
  void Execute();
  void RunFactorization();
  void MakeWarperUsingFactorization(marrow::stabilization::CPWarper& newWarper);
  boost::shared_ptr<cropper> MakeCropper();
  marrow::stabilization::progress_functor MakeProgressFunctor();
  void Poll();
  void ReportShare(float begin, float length, std::uint64_t framesDone);

  const std::uint32_t width;
  const std::uint32_t height;
  const marrow::tracking::AllFeatures features;
  const std::uint32_t frameMapRadius;
  const marrow::stabilization::SolverParamsRecord parameters;
  const bool needsCropper;
  bool warperSupplied = false;
  std::vector<marrow::stabilization::factorization_window> factorizationWindows;
  std::vector<marrow::stabilization::transition_record> transitionWindows;
  boost::shared_ptr<marrow::stabilization::stabilizer_global> globalData;
  boost::shared_ptr<marrow::stabilization::CPWarper> warper;
  boost::shared_ptr<cropper> cropperResult;
  const boost::function<void()> notify;
  bool started = false;  // touched by the owner alone
  std::atomic<std::uint32_t> state{not_started};
  std::atomic<std::int64_t> cancelFlag{0};
  std::atomic<std::uint64_t> cancelPolls{0};
  std::atomic<float> progressShare{0};
  boost::shared_ptr<tessel::threads::CompletionEvent> completion;
};
