#include "tracking/tracking_run.h"

#include <gmock/gmock.h>

#include <cmath>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;

using Cell = tracking_feature<float>;

// Frames given by a formula of place and frame, grey, opaque; every request is noted.
class DrawnFrames final : public FrameSource {
 public:
  using Value = std::function<double(double x, double y, std::size_t frame)>;
  DrawnFrames(std::size_t frames, Value value) : frames_(frames), value_(std::move(value)) {}

  std::size_t width() const override { return 120; }
  std::size_t height() const override { return 96; }
  std::size_t frame_count() const override { return frames_; }
  void LoadLuma(std::size_t f, std::uint8_t* out) override { Draw('L', f, 1, out); }
  void LoadColor(std::size_t f, float* out) override { Draw('C', f, 3, out); }
  void LoadMask(std::size_t f, std::uint8_t* out) override {
    Request('M', f);
    std::fill_n(out, width() * height(), std::uint8_t{1});
  }

  std::string requests;
  std::function<void(const std::string& request)> on_request = [](const std::string&) {};

 private:
  void Request(char kind, std::size_t f) {
    requests += kind + std::to_string(f) + " ";
    on_request(kind + std::to_string(f));
  }
  template <class T>
  void Draw(char kind, std::size_t f, std::size_t channels, T* out) {
    Request(kind, f);
    for (std::size_t i = 0; i < width() * height() * channels; ++i) {
      const std::size_t pixel = i / channels;
      out[i] = std::floor(value_(pixel % width(), pixel / width(), f) + 0.5);
    }
  }
  std::size_t frames_;
  Value value_;
};

// Round blobs of many strengths, 17 pixels apart.
double Blobs(double x, double y) {
  const double column = std::floor(x / 17), row = std::floor(y / 17);
  const double u = x - 17 * column - 8, v = y - 17 * row - 8;
  const double hash = std::sin(12.9898 * column + 78.233 * row) * 43758.5453;
  return 60 + (60 + 100 * (hash - std::floor(hash))) * std::exp(-(u * u + v * v) / 12);
}
double Drifting(double x, double y, std::size_t f) {
  return Blobs(x - 0.6 * f, y + 0.35 * f);
}

struct Tracked {
  explicit Tracked(DrawnFrames& source, TrackerParams tracker = {}, std::size_t slots = 12) {
    SelectorParams selector;
    selector.max_count = slots;
    TrackFrames(source, selector, tracker, table, &statistics);
  }
  std::vector<std::int32_t> statuses(std::size_t frame) const {
    std::vector<std::int32_t> all;
    for (std::int32_t s = 0; s < table.feature_count; ++s) all.push_back(cell(frame, s).status);
    return all;
  }
  const Cell& cell(std::size_t frame, std::size_t slot) const {
    return (*table.features)[frame * table.feature_count + slot];
  }
  AllFeatures table;
  std::vector<TrackingStatistics> statistics;
};

// Frame 4 is black: everything is lost, nothing is found. From frame 5 on all is there again.
TEST(TrackingRunTest, LostSlotsAreFilledInTheSameFrameAndSlotsStayFreeUntilThere) {
  DrawnFrames source(
      8, [](double x, double y, std::size_t f) { return f == 4 ? 0.0 : Drifting(x, y, f); });
  const Tracked run(source);
  EXPECT_THAT(run.statuses(3), Each(0));
  EXPECT_THAT(run.statuses(4), Each(feature_status::kLost));
  EXPECT_THAT(run.statuses(5), Each(6)) << "seeds carry the frame's index plus 1";
  EXPECT_THAT(run.statuses(6), Each(0));
  for (std::size_t s = 0; s < 12; ++s) {
    EXPECT_EQ(run.cell(5, s).correlation, 0.0f);
    EXPECT_EQ(run.cell(5, s).x, std::floor(run.cell(5, s).x));
  }
  std::vector<std::size_t> seeds;
  for (const auto& frame : run.statistics) seeds.push_back(frame.new_features);
  EXPECT_THAT(seeds, ElementsAre(12, 0, 0, 0, 0, 12, 0, 0));
  EXPECT_EQ(run.statistics[3].translation[1], 12u);
  EXPECT_EQ(run.statistics[3].verification[1], 12u);
  EXPECT_EQ(run.statistics[4].translation[0], 12u);
  EXPECT_EQ(run.statistics[5].translation[0], 0u) << "nobody lived to be lost";

  // A cut to another picture: the code of the failure is overwritten by the seed.
  DrawnFrames cut(3, [](double x, double y, std::size_t f) {
    return f < 2 ? Blobs(x, y) : 250 - Blobs(y + 3, x + 5);
  });
  const Tracked after(cut);
  EXPECT_THAT(after.statuses(2), Each(3));
  EXPECT_EQ(after.statistics[2].translation[0] + after.statistics[2].verification[0], 12u);
  for (std::size_t s = 0; s < 12; ++s) EXPECT_EQ(after.cell(2, s).correlation, 0.0f);
}

