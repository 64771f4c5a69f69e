#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <map>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tests/tracking/tracker_images.h"
#include "tracking/window_moments.h"
#include "tracking/window_products.h"
#include "tracking/window_residuals.h"
#include "tracking/window_sampling.h"

namespace marrow::tracking {
namespace {

using testing::kNaN;
using testing::Sample;

// Windows of one to many vectors, with rests of every kind.
template <class Check>
void ForEachShape(Check check) {
  for (std::size_t channels = 1; channels <= kMaxChannels; ++channels) {
    for (const auto& [half_x, half_y] : {std::pair<std::size_t, std::size_t>{0, 0},
                                         {1, 0},
                                         {2, 3},
                                         {3, 1},
                                         {7, 7},
                                         {8, 4},
                                         {15, 2},
                                         {20, 1}}) {
      const window_shape shape{half_x, half_y, channels};
      SCOPED_TRACE(::testing::Message() << half_x << "," << half_y << "x" << channels);
      check(shape);
    }
  }
}

// A window and its border, of random samples, with `other` all around, between two vector
// boundaries.
class Plane {
 public:
  Plane(const window_shape& shape, std::mt19937& random, float other)
      : start_(1 + shape.plane_start()), data_(1 + shape.plane_size(), other) {
    std::uniform_real_distribution<float> value(-100.0f, 255.0f);
    const std::size_t border = shape.channels;
    for (std::size_t y = 0; y < shape.rows() + 2; ++y) {
      for (std::size_t i = 0; i < shape.row_samples() + 2 * border; ++i) {
        data_[start_ - shape.stride() - border + y * shape.stride() + i] = value(random);
      }
    }
  }
  float* data() { return data_.data() + start_; }
  const float* data() const { return data_.data() + start_; }

 private:
  std::size_t start_;
  std::vector<float> data_;
};

std::vector<Sample> Samples(const window_shape& shape, const float* plane) {
  std::vector<Sample> samples;
  for (std::size_t i = 0; i < shape.pixels() * shape.channels; ++i) {
    samples.emplace_back(shape, plane, i);
  }
  return samples;
}

// Sum over the samples of channel c, or of all if c is negative, to a precision that 32-bit lanes
// reach: told by the sum of absolute values.
template <class Term>
void ExpectSum(double found, const std::vector<Sample>& samples, int c, Term term) {
  double sum = 0, size = 0;
  for (const Sample& s : samples) {
    if (c >= 0 && s.c != static_cast<std::size_t>(c)) continue;
    sum += term(s);
    size += std::abs(term(s));
  }
  ASSERT_NEAR(found, sum, 4e-6 * size + 1e-12);
}

struct PlainImage {
  PlainImage(std::size_t w, std::size_t h, std::size_t c, std::mt19937& random)
      : width(w), height(h), channels(c), data(w * h * c) {
    for (float& v : data) v = random() % 256;
  }
  // Nothing but multiplication by 0 may come from outside.
  double Bilinear(double x, double y, std::size_t c) const {
    const double x0 = std::floor(x), y0 = std::floor(y);
    double sum = 0;
    for (const double py : {y0, y0 + 1}) {
      for (const double px : {x0, x0 + 1}) {
        const std::size_t i = (static_cast<std::size_t>(py) * width + px) * channels + c;
        sum += (1 - std::abs(x - px)) * (1 - std::abs(y - py)) * data.at(i);
      }
    }
    return sum;
  }
  std::vector<std::uint8_t> Bytes() const { return {data.begin(), data.end()}; }

