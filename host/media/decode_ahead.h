#pragma once

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <exception>
#include <functional>
#include <mutex>
#include <thread>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// Gets frames first, first + 1, ... on a thread of its own until the clip's end, a failure, or its
// destruction, whichever comes first.
class DecodeAhead {
 public:
  // A frame by its number; null if `stop` became true.
  using Get = std::function<FramePtr(std::size_t frame, const std::atomic<bool>& stop)>;
  // What `get` uses belongs to that thread while this lives.
  DecodeAhead(Get get, std::size_t first, std::size_t end);
  ~DecodeAhead();  // cancels and waits, for one frame's decoding at most
  DecodeAhead(const DecodeAhead&) = delete;
  DecodeAhead& operator=(const DecodeAhead&) = delete;

  // Number of the frame that Pop takes next; `end` when none is left.
  std::size_t next() const { return next_; }
  std::size_t end() const { return end_; }
  // Waits for the next frame. The first failure is thrown, now and on every later call.
  FramePtr Pop();

 private:
  void Run(std::size_t first);

  const Get get_;
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
