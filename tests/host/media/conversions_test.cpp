// Frames of every layout to pixels and back, beside one plain reference in doubles: the code words
// of ITU-R BT.2100 (table 9), chroma resampled by the cubic of Keys (1981) with a = -0.6.

#define HWY_BROKEN_EMU128 0  // as the kernels have it: the target of last resort is theirs

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <random>
#include <type_traits>
#include <vector>

#include "host/media/deep_yuv.h"
#include "host/media/pixel_conversion.h"
#include "host/media/pixel_planes.h"
#include "tests/support/each_instruction_set.h"

namespace calmframe::media {
namespace {

using Bytes = std::vector<std::uint8_t>;
using Words = std::vector<std::uint16_t>;
using Colour = std::array<double, 4>;  // red, green, blue, alpha; or luma, Cb, Cr, alpha

template <class Pixel>
constexpr double kFull = std::is_same_v<Pixel, HX_Pixel8>    ? 255.0
                         : std::is_same_v<Pixel, HX_Pixel16> ? 32768.0
                                                             : 1.0;

template <class Pixel>
Pixel PixelOf(const Colour& colour) {
  const auto channel = [](double v) {
    return static_cast<decltype(Pixel::alpha)>(v * kFull<Pixel> + (kFull<Pixel> > 1 ? 0.5 : 0.0));
  };
  return {channel(colour[3]), channel(colour[0]), channel(colour[1]), channel(colour[2])};
}
template <class Pixel>
Colour ColourOf(const Pixel& p) {
  return {p.red / kFull<Pixel>, p.green / kFull<Pixel>, p.blue / kFull<Pixel>,
          p.alpha / kFull<Pixel>};
}

// The colours of a frame's pixels. Each row has a pixel more, which stays.
template <class Pixel>
std::vector<Colour> ColoursOf(const AVFrame& frame) {
  ClipInfo info;
  info.width = frame.width;
  info.height = frame.height;
  const int stride = frame.width + 1;
  const Colour beside = ColourOf(PixelOf<Pixel>({0.25, 0.5, 0.75, 0.125}));
  std::vector<Pixel> pixels(stride * frame.height, PixelOf<Pixel>(beside));
  FrameToPixels(info).Convert(frame, pixels.data(), stride * std::ptrdiff_t{sizeof(Pixel)});
  std::vector<Colour> colours;
  for (std::size_t i = 0; i < pixels.size(); ++i) {
    const Colour colour = ColourOf(pixels[i]);
    if ((i + 1) % stride != 0) {
      colours.push_back(colour);
    } else {
      EXPECT_EQ(colour, beside) << i;
    }
  }
  return colours;
}

// Code words of a depth, and the colours that they mean, 0 to 1.
struct Code {
  double red, blue;  // luma weights of the standard
  bool full_range;
  int depth;

  double top() const { return (1 << depth) - 1; }
  double black() const { return full_range ? 0 : 16 << (depth - 8); }
  double luma() const { return full_range ? top() : 219 << (depth - 8); }
  double chroma() const { return full_range ? top() : 224 << (depth - 8); }
  double grey() const { return 1 << (depth - 1); }

