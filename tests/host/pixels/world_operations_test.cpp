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

// Plain access, a pixel at a time.
Colour Get(const WorldBuffer& buffer, int x, int y) {
  const std::uint32_t format = buffer.world().format;
  Colour colour{};
  for (int c = 0; c < 4; ++c) {
    const int at = x * 4 + (format == HX_FORMAT_BGRA8 ? 3 - c : c);
    const double value = format == HX_FORMAT_ARGBF    ? double{buffer.row<float>(y)[at]}
                         : format == HX_FORMAT_ARGB16 ? buffer.row<std::uint16_t>(y)[at]
                                                      : buffer.row<std::uint8_t>(y)[at];
    colour[c] = value / Full(format);
  }
  return colour;
}

void Put(WorldBuffer& buffer, int x, int y, const Colour& colour) {
  const std::uint32_t format = buffer.world().format;
  for (int c = 0; c < 4; ++c) {
    const int at = x * 4 + (format == HX_FORMAT_BGRA8 ? 3 - c : c);
    const double value = colour[c] * Full(format);
    if (format == HX_FORMAT_ARGBF) {
      buffer.row<float>(y)[at] = static_cast<float>(value);
    } else if (format == HX_FORMAT_ARGB16) {
      buffer.row<std::uint16_t>(y)[at] = static_cast<std::uint16_t>(std::lround(value));
    } else {
      buffer.row<std::uint8_t>(y)[at] = static_cast<std::uint8_t>(std::lround(value));
    }
  }
}

// Alphas of 0 and 1 among others.
void Fill(WorldBuffer& buffer, unsigned seed) {
  std::mt19937 random(seed);
  std::uniform_real_distribution<double> value(0, 1);
  for (int y = 0; y < buffer.world().height; ++y) {
    for (int x = 0; x < buffer.world().width; ++x) {
      const double alpha = std::clamp(value(random) * 2 - 0.5, 0.0, 1.0);
      Put(buffer, x, y, {alpha, value(random), value(random), value(random)});
    }
  }
}

Colour InFront(const Colour& s, const Colour& d) {
  const double a = s[0] + d[0] * (1 - s[0]);
  if (a == 0) return {};
  Colour result{a};
  for (int c = 1; c < 4; ++c) result[c] = (s[c] * s[0] + d[c] * d[0] * (1 - s[0])) / a;
  return result;
}

TEST(Transfer, ComposesAllFormatsClippedAsTheFormulaTells) {
  for (const std::uint32_t from_format : kFormats) {
    for (const std::uint32_t to_format : kFormats) {
      for (const int mode : {HX_TRANSFER_BEHIND, HX_TRANSFER_IN_FRONT}) {
        WorldBuffer from(7, 6, from_format, 12), to(9, 5, to_format, 8), before(9, 5, to_format);
        Fill(from, 1);
        Fill(to, 2);
        Fill(before, 2);
        // Half opaque in front, told in the word that the target's depth reads.
        const bool half = mode == HX_TRANSFER_IN_FRONT;
        const double opacity = half ? 0.5 : 1.0;
        const HX_TransferMode record = {mode, 0, static_cast<std::uint8_t>(half ? 0 : 255), 0,
                                        static_cast<std::uint16_t>(half ? 16384 : 32768)};
        const bool deep = to_format == HX_FORMAT_ARGB16 || to_format == HX_FORMAT_ARGBF;
        HX_TransferMode used = record;
        if (half && !deep) used.opacity = 51, used.opacity_u16 = 1;  // a fifth
        const double factor = half && !deep ? 0.2 : opacity;
        ASSERT_EQ(Transfer(from.world(), used, -2, 1, to.world()), 0);
        const double step = deep ? 1e-4 : 0.5 / 255 + 1e-6;
        for (int y = 0; y < 5; ++y) {
          for (int x = 0; x < 9; ++x) {
            Colour expected = Get(before, x, y);
            const bool inside = x < 5 && y >= 1;
            if (inside) {
              Colour s = Get(from, x + 2, y - 1);
              s[0] *= factor;
              expected = half ? InFront(s, expected) : InFront(expected, s);
            }
            const Colour found = Get(to, x, y);
            for (int c = 0; c < 4; ++c) {
              ASSERT_NEAR(found[c], expected[c], inside ? step : 0)
                  << mode << " " << x << " " << y << " " << c;
            }
          }
        }
        EXPECT_TRUE(to.PaddingIntact());
      }
    }
  }
  WorldBuffer world(1, 1, HX_FORMAT_ARGB8);
  EXPECT_NE(Transfer(world.world(), {3, 0, 255, 0, 32768}, 0, 0, world.world()), 0);
}

