#include "host/media/deep_yuv.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <random>
#include <vector>

#include "tests/host/media/instruction_sets.h"

namespace calmframe::media {
namespace {

using Words = std::vector<std::uint16_t>;

constexpr std::uint16_t kUntouched = 0x5a5a;

template <class Pixel>
constexpr double kFull = std::is_same_v<Pixel, HX_Pixel16> ? 32768.0 : 1.0;

struct Model {
  AVColorSpace matrix;
  double red, blue;  // luma weights of the standard
  bool full_range;
  int depth;
};

constexpr Model kModels[] = {{AVCOL_SPC_BT709, 0.2126, 0.0722, false, 10},
                             {AVCOL_SPC_BT709, 0.2126, 0.0722, true, 10},
                             {AVCOL_SPC_SMPTE170M, 0.299, 0.114, true, 8},
                             {AVCOL_SPC_BT2020_NCL, 0.2627, 0.0593, false, 12}};

ColourModel ModelOf(const Model& model) {
  ColourModel made;
  made.matrix = model.matrix;
  made.full_range = model.full_range;
  return made;
}

// ITU-R BT.2100, table 9, in doubles: E' of code words and back.
struct Reference {
  explicit Reference(const Model& m)
      : model(m), full(((1 << m.depth) - 1) * std::pow(2.0, 16 - m.depth)) {}
  double Luma(double e) const { return model.full_range ? full * e : (219 * e + 16) * 256; }
  double Chroma(double e) const { return (model.full_range ? full : 224 * 256) * e + 32768; }
  double FromLuma(double code) const { return (code - Luma(0)) / (Luma(1) - Luma(0)); }
  double FromChroma(double code) const { return (code - 32768) / (Chroma(1) - 32768); }

  Model model;
  double full;
};

template <class Pixel>
Pixel At(double alpha, double red, double green, double blue) {
  const auto channel = [](double v) {
    return static_cast<decltype(Pixel::alpha)>(v * kFull<Pixel> + (kFull<Pixel> > 1 ? 0.5 : 0.0));
  };
  return {channel(alpha), channel(red), channel(green), channel(blue)};
}

template <class Pixel>
void ExpectNear(const Pixel& pixel, double alpha, double red, double green, double blue) {
  const auto expect = [](double value, double expected) {
    const double step = kFull<Pixel> > 1 ? 0.51 / kFull<Pixel> : 0.0;
    EXPECT_NEAR(value / kFull<Pixel>, std::clamp(expected, 0.0, 1.0), step + 1e-6);
  };
  expect(pixel.alpha, alpha);
  expect(pixel.red, red);
  expect(pixel.green, green);
  expect(pixel.blue, blue);
}

template <class Pixel>
class DeepYuvTest : public testing::Test {};
using Pixels = testing::Types<HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(DeepYuvTest, Pixels);

// Rows of less than a vector, of whole ones and of rests, with colours out of range among them.
TYPED_TEST(DeepYuvTest, PixelsOfCodeWordsAreTheStandards) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(7);
    for (const Model& model : kModels) {
      const Reference reference(model);
      const DeepYuv yuv(ModelOf(model), model.depth);
      for (const std::size_t count : {0, 1, 3, 4, 15, 16, 17, 37}) {
        for (const bool has_alpha : {false, true}) {
          Words planes[4];
          for (Words& plane : planes) {
            for (std::size_t i = 0; i < count; ++i) {
              plane.push_back(static_cast<std::uint16_t>(random()));
            }
            plane.push_back(0);  // so that an empty row is no null
          }
          const TypeParam untouched = At<TypeParam>(0.25, 0.5, 0.75, 0.125);
          std::vector<TypeParam> pixels(count + 2, untouched);
          yuv.ToPixels({planes[0].data(), planes[1].data(), planes[2].data(),
                        has_alpha ? planes[3].data() : nullptr},
                       count, pixels.data());
          for (std::size_t i = 0; i < count; ++i) {
            const double y = reference.FromLuma(planes[0][i]);
            const double red = y + 2 * (1 - model.red) * reference.FromChroma(planes[2][i]);
            const double blue = y + 2 * (1 - model.blue) * reference.FromChroma(planes[1][i]);
            const double green =
                (y - model.red * red - model.blue * blue) / (1 - model.red - model.blue);
            ExpectNear(pixels[i], has_alpha ? planes[3][i] / reference.full : 1.0, red, green,
                       blue);
          }
          for (std::size_t i = count; i < pixels.size(); ++i) {
            EXPECT_EQ(pixels[i].alpha, untouched.alpha);
            EXPECT_EQ(pixels[i].blue, untouched.blue);
          }
        }
      }
    }
  });
}

TYPED_TEST(DeepYuvTest, CodeWordsOfPixelsAreTheStandards) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(8);
    std::uniform_real_distribution<double> unit(0, 1);
    for (const Model& model : kModels) {
      const Reference reference(model);
      const DeepYuv yuv(ModelOf(model), model.depth);
      for (const std::size_t count : {0, 1, 3, 4, 15, 16, 17, 37}) {
        for (const bool has_alpha : {false, true}) {
          std::vector<TypeParam> pixels;
          for (std::size_t i = 0; i < count; ++i) {
            pixels.push_back(At<TypeParam>(i % 3 ? 1.0 : unit(random), unit(random), unit(random),
                                           unit(random)));
          }
          Words planes[4];
          for (Words& plane : planes) plane.assign(count + 2, kUntouched);
          yuv.FromPixels(pixels.data(), count,
                         {planes[0].data(), planes[1].data(), planes[2].data(),
                          has_alpha ? planes[3].data() : nullptr});
          for (std::size_t i = 0; i < count; ++i) {
            const double alpha = pixels[i].alpha / kFull<TypeParam>;
            const double gain = (has_alpha ? 1.0 : alpha) / kFull<TypeParam>;
            const double red = pixels[i].red * gain, blue = pixels[i].blue * gain;
            const double y = model.red * red + model.blue * blue +
                             (1 - model.red - model.blue) * pixels[i].green * gain;
            const auto expect = [](double code, double expected) {
              EXPECT_NEAR(code, std::min(expected, 65535.0), 0.52);
            };
            expect(planes[0][i], reference.Luma(y));
            expect(planes[1][i], reference.Chroma((blue - y) / (2 * (1 - model.blue))));
            expect(planes[2][i], reference.Chroma((red - y) / (2 * (1 - model.red))));
            if (has_alpha) expect(planes[3][i], alpha * reference.full);
          }
          for (const Words& plane : planes) {
            EXPECT_EQ(plane[count], kUntouched);
            EXPECT_EQ(plane[count + 1], kUntouched);
          }
        }
      }
    }
  });
}

// What no file holds, but a plug-in may render.
TEST(DeepYuvFloat, ColoursOutOfRangeAreClampedAndNoNumberIsBlack) {
  tests::OnEachInstructionSet([] {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float infinity = std::numeric_limits<float>::infinity();
    const HX_PixelFloat pixels[4] = {
        {1, 7, 7, 7}, {1, -3, -3, -3}, {1, nan, nan, nan}, {1, infinity, infinity, infinity}};
    Words luma(4), cb(4), cr(4);
    DeepYuv(ColourModel{}, 10).FromPixels(pixels, 4, {luma.data(), cb.data(), cr.data(), nullptr});
    EXPECT_EQ(luma, (Words{235 * 256, 16 * 256, 16 * 256, 235 * 256}));
    EXPECT_EQ(cb, Words(4, 32768));
    EXPECT_EQ(cr, Words(4, 32768));
  });
}

}  // namespace
}  // namespace calmframe::media