  Colour ToColour(const Colour& code) const {
    const double y = (code[0] - black()) / luma();
    const double r = y + 2 * (1 - red) * (code[2] - grey()) / chroma();
    const double b = y + 2 * (1 - blue) * (code[1] - grey()) / chroma();
    return {r, (y - red * r - blue * b) / (1 - red - blue), b, code[3] / top()};
  }
  Colour OfColour(const Colour& c) const {
    const double y = red * c[0] + (1 - red - blue) * c[1] + blue * c[2];
    return {y * luma() + black(), (c[2] - y) / (2 * (1 - blue)) * chroma() + grey(),
            (c[0] - y) / (2 * (1 - red)) * chroma() + grey(), c[3] * top()};
  }
};

using Plane = std::vector<std::vector<double>>;  // rows

double Keys(double x) {
  x = std::fabs(x);
  constexpr double a = -0.6;
  return x < 1   ? ((a + 2) * x - (a + 3)) * x * x + 1
         : x < 2 ? ((a * x - 5 * a) * x + 8 * a) * x - 4 * a
                 : 0;
}

// Each row at places first, first + step ... of its samples, mirrored at its ends; rows become
// columns.
Plane ResampledAndTurned(const Plane& from, int size, double first, double step) {
  Plane turned(size, std::vector<double>(from.size()));
  const int width = from[0].size();
  const double stretch = std::max(1.0, step);
  for (int i = 0; i < size; ++i) {
    const double at = first + i * step;
    std::vector<std::pair<int, double>> taps;
    double total = 0;
    for (int k = static_cast<int>(at - 2 * stretch) - 1; k <= at + 2 * stretch + 1; ++k) {
      const double weight = Keys((k - at) / stretch);
      if (weight == 0) continue;  // a narrow plane has no sample there
      taps.emplace_back(k < 0 ? -1 - k : k < width ? k : 2 * width - 1 - k, weight);
      total += weight;
    }
    for (std::size_t y = 0; y < from.size(); ++y) {
      for (const auto& [k, weight] : taps) turned[i][y] += weight / total * from[y][k];
    }
  }
  return turned;
}

// All of a component's words are 0.
FramePtr BlankPicture(AVPixelFormat format, int width, int height) {
  FramePtr frame = NewPicture(format, width, height);
  for (const AVBufferRef* buffer : frame->buf) {
    if (buffer) std::fill_n(buffer->data, buffer->size, std::uint8_t{0});
  }
  return frame;
}

// Calls visit(component, x, y, word) for a frame's words, which may be set where they are 0.
template <class Visit>
void EachWord(AVFrame& frame, const Visit& visit) {
  const AVPixFmtDescriptor& layout = *av_pix_fmt_desc_get(static_cast<AVPixelFormat>(frame.format));
  for (int k = 0; k < layout.nb_components; ++k) {
    const int width = frame.width >> (k % 3 ? layout.log2_chroma_w : 0);
    Words line(width);
    for (int y = 0; y < frame.height >> (k % 3 ? layout.log2_chroma_h : 0); ++y) {
      av_read_image_line2(line.data(), const_cast<const std::uint8_t**>(frame.data), frame.linesize,
                          &layout, 0, y, k, width, 0, 2);
      for (int x = 0; x < width; ++x) visit(k, x, y, line[x]);
      av_write_image_line2(line.data(), frame.data, frame.linesize, &layout, 0, y, k, width, 2);
    }
  }
}

struct Case {
  AVPixelFormat format;
  int width, height;  // with rests of vectors
  ColourTags tags;
  double red, blue;
  bool full_range;
  double right, down;    // of the first chroma sample, in luma samples
  double coarse, error;  // of 16 bits and floats: bound in code words of the file, and of 1
};

constexpr ColourTags Tags(int matrix, int range, int chroma) {
  return {2, 2, matrix, range, chroma};
}

class ConversionsTest : public testing::TestWithParam<Case> {
 protected:
  const Case& c = GetParam();
  const AVPixFmtDescriptor& layout = *av_pix_fmt_desc_get(c.format);
  const Code code{c.red, c.blue, c.full_range, layout.comp[0].depth};
  const int across = layout.log2_chroma_w, down = layout.log2_chroma_h;
  const double right_place = across ? c.right : 0, down_place = down ? c.down : 0;
  const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  std::mt19937 random{11};

  int WidthOf(int plane) const { return plane % 3 ? c.width >> across : c.width; }
  int HeightOf(int plane) const { return plane % 3 ? c.height >> down : c.height; }
  // Of 16 bits and floats not the edges, where their resampling repeats instead of mirroring.
  template <class Pixel>
  bool Judged(int x, int y) const {
    constexpr int kMargin = 6;
    if (std::is_same_v<Pixel, HX_Pixel8>) return true;
    const auto inside = [](int at, int size) { return at >= kMargin && at < size - kMargin; };
    return (!across || inside(x, c.width)) && (!down || inside(y, c.height));
  }