// Longer and shorter runs of clear, opaque and other pixels; floats beyond any picture's.
void FillRuns(WorldBuffer& buffer, unsigned seed) {
  std::mt19937 random(seed);
  std::uniform_real_distribution<double> value(0, 1);
  const bool is_float = buffer.world().format == HX_FORMAT_ARGBF;
  for (int y = 0; y < buffer.world().height; ++y) {
    for (int x = 0; x < buffer.world().width;) {
      const unsigned kind = random() % 4;
      for (unsigned i = 1 + random() % (y % 2 ? 90 : 4); i > 0 && x < buffer.world().width; --i) {
        const double alpha = kind == 0 ? 0 : kind == 1 ? 1 : value(random);
        Put(buffer, x, y, {alpha, value(random), value(random), value(random)});
        if (is_float && random() % 20 == 0) buffer.row<float>(y)[4 * x + 1] = 7;
        if (is_float && random() % 50 == 0) buffer.row<float>(y)[4 * x] = random() % 2 ? -1 : 2;
        ++x;
      }
    }
  }
}

TEST(Transfer, RunsThatNeedNoArithmeticAreExactAndTheOthersAsPixelByPixel) {
  const int width = 301, height = 20;
  for (const std::uint32_t format : kFormats) {
    for (const int mode : {HX_TRANSFER_BEHIND, HX_TRANSFER_IN_FRONT}) {
      for (const bool full : {true, false}) {
        SCOPED_TRACE(testing::Message() << format << " " << mode << " " << full);
        WorldBuffer from(width, height, format, 12), to(width, height, format, 8);
        WorldBuffer single(width, height, format);
        FillRuns(from, 1);
        FillRuns(to, 2);
        FillRuns(single, 2);
        const HX_TransferMode record = {mode, 0, static_cast<std::uint8_t>(full ? 255 : 100), 0,
                                        static_cast<std::uint16_t>(full ? 32768 : 10000)};
        ASSERT_EQ(Transfer(from.world(), record, 0, 0, to.world()), 0);
        const bool is_float = format == HX_FORMAT_ARGBF;
        const auto opacity =
            static_cast<float>(full                                     ? 1.0
                               : is_float || format == HX_FORMAT_ARGB16 ? 10000 / 32768.0
                                                                        : 100 / 255.0);
        for (int y = 0; y < height; ++y) {
          for (int x = 0; x < width; ++x) {
            const Colour s = Get(from, x, y), d = Get(single, x, y), found = Get(to, x, y);
            if (d[0] != 0 && (s[0] == 0 || (d[0] == 1 && mode == HX_TRANSFER_BEHIND))) {
              ASSERT_EQ(found, d);
            } else if (full && s[0] > 0 &&
                       (d[0] == 0 || (s[0] == 1 && mode == HX_TRANSFER_IN_FRONT))) {
              ASSERT_EQ(found, s);
            } else {
              // In the floats of the formula.
              float front[4], back[4];
              for (int c = 0; c < 4; ++c) {
                front[c] = static_cast<float>(mode == HX_TRANSFER_BEHIND ? d[c] : s[c]);
                back[c] = static_cast<float>(mode == HX_TRANSFER_BEHIND ? s[c] : d[c]);
              }
              (mode == HX_TRANSFER_BEHIND ? back : front)[0] *= opacity;
              const float behind = back[0] * (1.0f - front[0]), alpha = front[0] + behind;
              Colour expected{alpha};
              for (int c = 1; c < 4; ++c) {
                expected[c] = (front[c] * front[0] + back[c] * behind) / alpha;
              }
              if (!(alpha > 0)) expected = {};
              for (int c = 0; c < 4; ++c) {
                ASSERT_NEAR(found[c], expected[c], is_float ? 0 : 0.5 / Full(format) + 1e-6)
                    << x << " " << y << " " << c;
              }
            }
          }
        }
        EXPECT_TRUE(to.PaddingIntact());
      }
    }
  }
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
  WorldBuffer wild(3, 1, HX_FORMAT_ARGBF);
  wild.row<float>(0)[0] = 7.5f;
  wild.row<float>(0)[4] = -1.0f;
  wild.row<float>(0)[8] = NAN;
  CopyWorld(wild.world(), back.world(), nullptr, nullptr);  // scales; now at one size
  WorldBuffer clamped(3, 1, HX_FORMAT_ARGB16);
  CopyWorld(wild.world(), clamped.world(), nullptr, nullptr);
  EXPECT_EQ(clamped.row<HX_Pixel16>(0)[0].alpha, 32768);
  EXPECT_EQ(clamped.row<HX_Pixel16>(0)[1].alpha, 0);
  EXPECT_EQ(clamped.row<HX_Pixel16>(0)[2].alpha, 0);
}

