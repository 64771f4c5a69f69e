#include "stabilizer/render/frame_renderer.h"
#include "stabilizer/render/output_rect.h"

#include <gtest/gtest.h>
#include <tbb/global_control.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>
#include <limits>
#include <random>

#include "tests/stabilizer/render/pixel_operations.h"
#include "tests/support/each_instruction_set.h"

namespace marrow::render {
using stabilization::frame_bounds;
using stabilization::inverse;
using stabilization::matrix3;
using stabilization::point2;
using stabilization::square_to_quad;
using stabilization::transform;
using stabilization::VarVector;

namespace {

template <class Pixel>
struct depth;
template <>
struct depth<HX_Pixel8> {
  // At a fraction of just one half each of the two roundings may fall the other way.
  static constexpr double full = 255, tolerance = 2.01;
};
template <>
struct depth<HX_Pixel16> {
  static constexpr double full = 32768,
                          tolerance = 3.01;  // 2e-5 pixels of a full-range step, twice
};
template <>
struct depth<HX_PixelFloat> {
  static constexpr double full = 1, tolerance = 1e-4;
};

using motion = std::function<point2(double, double)>;

class Clip final : public ClipWarps {
 public:
  Clip(int width, int height, int cols, int rows, const motion& to)
      : width_(width), height_(height), warp(cols, rows) {
    for (int r = 0; r < rows; ++r) {
      for (int c = 0; c < cols; ++c) {
        const point2 p = to(c * (width - 1.0) / (cols - 1), r * (height - 1.0) / (rows - 1));
        set(c, r, p);
        bounds.min_x = std::min(bounds.min_x, p.x);
        bounds.max_x = std::max(bounds.max_x, p.x);
        bounds.min_y = std::min(bounds.min_y, p.y);
        bounds.max_y = std::max(bounds.max_y, p.y);
      }
    }
  }
  void set(int c, int r, point2 p) {
    warp.values[2 * (r * warp.cols + c)] = p.x;
    warp.values[2 * (r * warp.cols + c) + 1] = p.y;
  }
  std::size_t frameCount() const override { return 1; }
  const VarVector& frameWarp(std::size_t) const override { return warp; }
  bool warpedGridOfFrame(std::size_t, std::size_t, VarVector&) const override { return false; }
  frame_bounds unionBounds() const override { return bounds; }
  std::int32_t frameWidth() const override { return width_; }
  std::int32_t frameHeight() const override { return height_; }
  std::int32_t gridCols() const override { return warp.cols; }
  std::int32_t gridRows() const override { return warp.rows; }

 private:
  int width_, height_;

 public:
  VarVector warp;
  frame_bounds bounds{1e9, 1e9, -1e9, -1e9};
};

template <class Pixel>
class OneFrame final : public SourceFrames<Pixel> {
 public:
  explicit OneFrame(boost::shared_ptr<const WorldX<Pixel>> world) : world_(world) {}
  boost::shared_ptr<const WorldX<Pixel>> Fetch(std::size_t) override { return world_; }

 private:
  boost::shared_ptr<const WorldX<Pixel>> world_;
};

template <class Pixel>
using channel_of = decltype(Pixel::alpha);

enum class alphas { full, edges };

template <class Pixel>
boost::shared_ptr<WorldX<Pixel>> textured(int width, int height, alphas a) {
  const auto world = boost::make_shared<WorldX<Pixel>>(width, height);
  std::mt19937 random(7);
  const double full = depth<Pixel>::full;
  const auto value = [&] {
    return static_cast<channel_of<Pixel>>(full * static_cast<double>(random() % 1000) / 999.0);
  };
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      Pixel& p = world->row(y)[x];
      p = {static_cast<channel_of<Pixel>>(full), value(), value(), value()};
      if (a == alphas::edges && (x / 7 + y / 5) % 3 == 0) p.alpha = 0;
      if (a == alphas::edges && (x / 7 + y / 5) % 3 == 1) p.alpha = value();
    }
  }
  return world;
}

struct sample {
  double v[4];  // alpha first
};

