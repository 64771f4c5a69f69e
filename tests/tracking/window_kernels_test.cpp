#include <gtest/gtest.h>

#include <cmath>
#include <functional>
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

// On every instruction set, windows of one to many vectors, with rests of every kind.
template <class Check>
void ForEachShape(Check check) {
  constexpr std::size_t kHalves[][2] = {{0, 0}, {1, 0}, {2, 3},  {3, 1},
                                        {7, 7}, {8, 4}, {15, 2}, {20, 1}};
  tests::OnEachInstructionSet([&] {
    std::mt19937 random(1);
    for (std::size_t channels = 1; channels <= kMaxChannels; ++channels) {
      for (const auto& [half_x, half_y] : kHalves) {
        SCOPED_TRACE(::testing::Message() << half_x << "," << half_y << "x" << channels);
        check(window_shape{half_x, half_y, channels}, random);
      }
    }
  });
}

// A window and its border, of random samples, with `other` all around, between two vector
// boundaries.
class Plane {
 public:
  Plane(const window_shape& shape, std::mt19937& random, float other)
      : shape_(shape), start_(1 + shape.plane_start()), data_(1 + shape.plane_size(), other) {
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
  std::vector<Sample> samples() const { return testing::Samples(shape_, data()); }

 private:
  window_shape shape_;
  std::size_t start_;
  std::vector<float> data_;
};

using Term = std::function<double(const Sample&)>;

// Sum over the samples of channel c, or of all if c is negative, to a precision that 32-bit lanes
// reach: told by the sum of absolute values.
void ExpectSum(double found, const std::vector<Sample>& samples, int c, const Term& term) {
  double sum = 0, size = 0;
  for (const Sample& s : samples) {
    if (c >= 0 && s.c != static_cast<std::size_t>(c)) continue;
    sum += term(s);
    size += std::abs(term(s));
  }
  ASSERT_NEAR(found, sum, 4e-6 * size + 1e-12);
}

double Moment(int k, const Sample& s) {
  return (const double[]){1, s.u, s.v, s.u * s.u, s.u * s.v, s.v * s.v}[k];
}
double Gradient(int axis, const Sample& s) {
  return axis == 0 ? s.gx : s.gy;
}

struct PlainImage {
  PlainImage(std::size_t w, std::size_t h, std::size_t c, std::mt19937& random)
      : width(w), height(h), channels(c), bytes(w * h * c) {
    for (std::uint8_t& v : bytes) v = random() % 256;
    floats.assign(bytes.begin(), bytes.end());
  }
  // Nothing but multiplication by 0 may come from outside.
  double Bilinear(double x, double y, std::size_t c) const {
    const double x0 = std::floor(x), y0 = std::floor(y);
    double sum = 0;
    for (const double py : {y0, y0 + 1}) {
      for (const double px : {x0, x0 + 1}) {
        const std::size_t i = (static_cast<std::size_t>(py) * width + px) * channels + c;
        sum += (1 - std::abs(x - px)) * (1 - std::abs(y - py)) * bytes.at(i);
      }
    }
    return sum;
  }