  template <class Pixel>
  void ExpectPixels(const AVFrame& frame, const std::vector<Plane>& codes) {
    const std::vector<Colour> got = ColoursOf<Pixel>(frame);
    // Floats leave 4e-5 of a code word; a sample that close to a half may fall either way.
    const double bound = kFull<Pixel> == 255 ? 0.5005 / 255 : c.error;
    for (int i = 0; i < c.width * c.height; ++i) {
      const int x = i % c.width, y = i / c.width;
      if (!Judged<Pixel>(x, y)) continue;
      const Colour wanted = code.ToColour(
          {codes[0][y][x], codes[1][y][x], codes[2][y][x], alpha ? codes[3][y][x] : code.top()});
      for (int k = 0; k < 4; ++k) {
        ASSERT_NEAR(got[i][k], std::clamp(wanted[k], 0.0, 1.0), bound) << x << " " << y << " " << k;
      }
    }
  }

  template <class Pixel>
  void ExpectCodes(const std::vector<Colour>& colours) {
    std::vector<Pixel> pixels;
    std::vector<Plane> full(4, Plane(c.height, std::vector<double>(c.width)));
    for (std::size_t i = 0; i < colours.size(); ++i) {
      pixels.push_back(PixelOf<Pixel>(colours[i]));
      Colour colour = ColourOf(pixels[i]);
      for (int k = 0; k < 3 && !alpha; ++k) {
        colour[k] *= colour[3];  // over black, of 8 bits in whole colours
        if (kFull<Pixel> == 255) colour[k] = std::round(colour[k] * 255) / 255;
      }
      const Colour codes = code.OfColour(colour);
      for (int p = 0; p < 4; ++p) full[p][i / c.width][i % c.width] = codes[p];
    }
    for (int p = 1; p < 3; ++p) {
      full[p] =
          ResampledAndTurned(ResampledAndTurned(full[p], WidthOf(p), right_place, 1 << across),
                             HeightOf(p), down_place, 1 << down);
    }
    PixelsToFrame writer(c.format, c.width, c.height, ModelOf(c.tags, c.format, c.width, c.height));
    const FramePtr frame = writer.Convert(pixels.data(), c.width * std::ptrdiff_t{sizeof(Pixel)});
    double worst = 0;
    EachWord(*frame, [&](int p, int x, int y, int word) {
      const bool chroma = p % 3 != 0;
      if (!Judged<Pixel>(chroma ? x << across : x, chroma ? y << down : y)) return;
      worst = std::max(worst, std::fabs(word - std::clamp(full[p][y][x], 0.0, code.top())));
    });
    EXPECT_LE(worst, kFull<Pixel> == 255 ? 0.5005 : c.coarse);
  }
};

TEST_P(ConversionsTest, PixelsAreTheReferenceRounded) {
  const FramePtr frame = BlankPicture(c.format, c.width, c.height);
  frame->colorspace = static_cast<AVColorSpace>(c.tags.matrix);
  frame->color_range = static_cast<AVColorRange>(c.tags.range);
  frame->chroma_location = static_cast<AVChromaLocation>(c.tags.chroma_location);
  std::vector<Plane> codes;
  for (int p = 0; p < 4; ++p) codes.emplace_back(HeightOf(p), std::vector<double>(WidthOf(p)));
  // Chroma that no cubic brings out of range.
  EachWord(*frame, [&](int p, int x, int y, auto& word) {
    const double unit = random() / 4294967295.0;
    word = p % 3 ? code.grey() * (0.5 + unit) : code.top() * unit;
    if (p == 3) word = code.top() * (across ? 1 : 0.5 + unit / 2);  // chroma weighs by it
    codes[p][y][x] = word;
  });
  for (int p = 1; p < 3; ++p) {
    codes[p] = ResampledAndTurned(
        ResampledAndTurned(codes[p], c.width, -right_place / (1 << across), 1.0 / (1 << across)),
        c.height, -down_place / (1 << down), 1.0 / (1 << down));
  }
  tests::OnEachInstructionSet([&] {
    ExpectPixels<HX_Pixel8>(*frame, codes);
    ExpectPixels<HX_Pixel16>(*frame, codes);
    ExpectPixels<HX_PixelFloat>(*frame, codes);
  });
}

TEST_P(ConversionsTest, CodeWordsAreTheReferenceRounded) {
  std::vector<Colour> colours;
  for (int i = 0; i < c.width * c.height; ++i) {
    const auto unit = [&] { return random() % 256 / 255.0; };
    // Opaque but for a corner.
    const bool clear = i % c.width < 40 && i / c.width < 9;
    colours.push_back({unit(), unit(), unit(), clear ? unit() : 1.0});
  }
  tests::OnEachInstructionSet([&] {
    ExpectCodes<HX_Pixel8>(colours);
    ExpectCodes<HX_Pixel16>(colours);
    ExpectCodes<HX_PixelFloat>(colours);
  });
}

// Every place of chroma, every matrix, both ranges, tagged or as players take them to be.
const Case kCases[] = {
    {AV_PIX_FMT_YUV420P, 64, 32, Tags(1, 1, 1), 0.2126, 0.0722, false, 0, 0.5, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 98, 34, Tags(6, 2, 2), 0.299, 0.114, true, 0.5, 0.5, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 66, 38, Tags(9, 1, 3), 0.2627, 0.0593, false, 0, 0, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 126, 62, Tags(4, 2, 4), 0.30, 0.11, true, 0.5, 0, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 80, 32, Tags(7, 1, 5), 0.212, 0.087, false, 0, 1, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 72, 48, Tags(5, 2, 6), 0.299, 0.114, true, 0.5, 1, 1.6, 0.004},
    {AV_PIX_FMT_YUVJ420P, 64, 40, Tags(2, 0, 0), 0.299, 0.114, true, 0.5, 0.5, 1.6, 0.004},
    {AV_PIX_FMT_YUV422P, 70, 720, Tags(2, 0, 0), 0.2126, 0.0722, false, 0, 0, 1.6, 0.004},
    {AV_PIX_FMT_YUV440P, 50, 34, Tags(1, 1, 4), 0.2126, 0.0722, false, 0.5, 0, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P, 8, 10, Tags(6, 1, 1), 0.299, 0.114, false, 0, 0.5, 1.6, 0.004},
    {AV_PIX_FMT_YUVA420P, 30, 18, Tags(2, 2, 0), 0.299, 0.114, true, 0, 0.5, 1.6, 0.004},
    {AV_PIX_FMT_YUV420P10, 66, 34, Tags(9, 1, 2), 0.2627, 0.0593, false, 0.5, 0.5, 1.6, 0.002},
    {AV_PIX_FMT_YUV422P10, 70, 20, Tags(1, 2, 1), 0.2126, 0.0722, true, 0, 0, 1.6, 0.002},
    {AV_PIX_FMT_YUVA444P10, 37, 20, Tags(1, 1, 0), 0.2126, 0.0722, false, 0, 0, 1, 2e-5},
    {AV_PIX_FMT_YUV444P12, 37, 20, Tags(10, 1, 0), 0.2627, 0.0593, false, 0, 0, 1, 2e-5},
    {AV_PIX_FMT_YUV444P16, 1, 3, Tags(6, 1, 0), 0.299, 0.114, false, 0, 0, 0.6, 2e-5},
    {AV_PIX_FMT_YUV444P16, 15, 3, Tags(6, 1, 0), 0.299, 0.114, false, 0, 0, 0.6, 2e-5},
    {AV_PIX_FMT_YUVA444P16, 16, 3, Tags(6, 2, 0), 0.299, 0.114, true, 0, 0, 0.6, 2e-5},
    {AV_PIX_FMT_YUVA444P16, 17, 3, Tags(6, 1, 0), 0.299, 0.114, false, 0, 0, 0.6, 2e-5},
};
INSTANTIATE_TEST_SUITE_P(Layouts, ConversionsTest, testing::ValuesIn(kCases));

// What no file holds, but a plug-in may render.
TEST(DeepYuvTest, ColoursOutOfRangeAreClampedAndNoNumberIsBlack) {
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

// The rows of two fields, red and blue in turn: their chroma is theirs alone.
TEST(FieldsTest, ChromaOfInterlacedFramesStaysInItsField) {
  constexpr int kSize = 32;
  for (const auto& [format, shift] :
       {std::pair{AV_PIX_FMT_YUV420P, 0}, {AV_PIX_FMT_YUV420P10, 2}}) {
    const FramePtr frame = BlankPicture(format, kSize, kSize);
    frame->interlaced_frame = 1;
    frame->colorspace = AVCOL_SPC_BT709;
    // Red is 63, 102, 240 and blue 32, 240, 118, ITU-R BT.709 limited.
    constexpr int kCodes[3][2] = {{63, 32}, {102, 240}, {240, 118}};
    EachWord(*frame, [&, shift = shift](int p, int, int y, auto& word) {
      word = kCodes[p][y % 2] << shift;
    });
    for (const auto& colours : {ColoursOf<HX_Pixel8>(*frame), ColoursOf<HX_Pixel16>(*frame)}) {
      for (int y = 0; y < kSize; ++y) {
        const Colour& colour = colours[y * kSize + 9];
        EXPECT_NEAR(colour[y % 2 ? 2 : 0], 1, 0.012) << y;
        EXPECT_NEAR(colour[y % 2 ? 0 : 2], 0, 0.012) << y;
      }
    }
  }
}

// Grey, RGB, palette and black and white: one code word, and the colour that it means.
TEST(ComponentsTest, OtherLayoutsMeanTheirNumbers) {
  const struct {
    AVPixelFormat format;
    int range;
    int word;      // in every component
    double value;  // of 1, in every colour
  } cases[] = {{AV_PIX_FMT_GRAY8, 1, 235, 1},   {AV_PIX_FMT_GRAY8, 2, 51, 0.2},
               {AV_PIX_FMT_GRAY8, 0, 255, 1},   {AV_PIX_FMT_GRAY10, 1, 64, 0},
               {AV_PIX_FMT_GRAY10, 1, 940, 1},  {AV_PIX_FMT_RGB24, 0, 102, 0.4},
               {AV_PIX_FMT_GBRP12, 0, 4095, 1}, {AV_PIX_FMT_GBRP12, 0, 819, 0.2},
               {AV_PIX_FMT_MONOWHITE, 0, 0, 1}, {AV_PIX_FMT_MONOWHITE, 0, 1, 0},
               {AV_PIX_FMT_MONOBLACK, 0, 1, 1}, {AV_PIX_FMT_YA8, 2, 51, 0.2}};
  constexpr int kSize = 9;
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << av_get_pix_fmt_name(c.format) << " " << c.word);
    const FramePtr frame = BlankPicture(c.format, kSize, kSize);
    frame->color_range = static_cast<AVColorRange>(c.range);
    EachWord(*frame, [&](int, int, int, auto& word) { word = c.word; });
    const auto expect = [&](const std::vector<Colour>& colours, double bound) {
      for (int k = 0; k < 3; ++k) EXPECT_NEAR(colours.back()[k], c.value, bound);
      EXPECT_NEAR(colours.back()[3], c.format == AV_PIX_FMT_YA8 ? c.value : 1, bound);
    };
    expect(ColoursOf<HX_Pixel8>(*frame), 1e-9);
    expect(ColoursOf<HX_Pixel16>(*frame), 0.51 / 32768);
    expect(ColoursOf<HX_PixelFloat>(*frame), 1e-6);
  }
}

TEST(PixelPlanesTest, EveryColourUnderEveryAlphaIsRoundedOverBlack) {
  tests::OnEachInstructionSet([] {
    for (int alpha = 0; alpha < 256; ++alpha) {
      Bytes pixels, red(256), green(256), blue(256);
      for (int value = 0; value < 256; ++value) {
        for (const int byte : {alpha, value, 255 - value, value / 2}) pixels.push_back(byte);
      }
      UnpackPixels(pixels.data(), 256, {nullptr, red.data(), green.data(), blue.data()});
      for (int i = 0; i < 256; ++i) {
        const auto over_black = [&](int c) { return (pixels[4 * i + c] * alpha + 127) / 255; };
        ASSERT_EQ((std::array<int, 3>{red[i], green[i], blue[i]}),
                  (std::array{over_black(1), over_black(2), over_black(3)}))
            << i << " under " << alpha;
      }
    }
  });
}

}  // namespace
}  // namespace calmframe::media