template <class Pixel>
sample mix(sample p, sample q, double t) {
  sample result{};
  const double a = p.v[0], b = q.v[0];
  result.v[0] = a * (1 - t) + b * t;
  if (result.v[0] == 0) return {};
  for (int i = 1; i < 4; ++i) {
    result.v[i] = a == b ? p.v[i] * (1 - t) + q.v[i] * t
                         : (p.v[i] * a * (1 - t) + q.v[i] * b * t) / result.v[0];
  }
  if (depth<Pixel>::full != 1) {
    for (double& v : result.v) v = std::trunc(v + 0.5);
  }
  return result;
}

// Pixel by pixel in f64, every cell's every pixel, cells in order.
template <class Pixel>
std::vector<sample> plain_render(const Renderer& R, const std::vector<double>& vertices,
                                 const WorldX<Pixel>& source, int dest_w, int dest_h,
                                 const crop_rect& rect, double z, bool crop) {
  std::vector<sample> out(static_cast<std::size_t>(dest_w) * dest_h);
  const double cx = ((rect.right + R.boundsMinX) * z + (rect.left + R.boundsMinX) * z) / 2;
  const double cy = ((rect.bottom + R.boundsMinY) * z + (rect.top + R.boundsMinY) * z) / 2;
  const long icx = static_cast<long>(cx), icy = static_cast<long>(cy);
  const double hx = ((crop ? dest_w : R.planeWidth) - 1) * 0.5;
  const double hy = ((crop ? dest_h : R.planeHeight) - 1) * 0.5;
  const long ihx = static_cast<long>(hx), ihy = static_cast<long>(hy);
  const double ox = (cx - icx) - (hx - ihx), oy = (cy - icy) - (hy - ihy);
  const double W = std::trunc(R.planeWidth * z), H = std::trunc(R.planeHeight * z);
  const double d2 = std::max(4.0, 4 / (z * z));
  const auto at = [&](int c, int r) {
    return point2{vertices[2 * (r * R.cols + c)], vertices[2 * (r * R.cols + c) + 1]};
  };
  const auto cross = [](point2 a, point2 b, double x, double y) {
    return (b.x - a.x) * (y - a.y) - (b.y - a.y) * (x - a.x);
  };
  const auto near = [&](point2 a, point2 b, double x, double y) {
    const double len2 = (b.x - a.x) * (b.x - a.x) + (b.y - a.y) * (b.y - a.y);
    return len2 == 0 || cross(a, b, x, y) * cross(a, b, x, y) / len2 < d2;
  };
  const auto pixel = [&](int x, int y) {
    const Pixel& p = source.row(std::min(y, source.height() - 1))[std::min(x, source.width() - 1)];
    return sample{{double(p.alpha), double(p.red), double(p.green), double(p.blue)}};
  };
  for (int r = 0; r + 1 < R.rows; ++r) {
    for (int c = 0; c + 1 < R.cols; ++c) {
      const bool border =
          (!crop || R.edgeTolerant) && (c == 0 || r == 0 || c == R.cols - 2 || r == R.rows - 2);
      const point2 q[4] = {at(c, r), at(c + 1, r), at(c, r + 1), at(c + 1, r + 1)};
      bool finite = true;
      double x_low = 1e18, x_high = -1e18, y_low = 1e18, y_high = -1e18;
      for (const point2& p : q) {
        finite = finite && std::isfinite(p.x) && std::isfinite(p.y);
        x_low = std::min(x_low, p.x), x_high = std::max(x_high, p.x);
        y_low = std::min(y_low, p.y), y_high = std::max(y_high, p.y);
      }
      const matrix3 h = inverse(square_to_quad(q[0], q[1], q[2], q[3]));
      for (double e : h) finite = finite && std::isfinite(e);
      if (!finite) continue;
      for (double y = std::floor(z * y_low - 1); y < std::min(std::ceil(z * y_high + 1), H); ++y) {
        const double dy = y - icy + ihy;
        for (double x = std::floor(z * x_low - 1); x < std::min(std::ceil(z * x_high + 1), W);
             ++x) {
          const double dx = x - icx + ihx;
          if (!border && (dx < (crop ? R.outLeft : 0) || dx >= (crop ? R.outRight : dest_w) ||
                          dy < (crop ? R.outTop : 0) || dy >= (crop ? R.outBottom : dest_h))) {
            continue;
          }
          const double tx = x / z, ty = y / z;
          bool inside = cross(q[0], q[1], tx, ty) >= 0 && cross(q[1], q[3], tx, ty) >= 0 &&
                        cross(q[3], q[2], tx, ty) >= 0 && cross(q[2], q[0], tx, ty) >= 0;
          if (!inside && border) {
            inside = (r == 0 && near(q[0], q[1], tx, ty)) ||
                     (r == R.rows - 2 && near(q[3], q[2], tx, ty)) ||
                     (c == 0 && near(q[2], q[0], tx, ty)) ||
                     (c == R.cols - 2 && near(q[1], q[3], tx, ty));
          }
          const double px = (x + ox) / z, py = (y + oy) / z;
          if (!inside || !(px < R.planeWidth && py < R.planeHeight)) continue;
          if (dx < 0 || dx >= dest_w || dy < 0 || dy >= dest_h) continue;
          const point2 uv = transform(h, point2{px, py});
          const auto clamped = [](double s, int size) {
            return std::max(0.0, std::min(std::max(s, 0.0001), size - 1.0001));
          };
          const double sx =
              clamped((c + uv.x) * R.cellWidth - 0.5, std::min(R.sourceWidth, source.width()));
          const double sy =
              clamped((r + uv.y) * R.cellHeight - 0.5, std::min(R.sourceHeight, source.height()));
          const int ix = static_cast<int>(sx), iy = static_cast<int>(sy);
          out[static_cast<std::size_t>(dy) * dest_w + static_cast<std::size_t>(dx)] =
              mix<Pixel>(mix<Pixel>(pixel(ix, iy), pixel(ix, iy + 1), sy - iy),
                         mix<Pixel>(pixel(ix + 1, iy), pixel(ix + 1, iy + 1), sy - iy), sx - ix);
        }
      }
    }
  }
  return out;
}

