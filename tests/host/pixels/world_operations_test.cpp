#include "host/pixels/world_operations.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <cstdint>
#include <random>
#include <vector>

#include "host/pixels/world_buffer.h"

namespace calmframe::host {
namespace {

constexpr std::array<std::uint32_t, 4> kFormats = {HX_FORMAT_ARGB8, HX_FORMAT_BGRA8,
                                                   HX_FORMAT_ARGB16, HX_FORMAT_ARGBF};

using Colour = std::array<double, 4>;  // alpha, red, green, blue

double Full(std::uint32_t format) {
  return format == HX_FORMAT_ARGB16 ? 32768.0 : format == HX_FORMAT_ARGBF ? 1.0 : 255.0;
}

// Calls use(channel, sample) with the samples of a pixel, whatever their kind and order.
template <class Buffer, class Use>
void EachSample(Buffer& buffer, int x, int y, const Use& use) {
  const std::uint32_t format = buffer.world().format;
  for (int c = 0; c < 4; ++c) {
    const int at = x * 4 + (format == HX_FORMAT_BGRA8 ? 3 - c : c);
    if (format == HX_FORMAT_ARGBF) {
      use(c, buffer.template row<float>(y)[at]);
    } else if (format == HX_FORMAT_ARGB16) {
      use(c, buffer.template row<std::uint16_t>(y)[at]);
    } else {
      use(c, buffer.template row<std::uint8_t>(y)[at]);
    }
  }
}

Colour Get(const WorldBuffer& buffer, int x, int y) {
  Colour colour{};
  const double full = Full(buffer.world().format);
  EachSample(buffer, x, y, [&](int c, auto sample) { colour[c] = sample / full; });
  return colour;
}

void Put(WorldBuffer& buffer, int x, int y, const Colour& colour) {
  const double full = Full(buffer.world().format);
  EachSample(buffer, x, y, [&](int c, auto& sample) {
    const double value = full == 1 ? colour[c] : std::round(colour[c] * full);
    sample = static_cast<std::decay_t<decltype(sample)>>(value);
  });
}

// Longer and shorter runs of clear, opaque and other pixels; `wild`: floats beyond any picture's.
void Fill(WorldBuffer& buffer, unsigned seed, bool wild = false) {
  std::mt19937 random(seed);
  std::uniform_real_distribution<double> value(0, 1);
  for (int y = 0; y < buffer.world().height; ++y) {
    for (int x = 0; x < buffer.world().width;) {
      const unsigned kind = random() % 4;
      for (unsigned i = 1 + random() % (y % 2 ? 90 : 4); i > 0 && x < buffer.world().width; --i) {
        const double alpha = kind == 0 ? 0 : kind == 1 ? 1 : value(random);
        Put(buffer, x, y, {alpha, value(random), value(random), value(random)});
        if (wild && random() % 20 == 0) buffer.row<float>(y)[4 * x + 1] = 7;
        if (wild && random() % 50 == 0) buffer.row<float>(y)[4 * x] = random() % 2 ? -1 : 2;
        ++x;
      }
    }
  }
}

// s in front of d, in the floats of the formula.
Colour InFront(const Colour& s, const Colour& d, float opacity_s, float opacity_d) {
  const float front = static_cast<float>(s[0]) * opacity_s;
  const float behind = static_cast<float>(d[0]) * opacity_d * (1.0f - front);
  const float alpha = front + behind;
  if (!(alpha > 0)) return {};
  Colour result{alpha};
  for (int c = 1; c < 4; ++c) {
    result[c] = (static_cast<float>(s[c]) * front + static_cast<float>(d[c]) * behind) / alpha;
  }
  return result;
}

TEST(Transfer, WhatNeedsNoArithmeticIsExactAndAllElseAsTheFormulaTells) {
  for (int i = 0; i < 64; ++i) {
    const std::uint32_t from_format = kFormats[i % 4], to_format = kFormats[i / 4 % 4];
    const bool in_front = i / 16 % 2, full = i / 32, same = from_format == to_format;
    const bool is_float = to_format == HX_FORMAT_ARGBF;
    SCOPED_TRACE(testing::Message() << from_format << " on " << to_format << " " << in_front);
    WorldBuffer from(301, 9, from_format, 12), to(303, 8, to_format, 8), before(303, 8, to_format);
    Fill(from, 1, same && is_float);
    Fill(to, 2, same && is_float);
    Fill(before, 2, same && is_float);
    const HX_TransferMode mode = {in_front ? HX_TRANSFER_IN_FRONT : HX_TRANSFER_BEHIND, 0,
                                  static_cast<std::uint8_t>(full ? 255 : 100), 0,
                                  static_cast<std::uint16_t>(full ? 32768 : 10000)};
    ASSERT_EQ(Transfer(from.world(), mode, -2, 1, to.world()), 0);
    const float opacity = full ? 1.0f : Full(to_format) == 255 ? 100 / 255.0f : 10000 / 32768.0f;
    for (int y = 0; y < 8; ++y) {
      for (int x = 0; x < 303; ++x) {
        const Colour d = Get(before, x, y), found = Get(to, x, y);
        const bool inside = x < 299 && y >= 1;
        const Colour s = inside ? Get(from, x + 2, y - 1) : Colour{};
        if (!inside || (d[0] != 0 && (s[0] == 0 || (d[0] == 1 && !in_front)))) {
          ASSERT_EQ(found, d) << x << " " << y;
        } else if (same && full && s[0] > 0 && (d[0] == 0 || (s[0] == 1 && in_front))) {
          ASSERT_EQ(found, s) << x << " " << y;
        } else {
          const Colour expected = in_front ? InFront(s, d, opacity, 1) : InFront(d, s, 1, opacity);
          const double step = !is_float ? 0.5 / Full(to_format) + 1e-6 : same ? 0 : 1e-6;
          for (int c = 0; c < 4; ++c) {
            ASSERT_NEAR(found[c], expected[c], step) << x << " " << y << " " << c;
          }
        }
      }
    }
    EXPECT_TRUE(to.PaddingIntact());
  }
  WorldBuffer world(1, 1, HX_FORMAT_ARGB8);
  EXPECT_NE(Transfer(world.world(), {3, 0, 255, 0, 32768}, 0, 0, world.world()), 0);
}

TEST(CopyWorld, MovesAndClipsWithoutChange) {
  WorldBuffer from(6, 4, HX_FORMAT_ARGB16, 4), to(5, 5, HX_FORMAT_ARGB16, 4);
  Fill(from, 3);
  const HX_Rect source = {1, 0, 6, 4}, target = {-1, 2, 4, 6};
  ASSERT_EQ(CopyWorld(from.world(), to.world(), &source, &target), 0);
  for (int y = 0; y < 5; ++y) {
    for (int x = 0; x < 5; ++x) {
      const bool inside = x < 4 && y >= 2;
      EXPECT_EQ(Get(to, x, y), inside ? Get(from, x + 2, y - 2) : Colour{}) << x << " " << y;
    }
  }
  EXPECT_TRUE(to.PaddingIntact());
  const HX_Rect far = {100, 100, 106, 104};
  EXPECT_EQ(CopyWorld(from.world(), to.world(), nullptr, &far), 0);
  HX_World nothing{};
  EXPECT_NE(CopyWorld(nothing, to.world(), nullptr, nullptr), 0);
}

TEST(CopyWorld, ConvertsThereAndBackWithoutLoss) {
  WorldBuffer bytes(256, 1, HX_FORMAT_ARGB8), back(256, 1, HX_FORMAT_ARGB8);
  for (int i = 0; i < 256; ++i) Put(bytes, i, 0, {i / 255.0, 1 - i / 255.0, 0, 1});
  for (const std::uint32_t format : kFormats) {
    WorldBuffer other(256, 1, format);
    CopyWorld(bytes.world(), other.world(), nullptr, nullptr);
    EXPECT_NEAR(Get(other, 128, 0)[0], 128 / 255.0, 0.5 / Full(format) + 1e-7);
    CopyWorld(other.world(), back.world(), nullptr, nullptr);
    for (int i = 0; i < 256; ++i) ASSERT_EQ(Get(back, i, 0), Get(bytes, i, 0)) << format;
  }
  for (const auto& [wild, clamped] : {std::pair{7.5f, 32768}, {-1.0f, 0}, {NAN, 0}}) {
    WorldBuffer from(1, 1, HX_FORMAT_ARGBF), to(1, 1, HX_FORMAT_ARGB16);
    *from.row<float>(0) = wild;
    CopyWorld(from.world(), to.world(), nullptr, nullptr);
    EXPECT_EQ(to.row<HX_Pixel16>(0)->alpha, clamped);
  }
}

TEST(CopyWorld, ShrinksByAreaWeightedByAlphaAndGrowsLinearlyBetweenPixelCentres) {
  WorldBuffer from(3, 2, HX_FORMAT_ARGBF), to(2, 1, HX_FORMAT_ARGBF), wide(4, 1, HX_FORMAT_ARGBF);
  const Colour colours[] = {{1, 0.2}, {1, 0.8}, {0, 1}, {1, 0.2}, {1, 0.8}, {1, 0.5}};
  for (int i = 0; i < 6; ++i) Put(from, i % 3, i / 3, colours[i]);
  ASSERT_EQ(CopyWorld(from.world(), to.world(), nullptr, nullptr), 0);
  // Each target pixel covers 1.5 columns: two thirds of one, a third of the middle one.
  EXPECT_NEAR(Get(to, 0, 0)[1], (0.2 * 2 + 0.8) / 3, 1e-6);
  EXPECT_NEAR(Get(to, 0, 0)[0], 1, 1e-6);
  // Right: alpha (2/3 * 1/2 + 1/3), red of what is opaque.
  EXPECT_NEAR(Get(to, 1, 0)[0], 2.0 / 3, 1e-6);
  EXPECT_NEAR(Get(to, 1, 0)[1], (0.8 / 3 + 0.5 / 3) / (2.0 / 3), 1e-6);
  for (const int x : {0, 1}) Put(to, x, 0, {1, x / 1.0});
  CopyWorld(to.world(), wide.world(), nullptr, nullptr);
  const double expected[] = {0, 0.25, 0.75, 1};
  for (int x = 0; x < 4; ++x) EXPECT_NEAR(Get(wide, x, 0)[1], expected[x], 1e-6);
}

// Sizes that a kernel, a band of rows or a vector doesn't divide, and kernels wider than a frame;
// edges are repeated.
TEST(Blur, IsTheGaussianSumOverItsSquareAtEveryPixel) {
  const struct {
    int width, height;
    float radius;
    std::uint32_t format;
  } cases[] = {{37, 150, 5.3f, HX_FORMAT_ARGBF}, {5, 3, 16.0f, HX_FORMAT_ARGBF},
               {1, 9, 2.0f, HX_FORMAT_ARGBF},    {21, 15, 3.0f, HX_FORMAT_ARGB8},
               {21, 15, 3.0f, HX_FORMAT_BGRA8},  {21, 15, 3.0f, HX_FORMAT_ARGB16},
               {21, 15, 0.0f, HX_FORMAT_ARGB16}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.width << " " << c.radius << " " << c.format);
    WorldBuffer from(c.width, c.height, c.format, 8), to(c.width, c.height, c.format);
    const double wild = c.format == HX_FORMAT_ARGBF ? 5.0 : 10.0;  // floats beyond full ones
    for (int y = 0; y < c.height; ++y) {
      for (int x = 0; x < c.width; ++x) {
        Put(from, x, y, {(x * 7 + y) % 5 / 4.0, (x * y) % 11 / wild, (x + 3 * y) % 7 / 6.0, 1});
      }
    }
    const double sigma = c.radius / 2.0;
    const int reach = static_cast<int>(std::ceil(3 * sigma));
    ASSERT_EQ(Blur(from.world(), to.world(), c.radius), 0);
    for (int y = 0; y < c.height; ++y) {
      for (int x = 0; x < c.width; x += 3) {
        Colour sum{};
        double weights = 0;
        for (int v = -reach; v <= reach; ++v) {
          for (int u = -reach; u <= reach; ++u) {
            const double w = reach ? std::exp(-0.5 * (u * u + v * v) / (sigma * sigma)) : 1;
            const Colour p =
                Get(from, std::clamp(x + u, 0, c.width - 1), std::clamp(y + v, 0, c.height - 1));
            for (std::size_t i = 0; i < 4; ++i) sum[i] += w * p[i];
            weights += w;
          }
        }
        const double step = wild == 5.0 ? 2e-6 : 0.5 / Full(c.format) + 2e-6;
        for (std::size_t i = 0; i < 4; ++i) {
          ASSERT_NEAR(Get(to, x, y)[i], sum[i] / weights, step) << x << ", " << y;
        }
      }
    }
    EXPECT_TRUE(from.PaddingIntact());
    ASSERT_EQ(Blur(from.world(), from.world(), c.radius), 0);
    for (int y = 0; y < c.height; ++y) {
      for (int x = 0; x < c.width; ++x) ASSERT_EQ(Get(from, x, y), Get(to, x, y)) << "in place";
    }
  }
}

TEST(ColourOfHls, LightnessIsTheBrightestComponent) {
  constexpr std::int32_t kOne = 1 << 16, kHalf = kOne / 2, kQuarter = kOne / 4;
  const struct {
    std::int32_t hls[3];
    std::array<int, 4> argb;
  } cases[] = {{{0, kOne, kOne}, {255, 255, 0, 0}},
               {{kQuarter, kOne, kOne}, {255, 128, 255, 0}},
               {{kHalf, kOne, kOne}, {255, 0, 255, 255}},
               {{kHalf + kQuarter, kOne, kOne}, {255, 128, 0, 255}},
               {{kOne, kOne, kOne}, {255, 255, 0, 0}},
               {{kHalf, kHalf, kHalf}, {255, 64, 128, 128}},
               {{kOne * 3 / 10, kOne, 0}, {255, 255, 255, 255}}};
  for (const auto& c : cases) {
    const HX_Pixel8 found = ColourOfHls(c.hls);
    EXPECT_EQ((std::array<int, 4>{found.alpha, found.red, found.green, found.blue}), c.argb);
  }
}

}  // namespace
}  // namespace calmframe::host