  std::size_t width, height, channels;
  std::vector<std::uint8_t> bytes;
  std::vector<float> floats;
};

TEST(WindowKernelsTest, TranslatedSamplesReachTheImagesLastPixel) {
  ForEachShape([](const window_shape& shape, std::mt19937& random) {
    const PlainImage image(shape.columns() + 4, shape.rows() + 3, shape.channels, random);
    const std::size_t stride = shape.row_samples() + 5;
    for (const std::size_t x : {0, 3}) {
      for (const std::size_t y : {0, 2}) {
        const translated_sampling place{x, y, 0.375f, 0.75f};
        std::vector<float> out(shape.rows() * stride, -7.0f), of_bytes = out;
        kernels::SampleTranslated(image.floats.data(), image.width, shape.channels, place,
                                  shape.columns(), shape.rows(), out.data(), stride);
        kernels::SampleTranslated(image.bytes.data(), image.width, shape.channels, place,
                                  shape.columns(), shape.rows(), of_bytes.data(), stride);
        ASSERT_EQ(of_bytes, out);
        for (std::size_t i = 0; i < out.size(); ++i) {
          const std::size_t column = i % stride / shape.channels;
          const double expected = i % stride >= shape.row_samples()
                                      ? -7.0
                                      : image.Bilinear(x + column + 0.375, y + i / stride + 0.75,
                                                       i % stride % shape.channels);
          ASSERT_NEAR(out[i], expected, 1e-4);
        }
      }
    }
  });
}

// Against the image's edges, where wide reads would leave it, and in its middle, where neighbours
// are read together: side by side or apart, from row to row on the same columns or not. A pixel
// nearer to the edge the window is no longer inside.
TEST(WindowKernelsTest, AffineSamplesInTheMiddleAndAtTheEdges) {
  constexpr float kWarps[][4] = {{1, 0, 0, 1},
                                 {1.004f, -0.01f, 0.003f, 0.99f},
                                 {1.1f, -0.2f, 0.15f, 0.9f},
                                 {0.4f, -0.9f, 1.3f, 0.3f},
                                 {-1, 0, 0.02f, -1}};
  constexpr float kFx = 0.25f, kFy = 0.5f;
  ForEachShape([&](const window_shape& shape, std::mt19937& random) {
    const std::size_t side = 3 * std::max(shape.columns(), shape.rows()) + 20;
    const PlainImage image(side, side + 3, shape.channels, random);
    for (const auto& m : kWarps) {
      const float reach_x = std::abs(m[0]) * shape.half_x + std::abs(m[1]) * shape.half_y;
      const float reach_y = std::abs(m[2]) * shape.half_x + std::abs(m[3]) * shape.half_y;
      for (const int where : {-1, 0, 1}) {  // upper left, middle, lower right
        const auto place = [where](std::size_t size, float reach, float f) -> std::ptrdiff_t {
          if (where < 0) return std::floor(reach - f) + 1;
          if (where > 0) return std::ceil(static_cast<float>(size - 1) - reach - f) - 1;
          return size / 2;
        };
        const std::ptrdiff_t column = place(image.width, reach_x, kFx);
        const std::ptrdiff_t row = place(image.height, reach_y, kFy);
        const affine_sampling warp{column, row, kFx, kFy, m[0], m[1], m[2], m[3]};
        ASSERT_TRUE(kernels::AffineWindowInside(warp, shape, image.width, image.height));
        std::vector<float> out(shape.plane_size(), kNaN), of_bytes = out;
        kernels::SampleAffine(image.floats.data(), image.width, image.height, warp, shape,
                              out.data() + shape.plane_start());
        kernels::SampleAffine(image.bytes.data(), image.width, image.height, warp, shape,
                              of_bytes.data() + shape.plane_start());
        for (const Sample& s : testing::Samples(shape, out.data() + shape.plane_start())) {
          const double x = static_cast<double>(warp.x) + kFx + m[0] * s.u + m[1] * s.v;
          const double y = static_cast<double>(warp.y) + kFy + m[2] * s.u + m[3] * s.v;
          ASSERT_NEAR(s.value, image.Bilinear(x, y, s.c), 5e-3);
          ASSERT_EQ(of_bytes[shape.plane_start() + s.at], static_cast<float>(s.value));
        }
        if (where == 0) continue;
        for (std::ptrdiff_t affine_sampling::*axis : {&affine_sampling::x, &affine_sampling::y}) {
          affine_sampling out_of_it = warp;
          out_of_it.*axis += where;
          ASSERT_FALSE(kernels::AffineWindowInside(out_of_it, shape, image.width, image.height));
        }
      }
    }
  });
}

TEST(WindowKernelsTest, SumsOfATemplateEqualPlainLoops) {
  ForEachShape([](const window_shape& shape, std::mt19937& random) {
    const Plane t(shape, random, kNaN);
    const std::vector<Sample> samples = t.samples();
    double squares[3], energies[4];
    template_products products;
    kernels::GradientProducts(t.data(), shape, squares);
    kernels::TemplateProducts(t.data(), shape, products);
    kernels::ChannelEnergies(t.data(), shape, energies);
    for (int p = 0; p < 3; ++p) {
      for (int k = 0; k < 6; ++k) {
        const Term term = [=](const Sample& s) {
          return Gradient(p / 2, s) * Gradient((p + 1) / 2, s) * Moment(k, s);
        };
        ExpectSum(products.gradient[p][k], samples, -1, term);
        if (k == 0) ExpectSum(squares[p], samples, -1, term);
      }
    }
    for (int c = 0; c < static_cast<int>(shape.channels); ++c) {
      const Term square = [](const Sample& s) { return s.value * s.value; };
      ExpectSum(energies[c], samples, c, square);
      ExpectSum(products.square[c], samples, c, square);
      ExpectSum(products.sum[c], samples, c, [](const Sample& s) { return s.value; });
      for (int k = 0; k < 3; ++k) {
        for (int g = 0; g < 4; ++g) {
          ExpectSum(products.cross[c][g][k], samples, c, [=](const Sample& s) {
            return Gradient(g % 2, s) * (g < 2 ? s.value : 1.0) * Moment(k, s);
          });
        }
      }
    }
  });
}

constexpr float kGain[] = {0.8f, 1.3f, 1.0f, 2.0f}, kBias[] = {5.0f, -9.0f, 0.0f, 3.0f};

// `sampled` gives the image's value at a sample of the window.
void ExpectResiduals(const double* sums, const std::vector<Sample>& samples, bool affine,
                     bool color, const Term& sampled) {
  const Term r = [&](const Sample& s) {
    return s.value - (color ? kGain[s.c] * sampled(s) + kBias[s.c] : sampled(s));
  };
  constexpr int kAxis[] = {0, 1, 0, 0, 1, 1}, kMoment[] = {0, 0, 1, 2, 1, 2};
  for (int m = 0; m < (affine ? 6 : 2); ++m) {
    ExpectSum(*sums++, samples, -1, [&](const Sample& s) {
      return Gradient(kAxis[m], s) * Moment(kMoment[m], s) * r(s);
    });
  }
  for (int c = 0; color && c <= static_cast<int>(samples.back().c); ++c) {
    ExpectSum(*sums++, samples, c, [&](const Sample& s) { return s.value * r(s); });
    ExpectSum(*sums++, samples, c, r);
  }
}

// The samples' last row and column are the image's or, where a window is narrow, its memory's end.
TEST(WindowKernelsTest, ResidualsOfATranslationEqualPlainLoops) {
  ForEachShape([](const window_shape& shape, std::mt19937& random) {
    const Plane t(shape, random, 13.0f);
    const PlainImage image(shape.columns() + 4, shape.rows() + 3, shape.channels, random);
    for (const translated_sampling place :
         {translated_sampling{0, 0, 0.375f, 0.75f}, {3, 2, 0.25f, 0.5f}, {1, 1, 0.0f, 0.0f}}) {
      const auto sampled = [&](const Sample& s) {
        return image.Bilinear(static_cast<double>(place.x + shape.half_x) + s.u + place.fx,
                              static_cast<double>(place.y + shape.half_y) + s.v + place.fy, s.c);
      };
      for (const bool color : {false, true}) {
        const color_fit fit = color ? color_fit{kGain, kBias} : color_fit{};
        std::vector<double> sums(10), of_bytes(10);
        kernels::TranslationResidual(t.data(), image.floats.data(), image.width, image.height,
                                     place, shape, fit, sums.data());
        kernels::TranslationResidual(t.data(), image.bytes.data(), image.width, image.height, place,
                                     shape, fit, of_bytes.data());
        ExpectResiduals(sums.data(), t.samples(), false, color, sampled);
        ASSERT_EQ(of_bytes, sums);
      }
    }
  });
}

TEST(WindowKernelsTest, ResidualsOfAWindowEqualPlainLoops) {
  ForEachShape([](const window_shape& shape, std::mt19937& random) {
    const Plane t(shape, random, 13.0f), window(shape, random, kNaN);
    for (const bool color : {false, true}) {
      double sums[6 + 8];
      kernels::AffineResidual(t.data(), window.data(), shape,
                              color ? color_fit{kGain, kBias} : color_fit{}, sums);
      ExpectResiduals(sums, t.samples(), true, color,
                      [&](const Sample& s) { return 1.0 * window.data()[s.at]; });
    }
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
    kernels::SampleAffine(image.floats.data(), 90, 80,
                          {45, 40, 0.3f, 0.7f, 1.05f, -0.1f, 0.2f, 0.95f}, shape, window);
    std::vector<float> samples;
    for (const Sample& s : testing::Samples(shape, window)) samples.push_back(window[s.at]);
    std::vector<double> sums(12 + 8);
    kernels::AffineResidual(t.data(), window, shape, {kGain, kBias}, sums.data());
    kernels::TranslationResidual(t.data(), image.floats.data(), 90, 80, {40, 30, 0.3f, 0.7f}, shape,
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
  ForEachShape([](const window_shape& shape, std::mt19937& random) {
    const int flat = static_cast<int>(shape.channels) - 1;
    Plane x(shape, random, kNaN), y(shape, random, kNaN);
    // At a value that 32-bit sums cannot add up without rounding.
    for (const Sample& s : x.samples()) {
      if (static_cast<int>(s.c) == flat) x.data()[s.at] = 77.3f;
    }
    float x_means[4], y_means[4];
    double xx[4], xy[4], yy[4];
    kernels::ChannelMeans(x.data(), shape, x_means);
    kernels::ChannelMeans(y.data(), shape, y_means);
    kernels::CentredSquares(x.data(), x_means, shape, xx);
    kernels::CentredProducts(x.data(), x_means, y.data(), y_means, shape, xy, yy);
    EXPECT_EQ(x_means[flat], 77.3f);
    EXPECT_EQ(xx[flat], 0.0);
    EXPECT_EQ(xy[flat], 0.0);
    const std::vector<Sample> samples = x.samples();
    const Term dx = [&](const Sample& s) { return s.value - x_means[s.c]; };
    const Term dy = [&](const Sample& s) { return 1.0 * y.data()[s.at] - y_means[s.c]; };
    const double pixels = static_cast<double>(shape.pixels());
    for (int c = 0; c <= flat; ++c) {
      ExpectSum(pixels * x_means[c], samples, c, [](const Sample& s) { return s.value; });
      ExpectSum(pixels * y_means[c], samples, c, [&](const Sample& s) { return y.data()[s.at]; });
      ExpectSum(xx[c], samples, c, [&](const Sample& s) { return dx(s) * dx(s); });
      ExpectSum(xy[c], samples, c, [&](const Sample& s) { return dx(s) * dy(s); });
      ExpectSum(yy[c], samples, c, [&](const Sample& s) { return dy(s) * dy(s); });
    }
  });
}

}  // namespace
}  // namespace marrow::tracking