struct scene {
  int width = 61, height = 43;
  int cols = 5, rows = 4;
  motion to = [](double x, double y) { return point2{x, y}; };
  Framing framing = Framing::stabilize_only;
  float additional = 1;
  float scale = 1;
  alphas alpha = alphas::full;
  std::function<void(Clip&)> damage = [](Clip&) {};
};

template <class Pixel>
void expect_as_plain(const scene& s) {
  Clip clip(s.width, s.height, s.cols, s.rows, s.to);
  s.damage(clip);
  Renderer R = makeRenderer(clip, s.scale, s.scale);
  const auto source = textured<Pixel>(R.sourceWidth, R.sourceHeight, s.alpha);
  OneFrame<Pixel> frames(source);
  PixelOperations<Pixel> operations;
  cropper crop(1, 1, 1);
  crop.rects[0] = {4, s.width - 7.0f, 3, s.height - 6.0f};
  crop.cropWidth = s.width - 10;
  crop.cropHeight = s.height - 8;
  RenderSettings settings;
  settings.framing = s.framing;
  settings.additional_scale = s.additional;
  const OutputRect size = setupOutputRect(s.framing, R, R.sourceWidth, R.sourceHeight);
  // Padded rows, and for bytes rows that begin anywhere; padding must stay as it is.
  const int out_w = std::max(size.width, 1), out_h = std::max(size.height, 1);
  const std::ptrdiff_t row_bytes =
      static_cast<std::ptrdiff_t>(sizeof(Pixel)) * out_w + 3 * alignof(Pixel);
  std::vector<unsigned char> buffer(static_cast<std::size_t>(row_bytes) * out_h + 64, 0xAB);
  WorldX<Pixel> out(out_w, out_h, row_bytes, reinterpret_cast<Pixel*>(buffer.data()));
  ASSERT_TRUE(renderFrame(clip, &crop, settings, R, 0, frames, operations, out));

  std::vector<double> vertices = clip.warp.values;
  for (double& v : vertices) v *= s.scale;
  crop_rect rect = crop.rects[0];
  if (crops(s.framing)) {
    rect = {rect.left * s.scale, rect.right * s.scale, rect.top * s.scale, rect.bottom * s.scale};
  } else {
    rect = {0, R.planeWidth - 1.0f, 0, R.planeHeight - 1.0f};
  }
  const double zoom = getZoom(clip, &crop, settings, R);
  const std::vector<sample> expected =
      plain_render(R, vertices, *source, out_w, out_h, rect, zoom, crops(s.framing));
  double worst = 0;
  int uncovered = 0;
  for (int y = 0; y < out_h; ++y) {
    for (int x = 0; x < out_w; ++x) {
      const Pixel& p = out.row(y)[x];
      const sample& e = expected[static_cast<std::size_t>(y) * out_w + x];
      uncovered += (p.alpha == 0) != (e.v[0] == 0);
      worst = std::max(worst, std::fabs(p.alpha - e.v[0]));
      const double got[3] = {double(p.red), double(p.green), double(p.blue)};
      // Where alpha is small a colour is a quotient of two small numbers: what counts is how it
      // shows.
      for (int i = 0; i < 3; ++i) {
        worst =
            std::max(worst, std::fabs(got[i] * p.alpha - e.v[i + 1] * e.v[0]) / depth<Pixel>::full);
      }
    }
    for (std::ptrdiff_t i = static_cast<std::ptrdiff_t>(sizeof(Pixel)) * out_w; i < row_bytes;
         ++i) {
      ASSERT_EQ(buffer[static_cast<std::size_t>(row_bytes * y + i)], 0xAB);
    }
  }
  EXPECT_EQ(uncovered, 0);
  EXPECT_LE(worst, depth<Pixel>::tolerance);
}

