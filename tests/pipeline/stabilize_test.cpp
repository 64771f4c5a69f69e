#include "pipeline/stabilize.h"

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>

#include "synthetic/scene.h"

namespace calmframe::pipeline {
namespace {

// A reader that draws its frames, and what was asked of it.
class DrawnClip final : public media::ClipReader {
 public:
  using Draw = std::function<void(std::size_t frame, HX_Pixel8* pixels)>;
  DrawnClip(int width, int height, std::size_t frames, Draw draw)
      : draw_(std::move(draw)), pixels_(static_cast<std::size_t>(width * height)) {
    info_.width = width;
    info_.height = height;
    info_.frame_count = frames;
    info_.frame_rate = {25, 1};
  }
  const media::ClipInfo& info() const override { return info_; }
  media::ClipInfo& change() { return info_; }
  void Read(std::size_t f, HX_Pixel8* p, std::ptrdiff_t r) override { Fill(f, p, r, 1); }
  void Read(std::size_t f, HX_Pixel16* p, std::ptrdiff_t r) override {
    Fill(f, p, r, 32768 / 255.0);
  }
  void Read(std::size_t f, HX_PixelFloat* p, std::ptrdiff_t r) override {
    Fill(f, p, r, 1 / 255.0);
  }

 private:
  template <class Pixel>
  void Fill(std::size_t frame, Pixel* to, std::ptrdiff_t row_bytes, double gain) {
    draw_(frame, pixels_.data());
    WorldX<Pixel> world(info_.width, info_.height, row_bytes, to);
    using Sample = decltype(Pixel::red);
    const auto s = [gain](int v) { return static_cast<Sample>(v * gain + 1e-3); };
    for (int i = 0; i < info_.width * info_.height; ++i) {
      const HX_Pixel8& p = pixels_[static_cast<std::size_t>(i)];
      world.row(i / info_.width)[i % info_.width] = {s(p.alpha), s(p.red), s(p.green), s(p.blue)};
    }
  }
  media::ClipInfo info_;
  Draw draw_;
  std::vector<HX_Pixel8> pixels_;
};

// Keeps the green of every frame in 0 .. 1, and alpha.
class KeptFrames final : public media::ClipWriter {
 public:
  explicit KeptFrames(const media::ClipInfo& info) : width_(info.width), height_(info.height) {}
  void Write(std::size_t, const HX_Pixel8* p, std::ptrdiff_t r) override { Keep(p, r, 255); }
  void Write(std::size_t, const HX_Pixel16* p, std::ptrdiff_t r) override { Keep(p, r, 32768); }
  void Write(std::size_t, const HX_PixelFloat* p, std::ptrdiff_t r) override { Keep(p, r, 1); }
  const std::vector<std::string>& warnings() const override { return warnings_; }
  void Finish() override {}

  std::vector<std::vector<float>> green, alpha;

 private:
  template <class Pixel>
  void Keep(const Pixel* pixels, std::ptrdiff_t row_bytes, float full) {
    const WorldX<Pixel> world(width_, height_, row_bytes, const_cast<Pixel*>(pixels));
    green.emplace_back();
    alpha.emplace_back();
    for (int y = 0; y < height_; ++y) {
      for (int x = 0; x < width_; ++x) {
        green.back().push_back(static_cast<float>(world.row(y)[x].green) / full);
        alpha.back().push_back(static_cast<float>(world.row(y)[x].alpha) / full);
      }
    }
  }
  int width_, height_;
  std::vector<std::string> warnings_;
};

class Ears final : public Listener {
 public:
  void Progress(const char* stage, double done, double total, const char*) override {
    if (stages.empty() || stages.back() != stage) stages.push_back(stage);
    last = done / total;
  }
  bool Cancelled() override { return polls_left > 0 && --polls_left == 0; }
  void Warn(const std::string& line) override { warnings.push_back(line); }
  std::vector<std::string> stages, warnings;
  double last = 0;
  int polls_left = 0;  // the poll that answers yes; 0: none
};

// A wall seen by a camera that trembles by up to `shake` pixels.
DrawnClip TremblingWall(int width, int height, std::size_t frames, double shake) {
  synthetic::scene_options options;
  options.width = 2 * width;
  options.height = 2 * height;
  options.frame_count = 1;
  const synthetic::scene scene(synthetic::wall(10), synthetic::resting_path({}), options);
  const std::vector<HX_Pixel8> wall = scene.render(0);
  return DrawnClip(width, height, frames, [=](std::size_t f, HX_Pixel8* pixels) {
    const int dx = width / 2 + static_cast<int>(std::lround(shake * std::sin(2.4 * double(f))));
    const int dy = height / 2 + static_cast<int>(std::lround(shake * std::cos(1.7 * double(f))));
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < width; ++x) pixels[y * width + x] = wall[(y + dy) * 2 * width + x + dx];
    }
  });
}

