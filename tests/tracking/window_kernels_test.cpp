#include "tracking/window_kernels.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::tracking {
namespace {

// Windows of one to many vectors, with rests of every kind.
template <class Check>
void ForEachShape(Check check) {
  for (std::size_t channels = 1; channels <= kMaxChannels; ++channels) {
    for (const auto& [half_x, half_y] :
         {std::pair<std::size_t, std::size_t>{0, 0}, {1, 0}, {2, 3}, {3, 1}, {7, 7}, {8, 4}}) {
      const window_shape shape{half_x, half_y, channels};
      SCOPED_TRACE(::testing::Message() << half_x << "," << half_y << "x" << channels);
      check(shape);
    }
  }
}

// Random samples that start between two vector boundaries, `padding` behind them, a cliff of NaN
// behind that.
class Plane {
 public:
  Plane(const window_shape& shape, std::mt19937& random, float padding = 0.0f)
      : data_(1 + shape.plane_size() + 32, std::numeric_limits<float>::quiet_NaN()) {
    std::uniform_real_distribution<float> value(-100.0f, 255.0f);
    for (std::size_t i = 0; i < shape.plane_size(); ++i) {
      data_[1 + i] = i < shape.samples() ? value(random) : padding;
    }
  }
  float* data() { return data_.data() + 1; }
  const float* data() const { return data_.data() + 1; }
  float operator[](std::size_t i) const { return data_[1 + i]; }

 private:
  std::vector<float> data_;
};

// Sum over the samples of channel c, or of all if c is negative, to a precision that 32-bit lanes
// reach: told by the sum of absolute values.
template <class Term>
void ExpectSum(double found, const window_shape& shape, int c, Term term) {
  double sum = 0, size = 0;
  for (std::size_t i = 0; i < shape.samples(); ++i) {
    if (c >= 0 && i % shape.channels != static_cast<std::size_t>(c)) continue;
    sum += term(i);
    size += std::abs(term(i));
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
      for (const std::size_t x : {0, 3}) {
        for (const std::size_t y : {0, 2}) {
          std::vector<float> out(shape.samples() + 1, -7.0f);
          kernels::SampleTranslated(image.data.data(), image.width, shape.channels, x, y, 0.375f,
                                    0.75f, shape.columns(), shape.rows(), out.data());
          for (std::size_t i = 0; i < shape.samples(); ++i) {
            const std::size_t pixel = i / shape.channels;
            ASSERT_NEAR(out[i],
                        image.Bilinear(x + pixel % shape.columns() + 0.375,
                                       y + pixel / shape.columns() + 0.75, i % shape.channels),
                        1e-4);
          }
          ASSERT_EQ(out.back(), -7.0f);
          std::vector<float> of_bytes(out.size(), -7.0f);
          kernels::SampleTranslated(image.Bytes().data(), image.width, shape.channels, x, y, 0.375f,
                                    0.75f, shape.columns(), shape.rows(), of_bytes.data());
          ASSERT_EQ(of_bytes, out);
        }
      }
    });
  });
}

TEST(WindowKernelsTest, GradientsAreWholeCentralDifferences) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(2);
    ForEachShape([&](const window_shape& shape) {
      const std::size_t w = shape.columns() + 2, n = shape.samples();
      const PlainImage block(w, shape.rows() + 2, shape.channels, random);
      std::vector<float> t(n + 1, -7), gx(n + 1, -7), gy(n + 1, -7);
      kernels::SplitGradients(block.data.data(), shape, t.data(), gx.data(), gy.data());
      for (std::size_t i = 0; i < n; ++i) {
        const std::size_t x = i / shape.channels % shape.columns() + 1;
        const std::size_t y = i / shape.channels / shape.columns() + 1;
        const auto at = [&](std::size_t px, std::size_t py) {
          return block.data[(py * w + px) * shape.channels + i % shape.channels];
        };
        ASSERT_EQ(t[i], at(x, y));
        ASSERT_EQ(gx[i], at(x + 1, y) - at(x - 1, y));
        ASSERT_EQ(gy[i], at(x, y + 1) - at(x, y - 1));
      }
      for (const auto* plane : {&t, &gx, &gy}) ASSERT_EQ(plane->back(), -7.0f);
    });
  });
}

