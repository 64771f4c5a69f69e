#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <chrono>
#include <cstdint>
#include <exception>
#include <vector>

#include "stabilization/crop/cropper.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"
#include "stabilization/warp/cp_warper.h"

// Turns the tracked features of a clip into a finished stabilization. One object lives for one
// solve. Its owner starts it, polls its state and takes the results; dropping it cancels it and
// waits for a task that has begun to end. One that has not begun yet ends later, by itself.
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

  // What a solve is made from.
  struct Inputs {
    std::uint32_t width;  // the analysed frame in square pixels
    std::uint32_t height;
    marrow::tracking::AllFeatures features;  // shared, must not change while the solve runs
    std::uint32_t frameMapRadius;
    marrow::stabilization::SolverParamsRecord parameters;
    bool needsCropper;
  };

  // notify is called from the task once, when the state is final, before waiters wake, and maybe
  // after this object is gone; it must not drop the Solver.
  Solver(std::uint32_t width, std::uint32_t height, const marrow::tracking::AllFeatures& features,
         std::uint32_t frameMapRadius, const marrow::stabilization::SolverParamsRecord& parameters,
         bool needsCropper, boost::function<void()> notify = {});
  virtual ~Solver();
  Solver(const Solver&) = delete;
  Solver& operator=(const Solver&) = delete;

  // Hands over a warper of an earlier solve that is still valid: the solve then only makes one with
  // the same warps and a frame map of its own. See CPWarper::withFrameMap. Null changes nothing.
  void SetExistingWarper(boost::shared_ptr<const marrow::stabilization::CPWarper> warper);

  // Posts Run to the CPU-bound executor and returns.
  void Start();
  // The task itself: lets no exception out.
  void Run();

  // Asks the task to end; it does at its next poll. Any thread.
  void Cancel();
  // Waits until a started task has ended.
  void Wait();
  bool WaitFor(std::chrono::milliseconds time);
  State GetState() const;
  // A rough share of the work done, 0 to 1, never falling. Any thread.
  float GetProgress() const;
  // How often the task has looked whether it is to end: a sign of life. Any thread.
  std::uint64_t GetPollCount() const;

  const Inputs& inputs() const;
  bool warper_supplied() const;

  // Whether that is why it failed. To be read once the state is failed.
  bool OutOfMemory() const;
  // Results. To be read once the state is finished.
  const boost::shared_ptr<const marrow::stabilization::CPWarper>& GetWarper() const;
  const boost::shared_ptr<const cropper>& GetCropper() const;
  // Without their coefficients and overlap rows.
  const std::vector<marrow::stabilization::factorization_window>& GetFactorizationWindows() const;
  const std::vector<marrow::stabilization::transition_record>& GetTransitionWindows() const;

 private:
  class Core;

  const boost::shared_ptr<Core> core_;  // the task's too
  bool started_ = false;
};