point2 turned(double x, double y) {
  const double w = 1 + 4e-4 * x - 3e-4 * y;
  return {(1.03 * x - .06 * y + 2.3) / w, (.05 * x + .97 * y - 1.7) / w};
}

template <class Pixel>
class FrameRenderer : public testing::Test {};
using Depths = testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(FrameRenderer, Depths);

TYPED_TEST(FrameRenderer, FramingsZoomsAndScales) {
  for (const Framing framing : {Framing::stabilize_only, Framing::crop, Framing::crop_auto_scale}) {
    for (const float additional : {0.5f, 1.0f, 2.0f}) {
      for (const float scale : {1.0f, 0.5f}) {
        for (const alphas a : {alphas::full, alphas::edges}) {
          SCOPED_TRACE(testing::Message() << static_cast<int>(framing) << " " << additional << " "
                                          << scale << " " << static_cast<int>(a));
          expect_as_plain<TypeParam>({.to = turned,
                                      .framing = framing,
                                      .additional = additional,
                                      .scale = scale,
                                      .alpha = a});
        }
      }
    }
  }
}

TYPED_TEST(FrameRenderer, ThePlanesWidthLimitsPixelsFarFromItsOrigin) {
  expect_as_plain<TypeParam>({.to =
                                  [](double x, double y) {
                                    return point2{x + 20, y + 9};
                                  },
                              .framing = Framing::crop_auto_scale});
}

TYPED_TEST(FrameRenderer, WideCellsAndOddSizes) {
  expect_as_plain<TypeParam>({.width = 401, .height = 7, .cols = 2, .rows = 2, .to = turned});
  expect_as_plain<TypeParam>({.width = 3, .height = 2, .cols = 2, .rows = 2});
  expect_as_plain<TypeParam>({.width = 2, .height = 3, .cols = 2, .rows = 2});
  expect_as_plain<TypeParam>({.width = 1, .height = 1, .cols = 2, .rows = 2});
  expect_as_plain<TypeParam>({.width = 1, .height = 9, .cols = 2, .rows = 2});
  expect_as_plain<TypeParam>({.width = 9, .height = 1, .cols = 2, .rows = 2});
}