TEST(CopyWorld, ShrinksByAreaWithColoursWeightedByAlpha) {
  WorldBuffer from(3, 2, HX_FORMAT_ARGBF), to(2, 1, HX_FORMAT_ARGBF);
  Put(from, 0, 0, {1, 0.2, 0, 0});
  Put(from, 1, 0, {1, 0.8, 0, 0});
  Put(from, 2, 0, {0, 1, 0, 0});
  Put(from, 0, 1, {1, 0.2, 0, 0});
  Put(from, 1, 1, {1, 0.8, 0, 0});
  Put(from, 2, 1, {1, 0.5, 0, 0});
  ASSERT_EQ(CopyWorld(from.world(), to.world(), nullptr, nullptr), 0);
  // Each target pixel covers 1.5 columns: two thirds of one, a third of the middle one.
  EXPECT_NEAR(Get(to, 0, 0)[1], (0.2 * 2 + 0.8) / 3, 1e-6);
  EXPECT_NEAR(Get(to, 0, 0)[0], 1, 1e-6);
  // Right: alpha (2/3 * 1/2 + 1/3), red of what is opaque.
  EXPECT_NEAR(Get(to, 1, 0)[0], 2.0 / 3, 1e-6);
  EXPECT_NEAR(Get(to, 1, 0)[1], (0.8 / 3 + 0.5 / 3) / (2.0 / 3), 1e-6);
}

TEST(CopyWorld, GrowsLinearlyBetweenPixelCentres) {
  WorldBuffer from(2, 1, HX_FORMAT_ARGBF), to(4, 1, HX_FORMAT_ARGBF);
  Put(from, 0, 0, {1, 0, 0, 0});
  Put(from, 1, 0, {1, 1, 0, 0});
  CopyWorld(from.world(), to.world(), nullptr, nullptr);
  const double expected[] = {0, 0.25, 0.75, 1};
  for (int x = 0; x < 4; ++x) EXPECT_NEAR(Get(to, x, 0)[1], expected[x], 1e-6);
}