  std::size_t width, height, channels;
  std::vector<float> data;
};

TEST(WindowKernelsTest, TranslatedSamplesReachTheImagesLastPixel) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(1);
    ForEachShape([&](const window_shape& shape) {
      const PlainImage image(shape.columns() + 4, shape.rows() + 3, shape.channels, random);
      const std::size_t stride = shape.row_samples() + 5;
      for (const std::size_t x : {0, 3}) {
        for (const std::size_t y : {0, 2}) {
          const translated_sampling place{x, y, 0.375f, 0.75f};
          std::vector<float> out(shape.rows() * stride, -7.0f);
          kernels::SampleTranslated(image.data.data(), image.width, shape.channels, place,
                                    shape.columns(), shape.rows(), out.data(), stride);
          for (std::size_t i = 0; i < out.size(); ++i) {
            if (i % stride >= shape.row_samples()) {
              ASSERT_EQ(out[i], -7.0f);
              continue;
            }
            ASSERT_NEAR(out[i],
                        image.Bilinear(x + i % stride / shape.channels + 0.375,
                                       y + i / stride + 0.75, i % stride % shape.channels),
                        1e-4);
          }
          std::vector<float> of_bytes(out.size(), -7.0f);
          kernels::SampleTranslated(image.Bytes().data(), image.width, shape.channels, place,
                                    shape.columns(), shape.rows(), of_bytes.data(), stride);
          ASSERT_EQ(of_bytes, out);
        }
      }
    });
  });
}

// Against the image's edges, where wide reads would leave it, and in its middle, where neighbours
// are read together: side by side or apart, from row to row on the same columns or not.
TEST(WindowKernelsTest, AffineSamplesInTheMiddleAndAtTheEdges) {
  constexpr float kWarps[][4] = {{1, 0, 0, 1},
                                 {1.004f, -0.01f, 0.003f, 0.99f},
                                 {1.1f, -0.2f, 0.15f, 0.9f},
                                 {0.4f, -0.9f, 1.3f, 0.3f},
                                 {-1, 0, 0.02f, -1}};
  tests::OnEachInstructionSet([&] {
    std::mt19937 random(3);
    ForEachShape([&](const window_shape& shape) {
      const auto half_x = static_cast<float>(shape.half_x);
      const auto half_y = static_cast<float>(shape.half_y);
      const std::size_t side = 3 * std::max(shape.columns(), shape.rows()) + 20;
      const PlainImage image(side, side + 3, shape.channels, random);
      for (const auto& m : kWarps) {
        const float reach_x = std::abs(m[0]) * half_x + std::abs(m[1]) * half_y;
        const float reach_y = std::abs(m[2]) * half_x + std::abs(m[3]) * half_y;
        for (const int where : {0, 1, 2}) {  // upper left, middle, lower right
          affine_sampling warp{0, 0, 0.25f, 0.5f, m[0], m[1], m[2], m[3]};
          const auto low = [](float reach, float f) {
            return static_cast<std::ptrdiff_t>(std::floor(reach - f)) + 1;
          };
          const auto high = [](std::size_t size, float reach, float f) {
            return static_cast<std::ptrdiff_t>(
                       std::ceil(static_cast<float>(size - 1) - reach - f)) -
                   1;
          };
          warp.x = where == 0   ? low(reach_x, 0.25f)
                   : where == 1 ? static_cast<std::ptrdiff_t>(image.width / 2)
                                : high(image.width, reach_x, 0.25f);
          warp.y = where == 0   ? low(reach_y, 0.5f)
                   : where == 1 ? static_cast<std::ptrdiff_t>(image.height / 2)
                                : high(image.height, reach_y, 0.5f);
          ASSERT_TRUE(kernels::AffineWindowInside(warp, shape, image.width, image.height));
          std::vector<float> out(shape.plane_size(), kNaN), of_bytes = out;
          float* window = out.data() + shape.plane_start();
          kernels::SampleAffine(image.data.data(), image.width, image.height, warp, shape, window);
          kernels::SampleAffine(image.Bytes().data(), image.width, image.height, warp, shape,
                                of_bytes.data() + shape.plane_start());
          for (const Sample& s : Samples(shape, window)) {
            const double x = static_cast<double>(warp.x) + 0.25 + m[0] * s.u + m[1] * s.v;
            const double y = static_cast<double>(warp.y) + 0.5 + m[2] * s.u + m[3] * s.v;
            ASSERT_NEAR(s.value, image.Bilinear(x, y, s.c), 5e-3);
            ASSERT_EQ(of_bytes[shape.plane_start() + s.at], window[s.at]);
          }
        }
      }
    });
  });
}

