#pragma once

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <exception>
#include <mutex>
#include <thread>

#include "host/media/frame_index.h"

namespace calmframe::media {

// Decodes frames first, first + 1, ... on a thread of its own until the clip's end, a failure, or
// its destruction, whichever comes first. The finder belongs to that thread while this lives.
class DecodeAhead {
 public:
  DecodeAhead(FrameFinder& finder, std::size_t first, std::size_t end);
  ~DecodeAhead();  // cancels and waits, for one frame's decoding at most
  DecodeAhead(const DecodeAhead&) = delete;
  DecodeAhead& operator=(const DecodeAhead&) = delete;

  // Number of the frame that Pop takes next; `end` when none is left.
  std::size_t next() const { return next_; }
  // Waits for the next frame. The first failure is thrown, now and on every later call.
  FramePtr Pop();

 private:
  void Run(std::size_t first);

  FrameFinder& finder_;
  const std::size_t end_;
  std::size_t next_;  // the consumer's
  std::atomic<bool> stop_ = false;
  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<FramePtr> frames_;  // guarded by mutex_
  std::exception_ptr failure_;   // guarded by mutex_
  std::thread thread_;
};

}  // namespace calmframe::media