TEST(WindowKernelsTest, AffineSamplesInTheMiddleAndOnTheLastRow) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(3);
    ForEachShape([&](const window_shape& shape) {
      const auto half_x = static_cast<float>(shape.half_x);
      const auto half_y = static_cast<float>(shape.half_y);
      const PlainImage image(2 * shape.columns() + 9, 2 * shape.rows() + 9, shape.channels, random);
      affine_sampling warp{0, 0, 0.25f, 0.5f, 1.1f, -0.2f, 0.15f, 0.9f};
      const float reach_x = 1.1f * half_x + 0.2f * half_y;
      const float reach_y = 0.15f * half_x + 0.9f * half_y;
      // Up against the right and lower edges, then against the left and upper ones.
      for (const bool low : {true, false}) {
        warp.x = low ? static_cast<int>(std::ceil(image.width - 1 - reach_x - 0.25f)) - 1
                     : static_cast<int>(std::floor(reach_x - 0.25f)) + 1;
        warp.y = low ? static_cast<int>(std::ceil(image.height - 1 - reach_y - 0.5f)) - 1
                     : static_cast<int>(std::floor(reach_y - 0.5f)) + 1;
        ASSERT_TRUE(kernels::AffineWindowInside(warp, shape, image.width, image.height));
        std::vector<float> out(shape.plane_size(), -7.0f);
        kernels::SampleAffine(image.data.data(), image.width, image.height, warp, shape,
                              out.data());
        for (std::size_t i = 0; i < shape.samples(); ++i) {
          const double u = i / shape.channels % shape.columns() - 1.0 * shape.half_x;
          const double v = i / shape.channels / shape.columns() - 1.0 * shape.half_y;
          ASSERT_NEAR(out[i],
                      image.Bilinear(warp.x + 0.25 + 1.1 * u - 0.2 * v,
                                     warp.y + 0.5 + 0.15 * u + 0.9 * v, i % shape.channels),
                      5e-3);
        }
        ASSERT_EQ(out[shape.samples()], 0.0f);
        std::vector<float> of_bytes(out.size(), -7.0f);
        kernels::SampleAffine(image.Bytes().data(), image.width, image.height, warp, shape,
                              of_bytes.data());
        ASSERT_TRUE(std::equal(out.begin(), out.begin() + shape.samples() + 1, of_bytes.begin()));
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

TEST(WindowKernelsTest, SumsEqualPlainLoops) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(4);
    ForEachShape([&](const window_shape& shape) {
      const Plane t(shape, random), gx(shape, random), gy(shape, random), u(shape, random),
          v(shape, random), window(shape, random, 31.0f);
      const template_planes level{t.data(), gx.data(), gy.data()};
      const offset_planes offsets{u.data(), v.data()};
      const int channels = static_cast<int>(shape.channels);

      double squares[3];
      kernels::GradientProducts(level, shape, squares);
      ExpectSum(squares[0], shape, -1, [&](std::size_t i) { return 1.0 * gx[i] * gx[i]; });
      ExpectSum(squares[1], shape, -1, [&](std::size_t i) { return 1.0 * gx[i] * gy[i]; });
      ExpectSum(squares[2], shape, -1, [&](std::size_t i) { return 1.0 * gy[i] * gy[i]; });

      const auto one = [](std::size_t) { return 1.0; };
      const auto moment = [&](int k, std::size_t i) {
        const double a = u[i], b = v[i];
        return (const double[]){1, a, b, a * a, a * b, b * b}[k];
      };
      template_products products;
      kernels::TemplateProducts(level, offsets, shape, products);
      for (int k = 0; k < 6; ++k) {
        ExpectSum(products.gradient[0][k], shape, -1,
                  [&](std::size_t i) { return 1.0 * gx[i] * gx[i] * moment(k, i); });
        ExpectSum(products.gradient[1][k], shape, -1,
                  [&](std::size_t i) { return 1.0 * gx[i] * gy[i] * moment(k, i); });
        ExpectSum(products.gradient[2][k], shape, -1,
                  [&](std::size_t i) { return 1.0 * gy[i] * gy[i] * moment(k, i); });
      }
      const float gain[] = {0.8f, 1.3f, 1.0f, 2.0f}, bias[] = {5.0f, -9.0f, 0.0f, 3.0f};
      double plain[6], translation[2 + 8], affine[6 + 8];
      kernels::TranslationResidual(level, window.data(), shape, {}, false, plain);
      kernels::TranslationResidual(level, window.data(), shape, {gain, bias}, true, translation);
      kernels::AffineResidual(level, offsets, window.data(), shape, {gain, bias}, affine);
      const auto r = [&](std::size_t i) {
        const std::size_t c = i % shape.channels;
        return 1.0 * t[i] - (1.0 * gain[c] * window[i] + bias[c]);
      };
      for (int k = 0; k < 2; ++k) {
        const Plane& g = k == 0 ? gx : gy;
        ExpectSum(plain[k], shape, -1,
                  [&](std::size_t i) { return 1.0 * g[i] * (1.0 * t[i] - window[i]); });
        ExpectSum(translation[k], shape, -1, [&](std::size_t i) { return g[i] * r(i); });
        ExpectSum(affine[k], shape, -1, [&](std::size_t i) { return g[i] * r(i); });
        ExpectSum(affine[2 + 2 * k], shape, -1,
                  [&](std::size_t i) { return 1.0 * u[i] * g[i] * r(i); });
        ExpectSum(affine[3 + 2 * k], shape, -1,
                  [&](std::size_t i) { return 1.0 * v[i] * g[i] * r(i); });
      }
      double colorless[6];
      kernels::AffineResidual(level, offsets, window.data(), shape, {}, colorless);
      ExpectSum(colorless[3], shape, -1,
                [&](std::size_t i) { return 1.0 * v[i] * gx[i] * (1.0 * t[i] - window[i]); });
      kernels::TranslationResidual(level, window.data(), shape, {gain, bias}, false, plain);
      ExpectSum(plain[1], shape, -1, [&](std::size_t i) { return gy[i] * r(i); });

      double energies[4];
      kernels::ChannelEnergies(t.data(), shape, energies);
      for (int c = 0; c < channels; ++c) {
        ExpectSum(translation[2 + 2 * c], shape, c, [&](std::size_t i) { return t[i] * r(i); });
        ExpectSum(translation[3 + 2 * c], shape, c, r);
        ExpectSum(affine[6 + 2 * c], shape, c, [&](std::size_t i) { return t[i] * r(i); });
        ExpectSum(affine[7 + 2 * c], shape, c, r);
        ExpectSum(energies[c], shape, c, [&](std::size_t i) { return 1.0 * t[i] * t[i]; });
        ExpectSum(products.square[c], shape, c, [&](std::size_t i) { return 1.0 * t[i] * t[i]; });
        ExpectSum(products.sum[c], shape, c, [&](std::size_t i) { return t[i] * one(i); });
        for (int k = 0; k < 3; ++k) {
          for (int g = 0; g < 4; ++g) {
            ExpectSum(products.cross[c][g][k], shape, c, [&](std::size_t i) {
              return 1.0 * (g % 2 == 0 ? gx : gy)[i] * (g < 2 ? t[i] : 1.0f) * moment(k, i);
            });
          }
        }
      }
    });
  });
}

