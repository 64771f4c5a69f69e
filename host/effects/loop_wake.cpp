#include "host/effects/loop_wake.h"

#include <utility>

namespace calmframe::host {
namespace {

thread_local int loop_calls = 0;

}  // namespace

LoopWake::Call::Call() {
  ++loop_calls;
}

LoopWake::Call::~Call() {
  --loop_calls;
}

void LoopWake::Wake() {
  if (loop_calls > 0) return;
  {
    std::lock_guard lock(mutex_);
    if (woken_) return;
    woken_ = true;
  }
  changed_.notify_one();
}

bool LoopWake::Wait(std::chrono::milliseconds time) {
  std::unique_lock lock(mutex_);
  changed_.wait_for(lock, time, [this] { return woken_; });
  return std::exchange(woken_, false);
}

}  // namespace calmframe::host
