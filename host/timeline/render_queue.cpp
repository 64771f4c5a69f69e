#include "host/timeline/render_queue.h"

#include <algorithm>
#include <atomic>
#include <limits>
#include <utility>

namespace calmframe::host {
namespace {

thread_local const RenderQueue* own_queue = nullptr;

// The next number; 0 when they are used up.
std::int32_t NewId() {
  static std::atomic<std::int32_t> last{0};
  std::int32_t id = last.load();
  do {
    if (id == std::numeric_limits<std::int32_t>::max()) return 0;
  } while (!last.compare_exchange_weak(id, id + 1));
  return id + 1;
}

}  // namespace

RenderQueue::RenderQueue(int threads) {
  try {
    threads_.reserve(static_cast<std::size_t>(threads));
    for (int i = 0; i < threads; ++i) threads_.emplace_back([this] { Run(); });
  } catch (...) {
    Close();
    throw;
  }
}

RenderQueue::~RenderQueue() {
  Close();
}

std::int32_t RenderQueue::Post(Request request) {
  std::int32_t id = 0;
  {
    std::lock_guard lock(mutex_);
    if (closed_) return 0;
    id = NewId();
    if (id == 0) return 0;
    waiting_.emplace_hint(waiting_.end(), id, std::move(request));
  }
  changed_.notify_one();
  return id;
}

void RenderQueue::Cancel(std::int32_t id, std::chrono::milliseconds delay) {
  {
    std::lock_guard lock(mutex_);
    const auto found = waiting_.find(id);
    if (found == waiting_.end()) return;
    const Clock::time_point due = closed_ ? Clock::time_point{} : Clock::now() + delay;
    cancelled_.emplace(due, std::move(found->second));
    waiting_.erase(found);
  }
  changed_.notify_one();
}

void RenderQueue::Close() {
  {
    std::lock_guard lock(mutex_);
    closed_ = true;
  }
  changed_.notify_all();
  for (std::thread& thread : threads_) thread.join();
  threads_.clear();
}

std::size_t RenderQueue::outstanding() const {
  std::lock_guard lock(mutex_);
  return waiting_.size() + cancelled_.size() + running_;
}

bool RenderQueue::IsOwnThread() const {
  return own_queue == this;
}

void RenderQueue::RunOne(std::unique_lock<std::mutex>& lock, Request request, bool cancelled) {
  ++running_;
  lock.unlock();
  request(cancelled);
  request = nullptr;
  lock.lock();
  --running_;
}

void RenderQueue::Run() {
  own_queue = this;
  std::unique_lock lock(mutex_);
  for (;;) {
    const auto next = cancelled_.begin();
    if (next != cancelled_.end() && (closed_ || next->first <= Clock::now())) {
      RunOne(lock, std::move(cancelled_.extract(next).mapped()), true);
    } else if (!waiting_.empty()) {
      RunOne(lock, std::move(waiting_.extract(waiting_.begin()).mapped()), closed_);
    } else if (closed_) {
      return;
    } else if (next != cancelled_.end()) {
      // A copy: the wait reads it again at its end, when another thread may have taken the entry.
      const Clock::time_point due = next->first;
      changed_.wait_until(lock, due);
    } else {
      changed_.wait(lock);
    }
  }
}

}  // namespace calmframe::host