TYPED_TEST(FrameRenderer, BrokenMeshes) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  expect_as_plain<TypeParam>({.damage = [&](Clip& c) { c.set(2, 1, {nan, nan}); }});
  expect_as_plain<TypeParam>({.damage = [&](Clip& c) { c.set(0, 3, {30, INFINITY}); }});
  expect_as_plain<TypeParam>({.damage = [](Clip& c) { c.set(1, 1, {50, 20}); }});  // folded
  expect_as_plain<TypeParam>({.damage = [](Clip& c) { c.set(1, 1, {15, 0}); }});   // collapsed edge
  expect_as_plain<TypeParam>(
      {.damage = [](Clip& c) { std::fill(c.warp.values.begin(), c.warp.values.end(), 0.0); }});
  expect_as_plain<TypeParam>(
      {.damage = [&](Clip& c) { std::fill(c.warp.values.begin(), c.warp.values.end(), nan); }});
}

TYPED_TEST(FrameRenderer, IdentityIsTheSourceAtHalfPixels) {
  Clip clip(40, 30, 4, 3, [](double x, double y) { return point2{x, y}; });
  Renderer R = makeRenderer(clip, 1, 1);
  const auto source = boost::make_shared<WorldX<TypeParam>>(40, 30);
  const double unit = depth<TypeParam>::full / 256;
  for (int y = 0; y < 30; ++y) {
    for (int x = 0; x < 40; ++x) {
      const auto v = static_cast<channel_of<TypeParam>>(unit * 4 * x);
      source->row(y)[x] = {static_cast<channel_of<TypeParam>>(depth<TypeParam>::full), v, v, v};
    }
  }
  OneFrame<TypeParam> frames(source);
  PixelOperations<TypeParam> operations;
  RenderSettings settings;
  settings.framing = Framing::stabilize_only;
  WorldX<TypeParam> out(R.planeWidth, R.planeHeight);
  ASSERT_TRUE(renderFrame<TypeParam>(clip, nullptr, settings, R, 0, frames, operations, out));
  EXPECT_NEAR(out.row(10)[20].red, unit * 4 * 19.5,
              std::max(1e-5, depth<TypeParam>::full > 1 ? 1. : 0));
  EXPECT_FALSE(renderFrame<TypeParam>(clip, nullptr, settings, R, 1, frames, operations, out));
}

// Each kernel that this processor runs, to the bit: rows of many vectors and rests of all lengths,
// opaque stretches and edges of alpha.
TYPED_TEST(FrameRenderer, InstructionSetNeverShows) {
  for (const alphas a : {alphas::full, alphas::edges}) {
    Clip clip(403, 57, 9, 4, turned);
    Renderer R = makeRenderer(clip, 1, 1);
    OneFrame<TypeParam> frames(textured<TypeParam>(403, 57, a));
    PixelOperations<TypeParam> operations;
    RenderSettings settings;
    settings.framing = Framing::stabilize_only;
    std::vector<unsigned char> first;
    tests::OnEachInstructionSet([&] {
      WorldX<TypeParam> out(R.planeWidth, R.planeHeight);
      renderFrame<TypeParam>(clip, nullptr, settings, R, 0, frames, operations, out);
      const auto* bytes = reinterpret_cast<const unsigned char*>(out.data());
      const std::vector<unsigned char> drawn(bytes, bytes + out.row_bytes() * out.height());
      if (first.empty()) first = drawn;
      EXPECT_TRUE(drawn == first);
    });
  }
}

TYPED_TEST(FrameRenderer, ThreadCountNeverShows) {
  Clip clip(320, 240, 20, 15, turned);
  clip.set(7, 7, {60, 190});  // overlapping cells across many bands
  Renderer R = makeRenderer(clip, 1, 1);
  OneFrame<TypeParam> frames(textured<TypeParam>(320, 240, alphas::edges));
  PixelOperations<TypeParam> operations;
  RenderSettings settings;
  settings.framing = Framing::stabilize_only;
  WorldX<TypeParam> one(R.planeWidth, R.planeHeight), many(R.planeWidth, R.planeHeight);
  {
    const tbb::global_control single(tbb::global_control::max_allowed_parallelism, 1);
    renderFrame<TypeParam>(clip, nullptr, settings, R, 0, frames, operations, one);
  }
  for (int i = 0; i < 5; ++i) {
    renderFrame<TypeParam>(clip, nullptr, settings, R, 0, frames, operations, many);
    ASSERT_EQ(std::memcmp(one.data(), many.data(),
                          sizeof(TypeParam) * static_cast<std::size_t>(one.width() * one.height())),
              0);
  }
}