TEST(WindowKernelsTest, AWindowIsInsideWhenEveryCornerIs) {
  tests::OnEachInstructionSet([] {
    const window_shape shape{2, 1, 3};
    const auto inside = [&](float x, float y, float m01 = 0.0f, float m10 = 0.0f) {
      const auto fx = x - std::floor(x), fy = y - std::floor(y);
      const affine_sampling warp{static_cast<int>(std::floor(x)),
                                 static_cast<int>(std::floor(y)),
                                 fx,
                                 fy,
                                 1.0f,
                                 m01,
                                 m10,
                                 1.0f};
      return kernels::AffineWindowInside(warp, shape, 10, 8);
    };
    EXPECT_TRUE(inside(5, 4));
    // 0 < X < 9 and 0 < Y < 7, strictly.
    EXPECT_FALSE(inside(2, 4));
    EXPECT_TRUE(inside(2.001f, 4));
    EXPECT_FALSE(inside(7, 4));
    EXPECT_TRUE(inside(6.999f, 4));
    EXPECT_FALSE(inside(5, 1));
    EXPECT_TRUE(inside(5, 1.001f));
    EXPECT_FALSE(inside(5, 6));
    EXPECT_TRUE(inside(5, 5.999f));
    // A shear moves one pair of corners out.
    EXPECT_TRUE(inside(6.5f, 4, 0.4f));
    EXPECT_FALSE(inside(6.5f, 4, 0.6f));
    EXPECT_FALSE(inside(6.5f, 4, -0.6f));
    EXPECT_FALSE(inside(5, 5.5f, 0, 0.3f));
    EXPECT_FALSE(inside(5, 4, std::numeric_limits<float>::quiet_NaN()));
    EXPECT_FALSE(inside(5, 4, 0, std::numeric_limits<float>::infinity()));
  });
}

TEST(WindowKernelsTest, SumsOfATemplateEqualPlainLoops) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(4);
    ForEachShape([&](const window_shape& shape) {
      const Plane t(shape, random, kNaN);
      const std::vector<Sample> samples = Samples(shape, t.data());

      double squares[3];
      kernels::GradientProducts(t.data(), shape, squares);
      ExpectSum(squares[0], samples, -1, [](const Sample& s) { return s.gx * s.gx; });
      ExpectSum(squares[1], samples, -1, [](const Sample& s) { return s.gx * s.gy; });
      ExpectSum(squares[2], samples, -1, [](const Sample& s) { return s.gy * s.gy; });

      const auto moment = [](int k, const Sample& s) {
        return (const double[]){1, s.u, s.v, s.u * s.u, s.u * s.v, s.v * s.v}[k];
      };
      template_products products;
      kernels::TemplateProducts(t.data(), shape, products);
      for (int k = 0; k < 6; ++k) {
        ExpectSum(products.gradient[0][k], samples, -1,
                  [&](const Sample& s) { return s.gx * s.gx * moment(k, s); });
        ExpectSum(products.gradient[1][k], samples, -1,
                  [&](const Sample& s) { return s.gx * s.gy * moment(k, s); });
        ExpectSum(products.gradient[2][k], samples, -1,
                  [&](const Sample& s) { return s.gy * s.gy * moment(k, s); });
      }
      double energies[4];
      kernels::ChannelEnergies(t.data(), shape, energies);
      for (int c = 0; c < static_cast<int>(shape.channels); ++c) {
        const auto square = [](const Sample& s) { return s.value * s.value; };
        ExpectSum(energies[c], samples, c, square);
        ExpectSum(products.square[c], samples, c, square);
        ExpectSum(products.sum[c], samples, c, [](const Sample& s) { return s.value; });
        for (int k = 0; k < 3; ++k) {
          for (int g = 0; g < 4; ++g) {
            ExpectSum(products.cross[c][g][k], samples, c, [&](const Sample& s) {
              return (g % 2 == 0 ? s.gx : s.gy) * (g < 2 ? s.value : 1.0) * moment(k, s);
            });
          }
        }
      }
    });
  });
}

