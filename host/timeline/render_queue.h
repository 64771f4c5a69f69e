#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <thread>
#include <vector>

namespace calmframe::host {

// The threads that render frames in the background. Every request that was accepted runs exactly
// once, on one of these threads, with no lock held: in the order of posting, or, cancelled before
// its turn, at once. Any thread, these too except for Close.
class RenderQueue {
 public:
  // Cancelled: there is nothing to render, whoever waits is told so. Throws nothing.
  using Request = std::function<void(bool cancelled)>;

  explicit RenderQueue(int threads);
  ~RenderQueue();  // Close
  RenderQueue(const RenderQueue&) = delete;
  RenderQueue& operator=(const RenderQueue&) = delete;

  // A number from 1 on that no queue of the process uses again; 0: closed, nothing will run.
  std::int32_t Post(Request request);
  // A request that hasn't begun runs as a cancelled one, `delay` from now or when the queue closes.
  // Numbers of others are ignored.
  void Cancel(std::int32_t id, std::chrono::milliseconds delay = {});

  // Cancels all that hasn't begun, waits until everything ran, and ends the threads.
  void Close();

  std::size_t outstanding() const;  // accepted and not at their end
  bool IsOwnThread() const;

 private:
  using Clock = std::chrono::steady_clock;
  void Run();
  void RunOne(std::unique_lock<std::mutex>& lock, Request request, bool cancelled);

  mutable std::mutex mutex_;  // guards all below but threads_
  std::condition_variable changed_;
  bool closed_ = false;
  std::size_t running_ = 0;
  std::map<std::int32_t, Request> waiting_;              // in the order of posting
  std::multimap<Clock::time_point, Request> cancelled_;  // by the time to tell
  std::vector<std::thread> threads_;                     // the owner's
};

}  // namespace calmframe::host
