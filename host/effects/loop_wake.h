#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

namespace calmframe::host {

// Wakes a host's loop. Outlives the host for whoever of the plug-in's threads still asks. Any
// thread.
class LoopWake {
 public:
  // Ends a wait, or the next one; cheap, and many count as one.
  void Wake();
  // True when it was woken.
  bool Wait(std::chrono::milliseconds time);

  // While one lives on a thread, Wake does nothing there: what a command asks for on the loop's own
  // thread is seen to without.
  class Call {
   public:
    Call();
    ~Call();
    Call(const Call&) = delete;
    Call& operator=(const Call&) = delete;
  };

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  bool woken_ = false;  // guarded by mutex_
};

}  // namespace calmframe::host