constexpr float kGain[] = {0.8f, 1.3f, 1.0f, 2.0f}, kBias[] = {5.0f, -9.0f, 0.0f, 3.0f};

// `sampled` gives the image's value at a sample of the window.
template <class Sampled>
void ExpectResiduals(const double* sums, const std::vector<Sample>& samples, bool affine,
                     bool color, Sampled sampled) {
  const auto r = [&](const Sample& s) {
    return s.value - (color ? kGain[s.c] * sampled(s) + kBias[s.c] : sampled(s));
  };
  ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.gx * r(s); });
  ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.gy * r(s); });
  if (affine) {
    ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.u * s.gx * r(s); });
    ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.v * s.gx * r(s); });
    ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.u * s.gy * r(s); });
    ExpectSum(*sums++, samples, -1, [&](const Sample& s) { return s.v * s.gy * r(s); });
  }
  for (std::size_t c = 0; color && c <= samples.back().c; ++c) {
    ExpectSum(*sums++, samples, static_cast<int>(c),
              [&](const Sample& s) { return s.value * r(s); });
    ExpectSum(*sums++, samples, static_cast<int>(c), r);
  }
}

// The samples' last row and column are the image's or, where a window is narrow, its memory's end.
TEST(WindowKernelsTest, ResidualsOfATranslationEqualPlainLoops) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(6);
    ForEachShape([&](const window_shape& shape) {
      const Plane t(shape, random, 13.0f);
      const std::vector<Sample> samples = Samples(shape, t.data());
      const PlainImage image(shape.columns() + 4, shape.rows() + 3, shape.channels, random);
      const std::vector<std::uint8_t> bytes = image.Bytes();
      for (const translated_sampling place :
           {translated_sampling{0, 0, 0.375f, 0.75f}, {3, 2, 0.25f, 0.5f}, {1, 1, 0.0f, 0.0f}}) {
        const auto sampled = [&](const Sample& s) {
          return image.Bilinear(static_cast<double>(place.x + shape.half_x) + s.u + place.fx,
                                static_cast<double>(place.y + shape.half_y) + s.v + place.fy, s.c);
        };
        for (const bool color : {false, true}) {
          const color_fit fit = color ? color_fit{kGain, kBias} : color_fit{};
          double sums[10] = {}, of_bytes[10] = {};
          kernels::TranslationResidual(t.data(), image.data.data(), image.width, image.height,
                                       place, shape, fit, sums);
          ExpectResiduals(sums, samples, false, color, sampled);
          kernels::TranslationResidual(t.data(), bytes.data(), image.width, image.height, place,
                                       shape, fit, of_bytes);
          for (int k = 0; k < 10; ++k) ASSERT_EQ(of_bytes[k], sums[k]);
        }
      }
    });
  });
}

TEST(WindowKernelsTest, ResidualsOfAWindowEqualPlainLoops) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(7);
    ForEachShape([&](const window_shape& shape) {
      const Plane t(shape, random, 13.0f), window(shape, random, kNaN);
      const auto sampled = [&](const Sample& s) { return 1.0 * window.data()[s.at]; };
      for (const bool color : {false, true}) {
        double sums[6 + 8];
        kernels::AffineResidual(t.data(), window.data(), shape,
                                color ? color_fit{kGain, kBias} : color_fit{}, sums);
        ExpectResiduals(sums, Samples(shape, t.data()), true, color, sampled);
      }
    });
  });
}

