#include "stabilization/factorization/factorization_queue.h"

#include <gmock/gmock.h>

#include <map>
#include <string>
#include <utility>
#include <vector>

#include "platform/tessel/debug.h"

namespace marrow::stabilization {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using range = std::pair<std::uint64_t, std::uint64_t>;

const progress_functor kNoProgress = [] {};

// A clip in which windows reach as far as their limit in steps of 5 from 40, and frames of the
// given stretches are too weak.
class ScriptedMaker : public window_maker {
 public:
  ScriptedMaker(std::uint64_t frames, std::vector<range> weak)
      : frames_(frames), weak_(std::move(weak)) {}

  factorization_window make(std::uint64_t first, std::uint64_t limit) override {
    requests.push_back({first, limit});
    factorization_window window;
    window.first = first;
    window.end = std::min(frames_, first + std::min<std::uint64_t>(limit, 40));
    while (window.end < frames_ && std::min(frames_, window.end + 5) - first <= limit) {
      window.end = std::min(frames_, window.end + 5);
    }
    return window;
  }

  quality_result check(const factorization_window& window) override {
    if (window.end - window.first < 15) return {false, window.first, window.end};
    for (std::uint64_t f = window.first + 1; f + 1 < window.end; ++f) {
      if (!Weak(f)) continue;
      std::uint64_t good = f;
      while (good < window.end - 1 && Weak(good)) ++good;
      return {false, f, good};
    }
    return {};
  }

  std::vector<range> requests;

 private:
  bool Weak(std::uint64_t f) const {
    for (const range& w : weak_) {
      if (f >= w.first && f < w.second) return true;
    }
    return false;
  }
  std::uint64_t frames_;
  std::vector<range> weak_;
};

class FactorizationQueueTest : public ::testing::Test {
 protected:
  FactorizationQueueTest() {
    tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
    tessel::debug::SetSink([this](const std::string& text) { log_ += text; });
  }
  ~FactorizationQueueTest() override {
    tessel::debug::SetSink({});
    tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  }

  std::vector<range> Run(std::uint64_t frames, std::vector<range> weak = {},
                         std::vector<range> no_start = {}) {
    stabilizer_global global;
    global.frame_count = frames;
    std::vector<std::size_t> complete(frames, 500);
    for (const range& r : no_start) {
      for (std::uint64_t f = r.first; f < r.second; ++f) complete[f] = 4;
    }
    ScriptedMaker maker(frames, std::move(weak));
    std::vector<factorization_window> windows;
    run_factorization_queue(global, parameters_, complete, maker, windows, kNoProgress);
    requests_ = maker.requests;
    std::vector<range> ranges;
    for (const auto& w : windows) ranges.push_back({w.first, w.end});
    return ranges;
  }

  SolverParamsRecord parameters_;
  std::vector<range> requests_;
  std::string log_;
};

TEST_F(FactorizationQueueTest, OrdinaryClips) {
  EXPECT_THAT(Run(40), ElementsAre(range{0, 40}));
  EXPECT_THAT(Run(330), ElementsAre(range{0, 330}));
  EXPECT_THAT(Run(331), ElementsAre(range{0, 300}, range{270, 331}));
  EXPECT_THAT(Run(900),
              ElementsAre(range{0, 300}, range{270, 570}, range{540, 840}, range{810, 900}));
  EXPECT_THAT(Run(1000),
              ElementsAre(range{0, 300}, range{270, 570}, range{540, 840}, range{810, 1000}));
  const auto windows = Run(10000);
  EXPECT_EQ(windows.size(), 37u);
  EXPECT_EQ(windows.back(), (range{9720, 10000}));
  EXPECT_EQ(log_, "");
}

TEST_F(FactorizationQueueTest, AWeakStretchTruncatesItsWindow) {
  // [0, 300) fails on 120; made again over 120 frames; goes on at 140.
  EXPECT_THAT(Run(300, {{120, 140}}), ElementsAre(range{0, 120}, range{140, 300}));
  EXPECT_THAT(requests_, ElementsAre(range{0, 301}, range{0, 120}, range{140, 161}));
  EXPECT_EQ(log_,
            "Factorization window [0, 300) does not pass the quality check..."
            "truncated to [0, 120)");
}

TEST_F(FactorizationQueueTest, TruncationKeepsTheGrid) {
  EXPECT_THAT(Run(300, {{118, 140}}), ElementsAre(range{0, 115}, range{140, 300}));
}

TEST_F(FactorizationQueueTest, ABadFrameNearTheStartAbandonsTheWindow) {
  EXPECT_THAT(Run(300, {{29, 50}}), ElementsAre(range{50, 300}));
  EXPECT_EQ(log_,
            "Factorization window [0, 300) does not pass the quality check..."
            "abandon the window.");
  // At the overlap itself it is truncated; the override is below the moving window's duration.
  EXPECT_THAT(Run(300, {{30, 50}}), ElementsAre(range{0, 30}, range{50, 300}));
}

TEST_F(FactorizationQueueTest, AllFramesWeak) {
  EXPECT_THAT(Run(100, {{0, 100}}), IsEmpty());
}

TEST_F(FactorizationQueueTest, WindowsBeginWhereEnoughTracksAreComplete) {
  EXPECT_THAT(Run(300, {}, {{0, 17}}), ElementsAre(range{17, 300}));
  EXPECT_THAT(Run(300, {}, {{0, 300}}), IsEmpty());
  EXPECT_THAT(requests_, IsEmpty());
}

TEST_F(FactorizationQueueTest, WithoutTheCheckEveryWindowStands) {
  parameters_.conservative_factorization = false;
  EXPECT_THAT(Run(400, {{120, 140}}), ElementsAre(range{0, 300}, range{270, 400}));
}

TEST_F(FactorizationQueueTest, CompleteTrajectoriesCountWhatTheDurationAsks) {
  stabilizer_global global;
  global.frame_count = 100;
  global.trajectories = {
      {0, 0, 0, 100}, {1, 0, 0, 50}, {2, 0, 20, 60}, {3, 0, 70, 100}, {4, 0, 75, 99}};
  const auto complete = complete_trajectories(global, 40);
  for (std::size_t f = 0; f < 100; ++f) {
    std::size_t expected = 0;
    for (const Trajectory& t : global.trajectories) {
      expected += t.first <= static_cast<int>(f) &&
                  t.last >= static_cast<int>(std::min<std::size_t>(100, f + 40));
    }
    EXPECT_EQ(complete[f], expected) << "frame " << f;
  }
}

}  // namespace
}  // namespace marrow::stabilization
