#pragma once

#include <chrono>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "platform/tessel/debug.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {

// A place at which background work can be made to wait, so that what comes next comes in the middle
// of it. Any thread.
class Hold {
 public:
  // For the work: waits until it is let go.
  void Pass() {
    reached_.Signal();
    open_.Wait();
  }
  // Whether the work stands there within the time.
  bool Reached(std::chrono::milliseconds time) { return reached_.WaitFor(time); }
  void Release() { open_.Signal(); }
  // In a moment, and from another thread: whoever acts now waits for the work, if it must.
  std::jthread ReleaseSoon() {
    return std::jthread([this] {
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
      Release();
    });
  }

 private:
  tessel::threads::CompletionEvent reached_, open_;
};

// Listens to the stages of solves, which their threads tell. One at a time.
class SolveStages {
 public:
  SolveStages() {
    tessel::debug::DebugDatabase::Set("Trace.Subspace Stabilizer", 5);
    tessel::debug::SetSink([this](const std::string& line) { Hear(line); });
  }
  ~SolveStages() {
    tessel::debug::SetSink({});
    tessel::debug::DebugDatabase::Set("Trace.Subspace Stabilizer", 0);
  }
  SolveStages(const SolveStages&) = delete;
  SolveStages& operator=(const SolveStages&) = delete;

  // The next solve waits where it says `line`, say "Begin - RunCropper()".
  void HoldAt(const std::string& line, Hold* hold) {
    std::lock_guard lock(mutex_);
    line_ = line;
    hold_ = hold;
  }
  // Solves fail where they say the line, which begins a stage; none for an empty one.
  void FailAt(const std::string& line) {
    std::lock_guard lock(mutex_);
    failing_ = line;
  }
  // Of what was said since the last look: "factorization ", "crop " or both.
  std::string Take() {
    std::lock_guard lock(mutex_);
    std::string stages;
    if (text_.find("Begin - RunFactorization()") != std::string::npos) stages += "factorization ";
    if (text_.find("Begin - RunCropper()") != std::string::npos) stages += "crop ";
    text_.clear();
    return stages;
  }

 private:
  void Hear(const std::string& line) {
    Hold* hold = nullptr;
    {
      std::lock_guard lock(mutex_);
      text_ += line;
      if (!failing_.empty() && line.find(failing_) != std::string::npos) {
        throw std::runtime_error("failed on purpose");
      }
      if (hold_ && line.find(line_) != std::string::npos) std::swap(hold, hold_);
    }
    if (hold) hold->Pass();
  }

  std::mutex mutex_;
  std::string text_, line_, failing_;  // guarded by mutex_
  Hold* hold_ = nullptr;               // guarded by mutex_
};

}  // namespace calmframe::host