// Of instruction sets that round a multiplication and addition alike, which a sample tells.
TEST(WindowKernelsTest, VectorsOfEveryWidthAddUpToTheSameBits) {
  std::map<std::vector<float>, std::vector<double>> found;
  int sets = 0;
  tests::OnEachInstructionSet([&] {
    ++sets;
    std::mt19937 random(8);
    const window_shape shape{15, 15, 3};
    const Plane t(shape, random, 0.0f);
    const PlainImage image(90, 80, 3, random);
    std::vector<float> out(shape.plane_size());
    float* window = out.data() + shape.plane_start();
    kernels::SampleAffine(image.data.data(), 90, 80,
                          {45, 40, 0.3f, 0.7f, 1.05f, -0.1f, 0.2f, 0.95f}, shape, window);
    std::vector<float> samples;
    for (const Sample& s : Samples(shape, window)) samples.push_back(window[s.at]);
    std::vector<double> sums(12 + 8);
    kernels::AffineResidual(t.data(), window, shape, {kGain, kBias}, sums.data());
    kernels::TranslationResidual(t.data(), image.data.data(), 90, 80, {40, 30, 0.3f, 0.7f}, shape,
                                 {kGain, kBias}, sums.data() + 12);
    template_products products;
    kernels::TemplateProducts(t.data(), shape, products);
    for (const auto& row : products.gradient) sums.insert(sums.end(), row, row + 6);
    for (const auto& row : products.cross[1]) sums.insert(sums.end(), row, row + 3);
    const auto [entry, first] = found.try_emplace(samples, sums);
    if (!first) {
      EXPECT_EQ(entry->second, sums);
    }
  });
  EXPECT_LE(found.size(), 2u);
  if (sets < 3) GTEST_SKIP() << "too few instruction sets to compare";
}

TEST(WindowKernelsTest, MomentsAreAboutTheMeanAndExactlyNothingForAFlatChannel) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(5);
    ForEachShape([&](const window_shape& shape) {
      const std::size_t channels = shape.channels;
      Plane x(shape, random, kNaN), y(shape, random, kNaN);
      // The last channel flat, at a value that 32-bit sums cannot add up without rounding.
      for (const Sample& s : Samples(shape, x.data())) {
        if (s.c == channels - 1) x.data()[s.at] = 77.3f;
      }
      float x_means[4], y_means[4];
      kernels::ChannelMeans(x.data(), shape, x_means);
      kernels::ChannelMeans(y.data(), shape, y_means);
      EXPECT_EQ(x_means[channels - 1], 77.3f);
      double xx[4], xy[4], yy[4];
      kernels::CentredSquares(x.data(), x_means, shape, xx);
      kernels::CentredProducts(x.data(), x_means, y.data(), y_means, shape, xy, yy);
      EXPECT_EQ(xx[channels - 1], 0.0);
      EXPECT_EQ(xy[channels - 1], 0.0);
      const std::vector<Sample> samples = Samples(shape, x.data());
      for (int c = 0; c < static_cast<int>(channels); ++c) {
        double mean_x = 0, mean_y = 0;
        for (const Sample& s : samples) {
          if (s.c != static_cast<std::size_t>(c)) continue;
          mean_x += s.value / static_cast<double>(shape.pixels());
          mean_y += y.data()[s.at] / static_cast<double>(shape.pixels());
        }
        ASSERT_NEAR(x_means[c], mean_x, 1e-4);
        ASSERT_NEAR(y_means[c], mean_y, 1e-4);
        const auto dx = [&](const Sample& s) { return s.value - x_means[c]; };
        const auto dy = [&](const Sample& s) { return 1.0 * y.data()[s.at] - y_means[c]; };
        ExpectSum(xx[c], samples, c, [&](const Sample& s) { return dx(s) * dx(s); });
        ExpectSum(xy[c], samples, c, [&](const Sample& s) { return dx(s) * dy(s); });
        ExpectSum(yy[c], samples, c, [&](const Sample& s) { return dy(s) * dy(s); });
      }
    });
  });
}

}  // namespace
}  // namespace marrow::tracking
