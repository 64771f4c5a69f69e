#include "host/shots/shot_finder.h"

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <vector>

#include "synthetic/film.h"
#include "synthetic/random.h"

namespace calmframe::host {
namespace {

constexpr int kFilmWidth = 128, kFilmHeight = 72;

using Pixels = std::vector<HX_Pixel8>;

// A street, shaken, from a camera turned aside by `aside` radians.
// `lorry`: a board half as wide as the frame crosses it within so many frames.
synthetic::scene Street(int seed, double aside = 0, const std::vector<int>& whip_pans = {},
                        int lorry = 0) {
  synthetic::scene_options options;
  options.width = kFilmWidth;
  options.height = kFilmHeight;
  options.noise = 2;
  options.gain = 0.03;
  options.seed = static_cast<std::uint64_t>(seed);
  options.occluder = lorry > 0;
  options.frame_count = lorry;
  options.exposure = [=](int frame) {
    for (const int start : whip_pans) {
      if (frame >= start && frame <= start + 8) return 0.5;
    }
    return 0.0;
  };
  synthetic::handheld_path_options hand;
  hand.seed = static_cast<std::uint64_t>(100 + seed);
  hand.pan = 0.2;
  synthetic::camera_path path =
      synthetic::with_whip_pans(synthetic::handheld_path(hand), {-9}, 1, aside);
  return {synthetic::street(static_cast<std::uint64_t>(seed)),
          synthetic::with_whip_pans(path, whip_pans, 8, 1.4), options};
}

struct Told {
  ShotBorder border;
  std::int64_t behind;  // frames that were added behind its last
};

std::vector<Told> Find(int frames, const std::function<Pixels(int)>& frame) {
  ShotFinder finder({30});
  std::vector<Told> all;
  const auto take = [&](int added) {
    for (const ShotBorder& border : finder.Take()) {
      all.push_back({border, added - 1 - border.last});
    }
  };
  for (int f = 0; f < frames; ++f) {
    const Pixels pixels = frame(f);
    finder.Add(DigestOf(ArgbView{pixels.data(), kFilmWidth * 4, kFilmWidth, kFilmHeight}));
    take(f + 1);
  }
  finder.Finish();
  take(frames);
  return all;
}

TEST(ShotFinderTest, ADrawnFilm) {
  const synthetic::scene one = Street(1), two = Street(2, 1.2), three = Street(3, -0.8),
                         whipped = Street(4, 0.3, {16}), aside = Street(1, 0.5);
  const synthetic::film film(
      {
          {&one, 0, 6},                 // 0
          {&two, 0, 5},                 // 6
          {&three, 50, 24},             // 11, a flash at 20
          {&aside, 0, 22},              // 35, the street of the first
          {&one, 90, 30},               // 57, near where that was; a flash at 66
          {&two, 200, 26, 20},          // 87: 20 mixed, then 26 at 107
          {&whipped, 0, 40},            // 133, a whip pan at 149
          {&three, 300, 24, 13, true},  // 173: 13 by way of black, then 24 at 186
          {&one, 400, 8},               // 210
          {&aside, 500, 26, 32},        // 218: 32 mixed, then 26 at 250
      },
      {{20, 1, 2.2, 60}, {66, 4, 1.7, 40}});
  ASSERT_EQ(film.frame_count(), 276);
  const ShotBorder expected[] = {
      {6, 6, 6, ShotBorder::Kind::cut},
      {11, 11, 11, ShotBorder::Kind::cut},
      {35, 35, 35, ShotBorder::Kind::cut},
      {57, 57, 57, ShotBorder::Kind::cut},
      {97, 87, 106, ShotBorder::Kind::dissolve},
      {133, 133, 133, ShotBorder::Kind::cut},
      {179, 173, 185, ShotBorder::Kind::fade},
      {210, 210, 210, ShotBorder::Kind::cut},
      {234, 218, 249, ShotBorder::Kind::dissolve},
  };
  std::vector<Told> told = Find(film.frame_count(), [&](int f) { return film.render(f); });
  std::sort(told.begin(), told.end(),
            [](const Told& a, const Told& b) { return a.border.frame < b.border.frame; });
  ASSERT_EQ(told.size(), std::size(expected));
  for (std::size_t i = 0; i < told.size(); ++i) {
    const ShotBorder& border = told[i].border;
    EXPECT_EQ(border.kind, expected[i].kind) << i;
    EXPECT_NEAR(border.frame, expected[i].frame, border.kind == ShotBorder::Kind::cut ? 0 : 3) << i;
    EXPECT_NEAR(border.first, expected[i].first, border.kind == ShotBorder::Kind::cut ? 0 : 6) << i;
    EXPECT_NEAR(border.last, expected[i].last, border.kind == ShotBorder::Kind::cut ? 0 : 6) << i;
    EXPECT_GE(border.confidence, 0.5);
    EXPECT_LE(border.confidence, 1);
    EXPECT_LE(told[i].behind, border.kind == ShotBorder::Kind::cut ? ShotFinder::kCutLag : 45) << i;
  }
}

// Thirty cuts, ten dissolves, two fades; in the shots ten flashes and stroboscopes, ten whip pans,
// ten lorries.
TEST(ShotFinderTest, ALongFilm) {
  constexpr int kShots = 43;
  std::vector<std::unique_ptr<synthetic::scene>> scenes;
  std::vector<synthetic::film_shot> shots;
  std::vector<synthetic::film_light> lights;
  std::vector<ShotBorder> expected;
  int frame = 0;
  for (int k = 0; k < kShots; ++k) {
    const bool fades = k == 21 || k == 42, mixed = fades || k % 4 == 2;
    const int frames = 20 + 7 * k % 17;
    const int length = fades ? 16 : mixed ? 8 + 7 * (k / 4) % 33 : 0;
    // Ahead of them lie the frames in which the shot comes up, behind those in which it goes.
    const std::vector<int> whips =
        k % 4 == 1 ? std::vector{length + frames / 2} : std::vector<int>();
    scenes.push_back(std::make_unique<synthetic::scene>(
        Street(10 + k, 0.4 * (k % 5 - 2), whips, k % 4 == 3 ? frames + length : 0)));
    shots.push_back({scenes.back().get(), 0, frames, length, fades});
    if (k > 0) {
      const ShotBorder::Kind kind = fades   ? ShotBorder::Kind::fade
                                    : mixed ? ShotBorder::Kind::dissolve
                                            : ShotBorder::Kind::cut;
      expected.push_back({frame + length / 2, frame, frame + std::max(length - 1, 0), kind});
    }
    frame += length;
    if (k % 4 == 0) {
      for (int flash = 0; flash <= k % 8 / 2; ++flash) {
        lights.push_back({frame + 8 + 4 * flash, 1 + k % 3, 2.5, 60});
      }
    }
    frame += frames;
  }
  const synthetic::film film(shots, lights);
  const std::vector<Told> told = Find(film.frame_count(), [&](int f) { return film.render(f); });
  std::size_t next = 0;
  int dissolves = 0, found = 0;
  for (const ShotBorder& border : expected) {
    const bool is_cut = border.kind == ShotBorder::Kind::cut;
    const bool is_found = next < told.size() && border.first <= told[next].border.frame &&
                          told[next].border.frame <= border.last;
    if (border.kind == ShotBorder::Kind::dissolve) {
      ++dissolves;
      found += is_found;
    } else {
      EXPECT_TRUE(is_found) << border.frame;
    }
    if (!is_found) continue;
    EXPECT_EQ(told[next].border.kind, border.kind) << border.frame;
    EXPECT_TRUE(is_cut || told[next].behind < 60) << border.frame;
    ++next;
  }
  // Nothing else is told, and all is in order.
  EXPECT_EQ(next, told.size()) << "at " << told[std::min(next, told.size() - 1)].border.frame;
  EXPECT_GE(10 * found, 8 * dissolves) << found << " of " << dissolves;
}

// One shot in which something happens that is no cut.
TEST(ShotFinderTest, WhatIsNoBorder) {
  const synthetic::scene scene = Street(5);
  const synthetic::scene other = Street(6, 1);
  constexpr int kFrames = 44;
  std::vector<Pixels> shot;
  for (int f = 0; f < kFrames; ++f) shot.push_back(scene.render(f));
  const auto lit = [](Pixels pixels, double gain, double lift) {
    for (HX_Pixel8& p : pixels) {
      for (std::uint8_t* const v : {&p.red, &p.green, &p.blue}) {
        *v = static_cast<std::uint8_t>(std::min(255.0, gain * *v + lift));
      }
    }
    return pixels;
  };
  const auto with_box = [&](int f, int left, int top, int right, int bottom, const Pixels& inside) {
    Pixels pixels = shot[f];
    for (int y = std::max(top, 0); y < std::min(bottom, kFilmHeight); ++y) {
      for (int x = std::max(left, 0); x < std::min(right, kFilmWidth); ++x) {
        pixels[y * kFilmWidth + x] = inside[y * kFilmWidth + x];
      }
    }
    return pixels;
  };
  const Pixels grey(kFilmWidth * kFilmHeight, HX_Pixel8{255, 128, 128, 128});
  const Pixels black(kFilmWidth * kFilmHeight, HX_Pixel8{255, 0, 0, 0});
  const Pixels strange = other.render(0);
  const std::pair<const char*, std::function<Pixels(int)>> cases[] = {
      {"nothing", [&](int f) { return shot[f]; }},
      {"a flash", [&](int f) { return f >= 20 && f < 23 ? lit(shot[f], 2.5, 70) : shot[f]; }},
      {"a white flash", [&](int f) { return f >= 20 && f < 22 ? lit(shot[f], 0, 255) : shot[f]; }},
      {"a lamp", [&](int f) { return f >= 20 ? lit(shot[f], 1.7, 20) : shot[f]; }},
      {"a grey frame", [&](int f) { return f == 20 ? grey : shot[f]; }},
      {"a frame of another film", [&](int f) { return f == 20 ? strange : shot[f]; }},
      {"every second frame twice", [&](int f) { return shot[f / 3 * 2 + (f % 3 > 0 ? 1 : 0)]; }},
      {"a title",
       [&](int f) { return f >= 15 && f < 30 ? with_box(f, 10, 58, 118, 68, black) : shot[f]; }},
      {"a lorry",
       [&](int f) {
         const int left = (f - 12) * kFilmWidth / 7 - kFilmWidth / 2;
         return with_box(f, left, 12, left + kFilmWidth / 2, 66, strange);
       }},
      {"black at both ends", [&](int f) { return f < 6 || f >= 38 ? black : shot[f]; }},
      {"lines of two times",
       [&](int f) {
         Pixels woven = shot[f];
         const Pixels& next = shot[std::min(f + 1, kFrames - 1)];
         for (int i = 0; i < kFilmWidth * kFilmHeight; ++i) {
           if (i / kFilmWidth % 2 == 1) woven[i] = next[i];
         }
         return woven;
       }},
  };
  for (const auto& [name, frame] : cases) {
    for (const Told& told : Find(kFrames, frame)) {
      ADD_FAILURE() << name << ": " << told.border.frame << ", of kind "
                    << static_cast<int>(told.border.kind);
    }
  }
}

TEST(ShotFinderTest, FilmsOfFewFrames) {
  const synthetic::scene one = Street(1), two = Street(2, 1.2);
  for (const int before : {1, 2, 5}) {
    for (const int behind : {1, 2, 5}) {
      const auto told =
          Find(before + behind, [&](int f) { return f < before ? one.render(f) : two.render(f); });
      ASSERT_EQ(told.size(), 1u) << before << " " << behind;
      EXPECT_EQ(told[0].border.frame, before);
    }
  }
  EXPECT_TRUE(Find(0, {}).empty());
  EXPECT_TRUE(Find(1, [&](int f) { return one.render(f); }).empty());
}

}  // namespace
}  // namespace calmframe::host