// Mean absolute difference of consecutive frames over the middle half.
double Unrest(const std::vector<std::vector<float>>& frames, int width, int height) {
  double sum = 0;
  for (std::size_t f = 1; f < frames.size(); ++f) {
    for (int y = height / 4; y < height * 3 / 4; ++y) {
      for (int x = width / 4; x < width * 3 / 4; ++x) {
        sum += std::abs(frames[f][static_cast<std::size_t>(y * width + x)] -
                        frames[f - 1][static_cast<std::size_t>(y * width + x)]);
      }
    }
  }
  return sum / (double(frames.size() - 1) * width * height / 4);
}

TEST(StabilizeTest, ATremblingWallStandsStillAtEveryDepth) {
  DrawnClip clip = TremblingWall(320, 240, 30, 4);
  kelp::effect::Controls controls;
  Ears ears;
  const auto features = Analyze(clip, controls, ears);
  const Solution solution = Solve(features, GeometryOf(clip.info()), controls, ears);
  KeptFrames shaky(clip.info());
  std::vector<HX_Pixel8> frame(320 * 240);
  for (std::size_t f = 0; f < 30; ++f) {
    clip.Read(f, frame.data(), 320 * 4);
    shaky.Write(f, frame.data(), 320 * 4);
  }
  const double before = Unrest(shaky.green, 320, 240);
  for (const int depth : {8, 16, 32}) {
    SCOPED_TRACE(depth);
    KeptFrames steady(clip.info());
    Render(clip, solution, controls, depth, steady, ears);
    ASSERT_EQ(steady.green.size(), 30u);
    EXPECT_LT(Unrest(steady.green, 320, 240), before / 4);
    for (const auto& alpha : steady.alpha) {
      EXPECT_GE(*std::min_element(alpha.begin(), alpha.end()), 0.99f);
    }
  }
  EXPECT_THAT(ears.stages, ::testing::ElementsAre("analyzing", "solving", "rendering"));
  EXPECT_EQ(ears.last, 1);
  EXPECT_TRUE(ears.warnings.empty());
}

// A camera that trembles before a wall and is held still: all steadied frames show one picture,
// whose truth at a pixel is the mean of the frames that cover it themselves.
TEST(StabilizeTest, EdgesAreFilledWithWhatIsThere) {
  constexpr int kWidth = 320, kHeight = 240, kShake = 12, kFrames = 16;
  DrawnClip clip = TremblingWall(kWidth, kHeight, kFrames, kShake);
  kelp::effect::Controls controls;
  controls.method = kelp::effect::Method::position;
  controls.result = kelp::effect::Result::no_motion;
  Ears ears;
  const auto features = Analyze(clip, controls, ears);
  const auto render = [&](Framing framing, KeptFrames& frames) {
    controls.framing = framing;
    const Solution solution = Solve(features, GeometryOf(clip.info()), controls, ears);
    Render(clip, solution, controls, 8, frames, ears);
  };
  KeptFrames open(clip.info()), filled(clip.info());
  render(Framing::stabilize_only, open);
  render(Framing::synthesize_edges, filled);

  const std::size_t pixels = kWidth * kHeight;
  std::vector<double> truth(pixels);
  std::vector<int> covers(pixels);
  for (std::size_t f = 0; f < kFrames; ++f) {
    for (std::size_t i = 0; i < pixels; ++i) {
      if (open.alpha[f][i] < 1) continue;
      truth[i] += open.green[f][i];
      ++covers[i];
    }
  }
  double error = 0;
  std::size_t compared = 0, uncovered = 0, left_open = 0;
  for (std::size_t f = 0; f < kFrames; ++f) {
    for (std::size_t i = 0; i < pixels; ++i) {
      if (open.alpha[f][i] > 0) continue;
      ++uncovered;
      left_open += filled.alpha[f][i] < 1;
      if (filled.alpha[f][i] < 1 || covers[i] < 4) continue;
      const double d = filled.green[f][i] - truth[i] / covers[i];
      error += d * d;
      ++compared;
    }
  }
  EXPECT_GT(uncovered, pixels * kFrames / 50);
  EXPECT_LT(left_open, uncovered / 4);
  ASSERT_GT(compared, uncovered / 2);
  EXPECT_GT(-10 * std::log10(error / compared), 30);
}

