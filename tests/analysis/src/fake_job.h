#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "analysis/src/analysis.h"
#include "analysis/src/executor_job.h"
#include "platform/tessel/threads.h"

namespace kelp::analysis {

constexpr std::int32_t kWidth = 48, kHeight = 40;

// A clip of `frames` frames at 25 a second from `start` on.
inline JobInput ClipInput(std::int64_t frames, std::int64_t start = 0, std::int32_t field = 0) {
  const RationalTime step = {1, 25};
  return {u"", {}, field, step * start, step * frames, step};
}

// Settings under which the frames below give tracks, at little cost.
inline marrow::tracking::SelectorParams SmallSelector(std::uint64_t slots = 8) {
  marrow::tracking::SelectorParams selector;
  selector.max_count = slots;
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

// Bright squares that move half a pixel a row of the run, in 8-bit alpha, red, green, blue; the
// last row first if it is flipped.
inline std::vector<std::uint8_t> DrawFrame(double shift, bool flip = false) {
  std::vector<std::uint8_t> pixels(kWidth * kHeight * 4, 255);
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      const double column = std::clamp(std::fmod(x - shift + 480, 12) - 3, 0.0, 6.0);
      const bool row = y % 11 >= 3 && y % 11 < 8;
      const double value = row ? 40 + 30 * std::min(column, 6 - column) + y : 40;
      const int place = (flip ? kHeight - 1 - y : y) * kWidth + x;
      std::fill_n(&pixels[place * 4 + 1], 3, static_cast<std::uint8_t>(value));
    }
  }
  return pixels;
}

// A job over drawn frames that notes what it is asked. Frames are named by their index in the run.
class FakeJob final : public ExecutorJob {
 public:
  using OnCall = std::function<void(FakeJob& self, const std::string& call)>;

  FakeJob(const JobInput& input, const boost::shared_ptr<Analysis>& analysis, OnCall on_call = {})
      : ExecutorJob(input, analysis), on_call_(std::move(on_call)) {
    ++living;
  }
  ~FakeJob() override { --living; }

  void Start(boost::shared_ptr<Job> shared_self) override {
    Note("start");
    ExecutorJob::Start(shared_self);
  }
  bool RequestFrame(const RationalTime& time, std::int32_t) override {
    Note("request " + Name(time));
    return false;
  }
  void GetFrame(const RationalTime& time, std::int32_t, std::int32_t* row_bytes, bool* flipped,
                std::uint32_t* format, const std::uint8_t** pixels) override {
    Note("get " + Name(time));
    frame_ = DrawFrame(0.5 * std::stoi(Name(time)), flip);
    *row_bytes = kWidth * 4;
    *flipped = flip;
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
  void ReleaseNode() override { Note("node"); }
  void CancelRequests() override { Note("cancel requests"); }
  void NotifyHost() override { Note("notify"); }

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

  const OnCall on_call_;
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

// Of an analysis and its job over drawn frames.
class FakeJobTest : public ::testing::Test {
 protected:
  ~FakeJobTest() override {
    job_.reset();
    analysis_.reset();
    tessel::threads::Shutdown();
    EXPECT_EQ(FakeJob::living, 0);
  }

  FakeJob& Make(const JobInput& input, FakeJob::OnCall on_call = {},
                const marrow::tracking::TrackerParams& tracker = SmallTracker()) {
    analysis_ = boost::make_shared<Analysis>(SmallSelector(), tracker);
    job_ = boost::make_shared<FakeJob>(input, analysis_, on_call);
    return *job_;
  }
  // A job that was made does its whole run, in the background.
  FakeJob& Run(FakeJob& job) {
    job.Start(job_);
    WaitFor(job);
    return job;
  }

  boost::shared_ptr<Analysis> analysis_;
  boost::shared_ptr<FakeJob> job_;
};

}  // namespace kelp::analysis