TEST(FrameRendererAlpha, ColourOfTransparentPixelsDoesNotShow) {
  Clip clip(16, 16, 3, 3, [](double x, double y) { return point2{x, y}; });
  Renderer R = makeRenderer(clip, 1, 1);
  const auto source = boost::make_shared<WorldX<HX_Pixel8>>(16, 16);
  for (int y = 0; y < 16; ++y) {
    for (int x = 0; x < 16; ++x) {
      source->row(y)[x] = x < 8 ? HX_Pixel8{255, 200, 100, 50} : HX_Pixel8{0, 0, 0, 0};
    }
  }
  OneFrame<HX_Pixel8> frames(source);
  PixelOperations<HX_Pixel8> operations;
  RenderSettings settings;
  settings.framing = Framing::stabilize_only;
  WorldX<HX_Pixel8> out(R.planeWidth, R.planeHeight);
  renderFrame<HX_Pixel8>(clip, nullptr, settings, R, 0, frames, operations, out);
  EXPECT_NEAR(out.row(8)[8].alpha, 128, 1);
  EXPECT_EQ(out.row(8)[8].red, 200);
  EXPECT_EQ(out.row(8)[8].blue, 50);
}

TEST(Overcropped, UnderTwoFifthsAsShown) {
  Clip clip(1920, 1080, 3, 3, [](double x, double y) { return point2{x, y}; });
  Renderer R = makeRenderer(clip, 1, 1);
  const auto overcropped = [&](int width, int height, Framing framing) {
    cropper crop(1, 1920, 1080);
    crop.cropWidth = width;
    crop.cropHeight = height;
    return isOvercropped(clip, crop, RenderSettings{framing, 0.0f, 1.5f, 1.0f}, R);
  };
  EXPECT_FALSE(overcropped(768, 432, Framing::crop));
  EXPECT_TRUE(overcropped(767, 432, Framing::crop));
  EXPECT_TRUE(overcropped(1900, 431, Framing::crop));
  EXPECT_FALSE(overcropped(767, 431, Framing::crop_auto_scale));  // enlarged
  EXPECT_TRUE(overcropped(511, 431, Framing::crop_auto_scale));
  EXPECT_TRUE(overcropped(0, -3, Framing::crop_auto_scale));
}

TEST(SetupOutput, TheWholePlaneWithoutACrop) {
  Clip clip(100, 80, 3, 3, [](double x, double y) { return point2{x * 1.1 - 8, y - 3.5}; });
  const Renderer R = makeRenderer(clip, 1, 1);
  const OutputRect all = setupOutputRect(Framing::stabilize_only, R, 100, 80);
  EXPECT_EQ(all.width, 109);  // 99 * 1.1 = 108.9
  EXPECT_EQ(all.height, 79);
  EXPECT_EQ(all.origin_x, 4);
  EXPECT_EQ(all.origin_y, 0);
  const OutputRect cropped = setupOutputRect(Framing::crop, R, 100, 80);
  EXPECT_EQ(cropped.width, 100);
  EXPECT_EQ(cropped.origin_x, 0);
}

TEST(OutlinePolygon, GoesAroundTheBuffer) {
  Clip clip(101, 81, 3, 3, [](double x, double y) { return point2{x + 7, y - 5}; });
  const Renderer R = makeRenderer(clip, 1, 1);
  const std::vector<float> p = outlinePolygon(clip, 0, R, {}, 0, 0);
  ASSERT_EQ(p.size(), 24u);
  EXPECT_FLOAT_EQ(p[0], 0.5f);  // half a pixel: centres against edges
  EXPECT_FLOAT_EQ(p[1], 0.5f);
  EXPECT_FLOAT_EQ(p[4], 100.5f);
  EXPECT_FLOAT_EQ(p[5], 0.5f);
  EXPECT_FLOAT_EQ(p[12], 100.5f);
  EXPECT_FLOAT_EQ(p[13], 80.5f);
}

}  // namespace
}  // namespace marrow::render
