#pragma once

#include <algorithm>
#include <atomic>
#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "analysis/src/analyzer.h"
#include "analysis/src/executor_job.h"
#include "platform/tessel/threads.h"

namespace kelp::analysis {

constexpr std::int32_t kWidth = 48, kHeight = 40;

// A clip of `frames` frames at 25 a second from `start` on.
inline JobInput ClipInput(std::int64_t frames, std::int64_t start = 0, std::int32_t field = 0) {
  JobInput input;
  input.FieldType = field;
  input.StepTime = {1, 25};
  input.StartTime = input.StepTime * start;
  input.Duration = input.StepTime * frames;
  return input;
}

// Settings under which the frames below give tracks, at little cost.
inline marrow::tracking::SelectorParams SmallSelector() {
  marrow::tracking::SelectorParams selector;
  selector.max_count = 8;
  selector.spacing = 4;
  selector.half_winx = selector.half_winy = 2;
  selector.border = 5;
  return selector;
}
inline marrow::tracking::TrackerParams SmallTracker() {
  marrow::tracking::TrackerParams tracker;
  tracker.pyramidal_levels = 2;
  tracker.half_win_x = tracker.half_win_y = 3;
  return tracker;
}

// Bright squares that move half a pixel a row of the run, in 8-bit alpha, red, green, blue.
inline std::vector<std::uint8_t> DrawFrame(double shift) {
  std::vector<std::uint8_t> pixels(kWidth * kHeight * 4, 255);
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      const double u = x - shift;
      const double column = std::min(std::max(0.0, std::fmod(u + 480, 12) - 3), 6.0);
      const bool row = y % 11 >= 3 && y % 11 < 8;
      const double value = row ? 40 + 30 * std::min(column, 6 - column) + y : 40;
      for (int c = 1; c < 4; ++c) {
        pixels[(y * kWidth + x) * 4 + c] = static_cast<std::uint8_t>(value);
      }
    }
  }
  return pixels;
}

// A job over drawn frames that notes what it is asked. Frames are named by their index in the run.
class FakeJob final : public ExecutorJob {
 public:
  FakeJob(const JobInput& input, const boost::shared_ptr<Analysis>& analysis,
          std::function<void(FakeJob&, const std::string&)> on_call = {})
      : ExecutorJob(input, analysis), on_call_(std::move(on_call)) {
    ++living;
  }
  ~FakeJob() override { --living; }

  bool RequestFrame(const RationalTime& time, std::int32_t) override {
    Note("request " + Name(time));
    return false;
  }
  void GetFrame(const RationalTime& time, std::int32_t, std::int32_t* row_bytes, bool* flipped,
                std::uint32_t* format, const std::uint8_t** pixels) override {
    WaitPoint();
    NotifyHost();
    Note("get " + Name(time));
    frame_ = DrawFrame(0.5 * std::stoi(Name(time)));
    *row_bytes = kWidth * 4;
    *flipped = flip;
    if (flip) {
      std::vector<std::uint8_t> upside_down;
      for (int y = kHeight; y-- > 0;) {
        upside_down.insert(upside_down.end(), frame_.begin() + y * *row_bytes,
                           frame_.begin() + (y + 1) * *row_bytes);
      }
      frame_ = upside_down;
    }
    *format = 0;
    *pixels = frame_.data();
  }
  void ReleaseFrame(const RationalTime& time, std::int32_t) override {
    Note("release " + Name(time));
  }
  void GetFrameSize(std::int32_t* width, std::int32_t* height) override {
    Note("size");
    *width = kWidth;
    *height = kHeight;
  }

  std::vector<std::string> calls() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return calls_;
  }
  bool flip = false;

  static inline std::atomic<int> living{0};

 private:
  void ReadProperties() override { Note("properties"); }
  void ReleaseNode() override { Note("release node"); }
  void CancelRequests() override { Note("cancel requests"); }
  void NotifyHost() override {}

  std::string Name(const RationalTime& time) const {
    const RationalTime row = RowDuration(input());
    return std::to_string(FloorSteps(time, row) - FloorSteps(input().StartTime, row));
  }
  void Note(const std::string& call) {
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      calls_.push_back(call);
    }
    if (on_call_) on_call_(*this, call);
  }

  const std::function<void(FakeJob&, const std::string&)> on_call_;
  mutable std::mutex mutex_;
  std::vector<std::string> calls_;  // guarded by mutex_
  std::vector<std::uint8_t> frame_;
};

// Waits until all that was posted on the job's thread so far has run.
inline void WaitFor(ExecutorJob& job) {
  tessel::threads::CompletionEvent done;
  if (job.executor().Post([&done] { done.Signal(); }, 0)) {
    done.Wait();
  } else {
    tessel::threads::Shutdown();  // the queue has ended
  }
}

}  // namespace kelp::analysis