TEST(WindowKernelsTest, MomentsAreAboutTheMeanAndExactlyNothingForAFlatChannel) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(5);
    ForEachShape([&](const window_shape& shape) {
      const std::size_t channels = shape.channels;
      Plane x(shape, random, 13.0f), y(shape, random, -4.0f);
      // The last channel flat, at a value that 32-bit sums cannot add up without rounding.
      for (std::size_t i = channels - 1; i < shape.samples(); i += channels) x.data()[i] = 77.3f;
      float x_means[4], y_means[4];
      kernels::ChannelMeans(x.data(), shape, x_means);
      kernels::ChannelMeans(y.data(), shape, y_means);
      EXPECT_EQ(x_means[channels - 1], 77.3f);
      double xx[4], xy[4], yy[4];
      kernels::CentredSquares(x.data(), x_means, shape, xx);
      kernels::CentredProducts(x.data(), x_means, y.data(), y_means, shape, xy, yy);
      EXPECT_EQ(xx[channels - 1], 0.0);
      EXPECT_EQ(xy[channels - 1], 0.0);
      for (int c = 0; c < static_cast<int>(channels); ++c) {
        double mean_x = 0, mean_y = 0;
        for (std::size_t i = c; i < shape.samples(); i += channels) {
          mean_x += x[i] / static_cast<double>(shape.pixels());
          mean_y += y[i] / static_cast<double>(shape.pixels());
        }
        ASSERT_NEAR(x_means[c], mean_x, 1e-4);
        const auto dx = [&](std::size_t i) { return x[i] - static_cast<double>(x_means[c]); };
        const auto dy = [&](std::size_t i) { return y[i] - static_cast<double>(y_means[c]); };
        ASSERT_NEAR(y_means[c], mean_y, 1e-4);
        ExpectSum(xx[c], shape, c, [&](std::size_t i) { return dx(i) * dx(i); });
        ExpectSum(xy[c], shape, c, [&](std::size_t i) { return dx(i) * dy(i); });
        ExpectSum(yy[c], shape, c, [&](std::size_t i) { return dy(i) * dy(i); });
      }
    });
  });
}

}  // namespace
}  // namespace marrow::tracking