TEST(Blur, IsAGaussianOfHalfTheRadiusWithEdgesRepeated) {
  for (const std::uint32_t format : kFormats) {
    WorldBuffer from(21, 15, format), to(21, 15, format, 4);
    for (int y = 0; y < 15; ++y) {
      for (int x = 0; x < 21; ++x) Put(from, x, y, {1, x == 10 && y == 7 ? 1.0 : 0.0, 0.4, 0});
    }
    ASSERT_EQ(Blur(from.world(), to.world(), 3.0f), 0);
    double sum = 0;
    for (int y = 0; y < 15; ++y) {
      for (int x = 0; x < 21; ++x) {
        const Colour found = Get(to, x, y);
        sum += found[1];
        EXPECT_NEAR(found[0], 1, 1e-3);
        EXPECT_NEAR(found[2], 0.4, 3e-3);
        // Sampled at the pixels, sigma 1.5: the sum of the samples is 1.5 sqrt(2 pi) to 1e-9.
        const double d2 = (x - 10) * (x - 10) + (y - 7) * (y - 7);
        const double weight = std::exp(-d2 / 4.5) / (4.5 * M_PI);
        EXPECT_NEAR(found[1], weight, format == HX_FORMAT_ARGBF ? 5e-4 : 3e-3);
      }
    }
    if (format == HX_FORMAT_ARGBF) {
      EXPECT_NEAR(sum, 1, 1e-4);
    }
    ASSERT_EQ(Blur(from.world(), to.world(), 0.0f), 0);
    EXPECT_EQ(Get(to, 10, 7), Get(from, 10, 7));
  }
}

// Sizes that a kernel, a band of rows or a vector doesn't divide, and kernels wider than a frame.
TEST(Blur, IsTheSumOverItsSquareAtEveryPixel) {
  const struct {
    int width, height;
    float radius;
  } cases[] = {{37, 150, 5.3f}, {5, 3, 16.0f}, {1, 9, 2.0f}};
  for (const auto& c : cases) {
    WorldBuffer from(c.width, c.height, HX_FORMAT_ARGBF, 8), to(c.width, c.height, HX_FORMAT_ARGBF);
    for (int y = 0; y < c.height; ++y) {
      for (int x = 0; x < c.width; ++x) {
        Put(from, x, y, {(x * 7 + y) % 5 / 4.0, (x * y) % 11 / 5.0 - 1, (x + 3 * y) % 7 / 6.0, 1});
      }
    }
    const double sigma = c.radius / 2.0;
    const int reach = static_cast<int>(std::ceil(3 * sigma));
    const auto at = [&](int x, int y) {
      return Get(from, std::clamp(x, 0, c.width - 1), std::clamp(y, 0, c.height - 1));
    };
    ASSERT_EQ(Blur(from.world(), to.world(), c.radius), 0);
    for (int y = 0; y < c.height; ++y) {
      for (int x = 0; x < c.width; x += 3) {
        Colour sum{};
        double weights = 0;
        for (int v = -reach; v <= reach; ++v) {
          for (int u = -reach; u <= reach; ++u) {
            const double w = std::exp(-0.5 * (u * u + v * v) / (sigma * sigma));
            const Colour p = at(x + u, y + v);
            for (std::size_t i = 0; i < 4; ++i) sum[i] += w * p[i];
            weights += w;
          }
        }
        for (std::size_t i = 0; i < 4; ++i) {
          ASSERT_NEAR(Get(to, x, y)[i], sum[i] / weights, 2e-6) << x << ", " << y;
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
  const auto colour = [](double hue, double lightness, double saturation) {
    const std::int32_t hls[3] = {static_cast<std::int32_t>(hue * 65536),
                                 static_cast<std::int32_t>(lightness * 65536),
                                 static_cast<std::int32_t>(saturation * 65536)};
    const HX_Pixel8 rgb = ColourOfHls(hls);
    return std::array<int, 4>{rgb.alpha, rgb.red, rgb.green, rgb.blue};
  };
  using Rgb = std::array<int, 4>;
  EXPECT_EQ(colour(0, 1, 1), (Rgb{255, 255, 0, 0}));
  EXPECT_EQ(colour(1.0 / 4, 1, 1), (Rgb{255, 128, 255, 0}));
  EXPECT_EQ(colour(0.5, 1, 1), (Rgb{255, 0, 255, 255}));
  EXPECT_EQ(colour(0.75, 1, 1), (Rgb{255, 128, 0, 255}));
  EXPECT_EQ(colour(1, 1, 1), (Rgb{255, 255, 0, 0}));
  EXPECT_EQ(colour(0.5, 0.5, 0.5), (Rgb{255, 64, 128, 128}));
  EXPECT_EQ(colour(0.3, 1, 0), (Rgb{255, 255, 255, 255}));
}

}  // namespace
}  // namespace calmframe::host
