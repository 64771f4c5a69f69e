#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <cstring>
#include <map>
#include <random>
#include <string>

#include "pipeline/host_operations.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "stabilizer/effect/src/solver.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "synthetic/frame_source.h"
#include "tracking/tracking_run.h"

namespace calmframe::pipeline {
namespace {

using Picture = WorldX<HX_Pixel8>;

constexpr int kWidth = 480, kHeight = 270, kFrames = 24, kMargin = 6;

// A slow look around by a camera that is knocked at frames 2, 6, 10, ...: it turns by some eight
// pixels from the frame before to the frame after, and rests a while.
synthetic::camera_path KnockedPath() {
  std::mt19937 random(11);
  std::uniform_real_distribution<double> turn(-M_PI, M_PI);
  std::vector<synthetic::vector3> rests(1);
  for (int k = 0; k < kFrames; ++k) {
    const double direction = turn(random);
    const synthetic::vector3& last = rests.back();
    // Back towards the middle in each second knock, so that the camera stays about where it was.
    rests.push_back(
        k % 2 ? synthetic::vector3{last[0] * 0.1, last[1] * 0.1, 0}
              : synthetic::vector3{0.0195 * std::sin(direction), 0.0195 * std::cos(direction), 0});
  }
  synthetic::camera_path path;
  path.intended = [](double t) {
    return synthetic::camera_pose{{0, 0.0004 * t, 0}, {0, -1.6, 0.005 * t}};
  };
  path.shaken = [rests, intended = path.intended](double t) {
    synthetic::camera_pose pose = intended(t);
    const double cycle = std::max(t - 1, 0.0) / 4;
    const auto k = static_cast<std::size_t>(cycle);
    const double u = std::min((cycle - static_cast<double>(k)) * 2, 1.0);
    const double part = u * u * (3 - 2 * u);
    for (std::size_t i = 0; i < 3; ++i) {
      pose.rotation[i] += rests[k][i] + part * (rests[k + 1][i] - rests[k][i]);
    }
    return pose;
  };
  return path;
}

class SceneFrames final : public SourceFrames<HX_Pixel8> {
 public:
  explicit SceneFrames(const synthetic::scene& scene) : scene_(scene) {}
  boost::shared_ptr<const Picture> Fetch(std::size_t frame) override {
    boost::shared_ptr<Picture>& world = drawn_[frame];
    if (!world) {
      world = boost::make_shared<Picture>(kWidth, kHeight);
      scene_.render(static_cast<int>(frame), world->data(), kWidth);
    }
    return world;
  }

 private:
  const synthetic::scene& scene_;
  std::map<std::size_t, boost::shared_ptr<Picture>> drawn_;
};

// Of the colours, where both are opaque.
double Psnr(const Picture& a, const Picture& b) {
  double sum = 0, count = 0;
  for (int y = 0; y < a.height(); ++y) {
    for (int x = 0; x < a.width(); ++x) {
      const HX_Pixel8 &p = a.row(y)[x], &q = b.row(y)[x];
      if (p.alpha != 255 || q.alpha != 255) continue;
      for (const int d : {p.red - q.red, p.green - q.green, p.blue - q.blue}) sum += d * d;
      count += 3;
    }
  }
  return 10 * std::log10(255 * 255 * count / sum);
}

TEST(Deblur, EveryFourthFrameComesCloserToTheSharpTruth) {
  synthetic::scene_options options;
  options.width = kWidth;
  options.height = kHeight;
  options.frame_count = kFrames;
  const synthetic::scene sharp(synthetic::street(3), KnockedPath(), options);
  options.exposure = [](int frame) { return frame % 4 == 2 ? 0.8 : 0.0; };
  const synthetic::scene shot(synthetic::street(3), KnockedPath(), options);

  kelp::effect::Controls controls;
  controls.framing = Framing::synthesize_edges;
  kelp::effect::ClipGeometry clip;
  clip.width = kWidth;
  clip.height = kHeight;
  marrow::tracking::AllFeatures features;
  synthetic::scene_frame_source tracked(shot);
  TrackFrames(tracked, MakeSelectorParams(controls, clip), MakeTrackerParams(controls, clip),
              features);
  Solver solver(kWidth, kHeight, features, kMargin, MakeSolverParams(controls, clip), false);
  solver.Start();
  solver.Wait();
  ASSERT_EQ(solver.GetState(), Solver::finished);

  const CPWarperWarps warps(solver.GetWarper());
  Renderer renderer = MakeRenderer(warps, 1, 1);
  RenderSettings settings;
  settings.framing = Framing::synthesize_edges;
  SceneFrames sharp_frames(sharp), shot_frames(shot);
  const auto render = [&](SceneFrames& frames, std::size_t frame, const DeblurSettings& deblur) {
    settings.deblur = deblur;
    const OutputRect rect = setupOutputRect(settings.framing, renderer, kWidth, kHeight);
    Picture output(rect.width, rect.height);
    HostOperations<HX_Pixel8> operations;
    renderFrame(warps, nullptr, settings, renderer, frame, frames, operations, output);
    return output;
  };

  DeblurSettings deblur;  // as it is when it is switched on
  deblur.range = 3;
  double gained = 0;
  int treated = 0;
  for (std::size_t f = 0; f < kFrames; ++f) {
    const Picture plain = render(shot_frames, f, {}), better = render(shot_frames, f, deblur);
    const bool same =
        std::memcmp(plain.data(), better.data(),
                    sizeof(HX_Pixel8) * static_cast<std::size_t>(plain.width() * plain.height())) ==
        0;
    EXPECT_EQ(same, f % 4 != 2) << "frame " << f;
    if (f % 4 != 2) continue;
    const Picture truth = render(sharp_frames, f, {});
    gained += Psnr(better, truth) - Psnr(plain, truth);
    RecordProperty("psnr_" + std::to_string(f), std::to_string(Psnr(plain, truth)) + " to " +
                                                    std::to_string(Psnr(better, truth)));
    ++treated;
  }
  EXPECT_EQ(treated, kFrames / 4);
  EXPECT_GT(gained / treated, 1.0) << "dB";
  RecordProperty("gain", std::to_string(gained / treated));
}

}  // namespace
}  // namespace calmframe::pipeline