TEST(StabilizeTest, EachFieldOfAnInterlacedClipHasItsOwnMotion) {
  // The camera moves between the fields of a frame, so one warp for both would comb.
  DrawnClip fields = TremblingWall(320, 240, 60, 4);
  DrawnClip clip(320, 240, 30, [&](std::size_t f, HX_Pixel8* pixels) {
    std::vector<HX_Pixel8> field(320 * 240);
    for (std::size_t parity : {0, 1}) {
      fields.Read(2 * f + parity, field.data(), 320 * 4);
      for (std::size_t y = parity; y < 240; y += 2) {
        std::copy_n(&field[y * 320], 320, &pixels[y * 320]);
      }
    }
  });
  clip.change().field_order = media::FieldOrder::top_first;
  // Difference of each line from the mean of its neighbours, which are of the other field.
  const auto combing = [](const std::vector<float>& frame) {
    double sum = 0;
    for (std::size_t y = 60; y < 180; ++y) {
      for (std::size_t x = 80; x < 240; ++x) {
        sum += std::abs(frame[y * 320 + x] -
                        (frame[(y - 1) * 320 + x] + frame[(y + 1) * 320 + x]) / 2);
      }
    }
    return sum / (120 * 160);
  };
  kelp::effect::Controls controls;
  Ears ears;
  KeptFrames combed(clip.info());
  std::vector<HX_Pixel8> frame(320 * 240);
  clip.Read(10, frame.data(), 320 * 4);
  combed.Write(0, frame.data(), 320 * 4);
  KeptFrames steady(clip.info());
  const auto features = Analyze(clip, controls, ears);
  EXPECT_EQ(features.frame_count, 60);
  Render(clip, Solve(features, GeometryOf(clip.info()), controls, ears), controls, 8, steady, ears);
  ASSERT_EQ(steady.green.size(), 30u);
  EXPECT_LT(combing(steady.green[10]), combing(combed.green[0]) / 2);
  EXPECT_LT(Unrest(steady.green, 320, 240), 0.02);
}

TEST(StabilizeTest, CancelledInEveryStage) {
  DrawnClip clip = TremblingWall(160, 120, 20, 3);
  kelp::effect::Controls controls;
  Ears deaf;
  const auto features = Analyze(clip, controls, deaf);
  const Solution solution = Solve(features, GeometryOf(clip.info()), controls, deaf);
  Ears ears;
  ears.polls_left = 7;
  EXPECT_THROW(Analyze(clip, controls, ears), Interrupted);
  ears.polls_left = 5;
  KeptFrames frames(clip.info());
  EXPECT_THROW(Render(clip, solution, controls, 8, frames, ears), Interrupted);
  EXPECT_EQ(frames.green.size(), 4u);
}

TEST(StabilizeTest, ExtremeCroppingIsTold) {
  DrawnClip clip = TremblingWall(160, 120, 6, 1);
  kelp::effect::Controls controls;
  Ears ears;
  Solution solution = Solve(Analyze(clip, controls, ears), GeometryOf(clip.info()), controls, ears);
  const auto crop = boost::make_shared<cropper>(*solution.crop);
  solution.crop = crop;
  // Two fifths of 160 x 120, enlarged 1.5 times at most: from 43 x 32 on all is well.
  const struct {
    int width, height;
    std::size_t warnings;
  } cases[] = {{43, 32, 0}, {42, 40, 1}, {100, 31, 1}};
  for (const auto& c : cases) {
    ears.warnings.clear();
    crop->cropWidth = c.width;
    crop->cropHeight = c.height;
    KeptFrames frames(clip.info());
    Render(clip, solution, controls, 8, frames, ears);
    EXPECT_EQ(ears.warnings.size(), c.warnings) << c.width << " x " << c.height;
  }
  crop->cropWidth = 0;
  KeptFrames frames(clip.info());
  EXPECT_THROW(Render(clip, solution, controls, 8, frames, ears), SolveFailure);
}

}  // namespace
}  // namespace calmframe::pipeline