TEST(TrackingRunTest, NewFeaturesKeepAwayFromLiveOnes) {
  DrawnFrames source(70, Drifting);
  const Tracked run(source);
  int seeds = 0;
  for (std::size_t f = 1; f < 70; ++f) {
    for (std::size_t s = 0; s < 12; ++s) {
      if (run.cell(f, s).status <= 0) continue;
      ++seeds;
      for (std::size_t other = 0; other < 12; ++other) {
        if (other == s || run.cell(f, other).status < 0) continue;
        EXPECT_GT(std::hypot(run.cell(f, s).x - run.cell(f, other).x,
                             run.cell(f, s).y - run.cell(f, other).y),
                  10.0)
            << f;
      }
    }
  }
  EXPECT_GT(seeds, 3);
}

TEST(TrackingRunTest, SettingsThatSwitchThingsOff) {
  DrawnFrames source(
      6, [](double x, double y, std::size_t f) { return f == 3 ? 0.0 : Drifting(x, y, f); });
  TrackerParams no_levels;
  no_levels.pyramidal_levels = 0;
  EXPECT_THAT(Tracked(source, no_levels).statuses(1), Each(2)) << "lost and found each frame";

  TrackerParams kill;
  kill.kill_tracks_shorter_than = 3;
  const Tracked killed(source, kill);
  EXPECT_THAT(killed.statuses(2), Each(0));
  EXPECT_THAT(killed.statuses(4), Each(feature_status::kRejectedCorrelation)) << "two frames long";

  const Tracked none(source, {}, 0);
  EXPECT_TRUE(none.table.features->empty());
  DrawnFrames empty(0, Drifting);
  EXPECT_EQ(Tracked(empty).table.frame_count, 0);
  EXPECT_EQ(empty.requests, "");
  DrawnFrames flat(3, [](double, double, std::size_t) { return 128.0; });
  const Tracked nothing(flat);
  EXPECT_THAT(nothing.statuses(0), Each(feature_status::kEmpty));
  EXPECT_THAT(nothing.statuses(2), Each(feature_status::kEmpty));
}

// A source may throw at any request. Others see the table of the whole run meanwhile, and rows that
// were finished stay.
TEST(TrackingRunTest, ARunCanBeEndedAtEveryRequest) {
  DrawnFrames whole(3, Drifting);
  const Tracked complete(whole);
  EXPECT_EQ(whole.requests, "L0 M0 C0 C1 L1 M1 C2 L2 M2 ");
  for (int n = 0; n < 9; ++n) {
    DrawnFrames source(3, Drifting);
    AllFeatures table;
    table.first_frame = 40;
    int left = n;
    source.on_request = [&](const std::string&) {
      ASSERT_EQ(table.frame_count, 3);
      ASSERT_EQ(table.features->size(), 36u);
      if (left-- == 0) throw std::runtime_error("cancelled");
    };
    SelectorParams selector;
    selector.max_count = 12;
    EXPECT_THROW(TrackFrames(source, selector, {}, table), std::runtime_error);
    EXPECT_EQ(table.first_frame, 40);
    const int rows = n < 2 ? 0 : n < 6 ? 1 : 2;
    for (int i = 0; i < 12 * rows; ++i) {
      const Cell &a = (*table.features)[i], &b = (*complete.table.features)[i];
      EXPECT_EQ(a.status, b.status) << n << " " << i;
      EXPECT_EQ(a.x, b.x) << n << " " << i;
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
