#include "host/media/yuv420.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <random>
#include <vector>

#include "tests/host/media/instruction_sets.h"

namespace calmframe::media {
namespace {

// One channel or plane in doubles.
struct Plane {
  Plane(int w, int h) : width(w), height(h), values(static_cast<std::size_t>(w) * h) {}
  double& at(int x, int y) { return values[static_cast<std::size_t>(y) * width + x]; }
  double at(int x, int y) const { return values[static_cast<std::size_t>(y) * width + x]; }
  // Mirrored at its ends.
  double Beyond(int x, int y) const {
    const auto inside = [](int i, int size) {
      return i < 0 ? -1 - i : i < size ? i : 2 * size - 1 - i;
    };
    return at(inside(x, width), inside(y, height));
  }
  int width, height;
  std::vector<double> values;
};

double Keys(double x) {
  x = std::fabs(x);
  constexpr double a = -0.6;
  return x < 1   ? ((a + 2) * x - (a + 3)) * x * x + 1
         : x < 2 ? ((a * x - 5 * a) * x + 8 * a) * x - 4 * a
                 : 0;
}

// Sample (x, y) of the result lies at (place(x), place(y)) of `from`.
Plane Resampled(const Plane& from, int width, int height, const std::function<double(int)>& place_x,
                const std::function<double(int)>& place_y) {
  const double stretch = std::max(1, from.width / width);
  const auto axis = [&](int size, const std::function<double(int)>& place, const auto& value) {
    for (int i = 0; i < size; ++i) {
      const double at = place(i);
      std::vector<std::pair<int, double>> taps;
      double total = 0;
      for (int k = static_cast<int>(at - 2 * stretch) - 1; k <= at + 2 * stretch + 1; ++k) {
        taps.emplace_back(k, Keys((k - at) / stretch));
        total += taps.back().second;
      }
      for (auto& tap : taps) tap.second /= total;
      value(i, taps);
    }
  };
  Plane across(width, from.height), result(width, height);
  axis(width, place_x, [&](int x, const auto& taps) {
    for (int y = 0; y < from.height; ++y) {
      for (const auto& [k, weight] : taps) across.at(x, y) += weight * from.Beyond(k, y);
    }
  });
  axis(height, place_y, [&](int y, const auto& taps) {
    for (int x = 0; x < width; ++x) {
      for (const auto& [k, weight] : taps) result.at(x, y) += weight * across.Beyond(x, k);
    }
  });
  return result;
}

struct Case {
  int width, height;
  AVColorSpace matrix;
  double red, blue;  // luma weights
  bool full_range;
  AVChromaLocation chroma;
  double right, down;  // of the first chroma sample, in luma samples
};

// Sizes with rests of vectors; every place, every matrix, both ranges.
const Case kCases[] = {
    {64, 32, AVCOL_SPC_BT709, 0.2126, 0.0722, false, AVCHROMA_LOC_LEFT, 0, 0.5},
    {98, 34, AVCOL_SPC_SMPTE170M, 0.299, 0.114, true, AVCHROMA_LOC_CENTER, 0.5, 0.5},
    {66, 38, AVCOL_SPC_BT2020_NCL, 0.2627, 0.0593, false, AVCHROMA_LOC_TOPLEFT, 0, 0},
    {126, 62, AVCOL_SPC_FCC, 0.30, 0.11, true, AVCHROMA_LOC_TOP, 0.5, 0},
    {80, 32, AVCOL_SPC_SMPTE240M, 0.212, 0.087, false, AVCHROMA_LOC_BOTTOMLEFT, 0, 1},
    {72, 48, AVCOL_SPC_BT470BG, 0.299, 0.114, false, AVCHROMA_LOC_BOTTOM, 0.5, 1},
};

class Yuv420Test : public testing::TestWithParam<Case> {
 protected:
  Yuv420Test() {
    model_.matrix = c_.matrix;
    model_.full_range = c_.full_range;
    model_.chroma = c_.chroma;
  }
  // Floats leave 4e-5 of a code word; a sample that close to a half may fall either way.
  static void ExpectRounded(int got, double wanted) {
    EXPECT_LE(std::fabs(got - std::clamp(wanted, 0.0, 255.0)), 0.5 + 1e-4);
  }
  double Luma(double r, double g, double b) const {
    return c_.red * r + (1 - c_.red - c_.blue) * g + c_.blue * b;
  }

  const Case c_ = GetParam();
  const double luma_ = c_.full_range ? 255 : 219, chroma_ = c_.full_range ? 255 : 224;
  const double black_ = c_.full_range ? 0 : 16;
  ColourModel model_;
  std::mt19937 random_{11};
};

TEST_P(Yuv420Test, PixelsAreTheReferenceRounded) {
  const FramePtr frame = NewPicture(AV_PIX_FMT_YUV420P, c_.width, c_.height);
  std::vector<Plane> planes;
  for (int p = 0; p < 3; ++p) {
    planes.emplace_back(p ? c_.width / 2 : c_.width, p ? c_.height / 2 : c_.height);
    for (int y = 0; y < planes[p].height; ++y) {
      for (int x = 0; x < planes[p].width; ++x) {
        const auto code = static_cast<std::uint8_t>(random_());
        frame->data[p][y * frame->linesize[p] + x] = code;
        planes[p].at(x, y) = p ? (code - 128) / chroma_ : (code - black_) / luma_;
      }
    }
  }
  for (int p = 1; p < 3; ++p) {
    planes[p] = Resampled(
        planes[p], c_.width, c_.height, [&](int x) { return (x - c_.right) / 2; },
        [&](int y) { return (y - c_.down) / 2; });
  }
  tests::OnEachInstructionSet([&] {
    Yuv420 converter(c_.width, c_.height, model_);
    // A pixel more in each row, which stays.
    std::vector<HX_Pixel8> pixels((c_.width + 1) * c_.height, {1, 2, 3, 4});
    converter.ToPixels(*frame, pixels.data(), (c_.width + 1) * 4);
    for (int y = 0; y < c_.height; ++y) {
      for (int x = 0; x < c_.width; ++x) {
        const double luma = planes[0].at(x, y);
        const double red = luma + 2 * (1 - c_.red) * planes[2].at(x, y);
        const double blue = luma + 2 * (1 - c_.blue) * planes[1].at(x, y);
        const HX_Pixel8& pixel = pixels[y * (c_.width + 1) + x];
        ASSERT_EQ(pixel.alpha, 255);
        ExpectRounded(pixel.red, 255 * red);
        ExpectRounded(pixel.green,
                      255 * (luma - c_.red * red - c_.blue * blue) / (1 - c_.red - c_.blue));
        ExpectRounded(pixel.blue, 255 * blue);
      }
      const HX_Pixel8& behind = pixels[y * (c_.width + 1) + c_.width];
      ASSERT_TRUE(behind.alpha == 1 && behind.blue == 4);
    }
  });
}

TEST_P(Yuv420Test, CodeWordsAreTheReferenceRounded) {
  std::vector<HX_Pixel8> pixels(c_.width * c_.height);
  Plane luma(c_.width, c_.height), u = luma, v = luma;
  for (int y = 0; y < c_.height; ++y) {
    for (int x = 0; x < c_.width; ++x) {
      const auto byte = [&] { return static_cast<std::uint8_t>(random_()); };
      // Opaque but for a corner, where pixels stand over black, in whole colours.
      const std::uint8_t alpha = x < 40 && y < 9 ? byte() : std::uint8_t{255};
      HX_Pixel8& pixel = pixels[y * c_.width + x] = {alpha, byte(), byte(), byte()};
      const auto unit = [&](int value) { return (value * alpha + 127) / 255 / 255.0; };
      const double red = unit(pixel.red), blue = unit(pixel.blue);
      luma.at(x, y) = Luma(red, unit(pixel.green), blue);
      u.at(x, y) = (blue - luma.at(x, y)) / (2 * (1 - c_.blue));
      v.at(x, y) = (red - luma.at(x, y)) / (2 * (1 - c_.red));
    }
  }
  for (Plane* plane : {&u, &v}) {
    *plane = Resampled(
        *plane, c_.width / 2, c_.height / 2, [&](int x) { return 2 * x + c_.right; },
        [&](int y) { return 2 * y + c_.down; });
  }
  tests::OnEachInstructionSet([&] {
    Yuv420 converter(c_.width, c_.height, model_);
    const FramePtr frame = NewPicture(AV_PIX_FMT_YUV420P, c_.width, c_.height);
    converter.FromPixels(pixels.data(), c_.width * 4, *frame);
    const auto expect = [&](int p, const Plane& plane, double range, double zero) {
      for (int y = 0; y < plane.height; ++y) {
        for (int x = 0; x < plane.width; ++x) {
          ExpectRounded(frame->data[p][y * frame->linesize[p] + x], range * plane.at(x, y) + zero);
        }
      }
    };
    expect(0, luma, luma_, black_);
    expect(1, u, chroma_, 128);
    expect(2, v, chroma_, 128);
  });
}

INSTANTIATE_TEST_SUITE_P(Models, Yuv420Test, testing::ValuesIn(kCases));

}  // namespace
}  // namespace calmframe::media
