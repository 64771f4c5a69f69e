#include "stabilizer/render/frame_renderer.h"

#include <tbb/global_control.h>

#include <cmath>

#include "tests/stabilizer/render/solved_clip.h"
#include "tests/support/each_instruction_set.h"

namespace marrow::render {
namespace {

using stabilization::inverse;
using stabilization::matrix3;
using stabilization::square_to_quad;
using stabilization::transform;

// Of a channel: at a fraction of just one half each of two roundings may fall the other way; 16
// bits see positions' 2e-5 pixels of a full-range step, twice.
template <class Pixel>
constexpr double tolerance = !rounds<Pixel>       ? 1e-4
                             : full<Pixel> == 255 ? 2.01
                                                  : 3.01;

template <class Pixel>
Channels Mixed(const Channels& p, const Channels& q, double t) {
  const double a = p[0], b = q[0], alpha = a * (1 - t) + b * t;
  if (alpha == 0) return {};
  Channels result{alpha};
  for (int i = 1; i < 4; ++i) {
    result[i] = a == b ? p[i] * (1 - t) + q[i] * t : (p[i] * a * (1 - t) + q[i] * b * t) / alpha;
  }
  if (rounds<Pixel>) {
    for (double& v : result) v = std::trunc(v + 0.5);
  }
  return result;
}

// One pixel in doubles: of all cells that cover it the last one's sample.
template <class Pixel>
class PlainRender {
 public:
  PlainRender(const Renderer& renderer, VarVector warp, const RenderSettings& settings,
              const crop_rect& window, double zoom, const WorldX<Pixel>& source, int width,
              int height)
      : R(renderer),
        warp_(std::move(warp)),
        source_(source),
        zoom_(zoom),
        crop_(crops(settings.framing)) {
    const double scale[] = {R.scaleX, R.scaleY};
    const double shift[] = {crop_ ? 0 : settings.shift_x, crop_ ? 0 : settings.shift_y};
    for (std::size_t i = 0; i < warp_.values.size(); ++i) {
      warp_.values[i] = warp_.values[i] * scale[i % 2] - shift[i % 2] / settings.additional_scale;
    }
    // The window's middle in the zoomed plane shows in the output's; whole pixels move cells, the
    // rest only what they look up.
    const double least[] = {R.boundsMinX, R.boundsMinY};
    const int plane[] = {R.planeWidth, R.planeHeight}, output[] = {width, height};
    const float sides[] = {window.left + window.right, window.top + window.bottom};
    for (int i = 0; i < 2; ++i) {
      const double middle = crop_ ? sides[i] * scale[i] / 2 : (plane[i] - 1) / 2.0;
      const double from = (middle + least[i]) * zoom;
      const double to = ((crop_ ? output : plane)[i] - 1) * 0.5;
      whole_[i] = std::trunc(from) - std::trunc(to);
      part_[i] = from - to - whole_[i];
    }
  }

  Channels At(int dx, int dy) const {
    Channels last{};
    for (int r = 0; r + 1 < R.rows; ++r) {
      for (int c = 0; c + 1 < R.cols; ++c) Draw(c, r, dx, dy, last);
    }
    return last;
  }

 private:
  void Draw(int c, int r, int dx, int dy, Channels& last) const {
    const point2 q[] = {warp_.vertex(c, r), warp_.vertex(c + 1, r), warp_.vertex(c + 1, r + 1),
                        warp_.vertex(c, r + 1)};
    const bool outer[] = {r == 0, c == R.cols - 2, r == R.rows - 2, c == 0};
    const bool border =
        (!crop_ || R.edgeTolerant) && (outer[0] || outer[1] || outer[2] || outer[3]);
    if (crop_ && !border &&
        (dx < R.outLeft || dx >= R.outRight || dy < R.outTop || dy >= R.outBottom)) {
      return;
    }
    const double x = dx + whole_[0], y = dy + whole_[1];
    const auto [left, right] = std::minmax({q[0].x, q[1].x, q[2].x, q[3].x});
    const auto [top, bottom] = std::minmax({q[0].y, q[1].y, q[2].y, q[3].y});
    if (x < std::floor(zoom_ * left - 1) || y < std::floor(zoom_ * top - 1) ||
        x >= std::min(std::ceil(zoom_ * right + 1), std::trunc(R.planeWidth * zoom_)) ||
        y >= std::min(std::ceil(zoom_ * bottom + 1), std::trunc(R.planeHeight * zoom_))) {
      return;
    }
    const matrix3 h = inverse(square_to_quad(q[0], q[1], q[3], q[2]));
    if (!std::all_of(h.begin(), h.end(), [](double e) { return std::isfinite(e); })) return;
    bool inside = true, near = false;
    for (int i = 0; i < 4; ++i) {
      const double ex = q[(i + 1) % 4].x - q[i].x, ey = q[(i + 1) % 4].y - q[i].y;
      const double cross = ex * (y / zoom_ - q[i].y) - ey * (x / zoom_ - q[i].x);
      const double length2 = ex * ex + ey * ey, most = std::max(4.0, 4 / (zoom_ * zoom_));
      inside = inside && cross >= 0;
      near = near || (border && outer[i] && (length2 == 0 || cross * cross / length2 < most));
    }
    const point2 p{(x + part_[0]) / zoom_, (y + part_[1]) / zoom_};
    if (!(inside || near) || !(p.x < R.planeWidth && p.y < R.planeHeight)) return;
    const point2 uv = transform(h, p);
    last = SourceAt((c + uv.x) * R.cellWidth - 0.5, (r + uv.y) * R.cellHeight - 0.5);
  }

  Channels SourceAt(double x, double y) const {
    const auto clamped = [](double s, int size) {
      return std::max(0.0, std::min(std::max(s, 0.0001), size - 1.0001));
    };
    x = clamped(x, std::min(R.sourceWidth, source_.width()));
    y = clamped(y, std::min(R.sourceHeight, source_.height()));
    const int ix = static_cast<int>(x), iy = static_cast<int>(y);
    const auto pixel = [&](int u, int v) {
      return Of(source_.row(std::min(v, source_.height() - 1))[std::min(u, source_.width() - 1)]);
    };
    return Mixed<Pixel>(Mixed<Pixel>(pixel(ix, iy), pixel(ix, iy + 1), y - iy),
                        Mixed<Pixel>(pixel(ix + 1, iy), pixel(ix + 1, iy + 1), y - iy), x - ix);
  }

  const Renderer& R;
  VarVector warp_;  // in the plane
  const WorldX<Pixel>& source_;
  const double zoom_;
  const bool crop_;
  double whole_[2], part_[2];  // zoomed plane = destination + these
};

point2 Turned(double x, double y) {
  const double w = 1 + 4e-4 * x - 3e-4 * y;
  return {(1.03 * x - .06 * y + 2.3) / w, (.05 * x + .97 * y - 1.7) / w};
}

struct Scene {
  int width = 61, height = 43;
  int cols = 5, rows = 4;
  Motion to = Moved(0, 0);
  RenderSettings settings = {.framing = Framing::stabilize_only};
  float scale = 1;
  alphas alpha = alphas::full;
  std::function<void(SolvedClip&)> damage = [](SolvedClip&) {};
};

template <class Pixel>
void ExpectAsPlain(const Scene& s) {
  SolvedClip clip(s.width, s.height, s.cols, s.rows, s.to);
  s.damage(clip);
  Renderer R = makeRenderer(clip, s.scale, s.scale);
  Pictures<Pixel> pictures;
  pictures.Add(Textured<Pixel>(R.sourceWidth, R.sourceHeight, 7, s.alpha));
  PixelOperations<Pixel> operations;
  cropper crop(1, 1, 1);
  crop.rects[0] = {4, s.width - 7.0f, 3, s.height - 6.0f};
  crop.cropWidth = s.width - 10;
  crop.cropHeight = s.height - 8;
  const OutputRect size = setupOutputRect(s.settings.framing, R, R.sourceWidth, R.sourceHeight);
  const int width = std::max(size.width, 1), height = std::max(size.height, 1);
  PaddedWorld<Pixel> out(width, height);
  ASSERT_TRUE(renderFrame(clip, &crop, s.settings, R, 0, pictures, operations, out.pixels));

  const PlainRender<Pixel> plain(R, *clip.frameWarp(0), s.settings, crop.rects[0],
                                 getZoom(clip, &crop, s.settings, R), *pictures.worlds[0], width,
                                 height);
  double worst = 0;
  int uncovered = 0;
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      const Channels found = Of(out.pixels.row(y)[x]), e = plain.At(x, y);
      uncovered += (found[0] == 0) != (e[0] == 0);
      worst = std::max(worst, std::fabs(found[0] - e[0]));
      // Where alpha is small a colour is a quotient of two small numbers: what counts is how it
      // shows.
      for (int i = 1; i < 4; ++i) {
        worst = std::max(worst, std::fabs(found[i] * found[0] - e[i] * e[0]) / full<Pixel>);
      }
    }
  }
  EXPECT_EQ(uncovered, 0);
  EXPECT_LE(worst, tolerance<Pixel>);
}

template <class Pixel>
class FrameRenderer : public testing::Test {};
TYPED_TEST_SUITE(FrameRenderer, Depths);

TYPED_TEST(FrameRenderer, FramingsZoomsAndScales) {
  for (const Framing framing : {Framing::stabilize_only, Framing::crop, Framing::crop_auto_scale}) {
    for (const float additional : {0.5f, 1.0f, 2.0f}) {
      for (const float scale : {1.0f, 0.5f}) {
        for (const alphas alpha : {alphas::full, alphas::patches}) {
          SCOPED_TRACE(testing::Message() << static_cast<int>(framing) << " " << additional << " "
                                          << scale << " " << static_cast<int>(alpha));
          ExpectAsPlain<TypeParam>({.to = Turned,
                                    .settings = {.framing = framing,
                                                 .additional_scale = additional,
                                                 .shift_x = 5,
                                                 .shift_y = -3},
                                    .scale = scale,
                                    .alpha = alpha});
        }
      }
    }
  }
  // The plane's width limits pixels far from its origin.
  ExpectAsPlain<TypeParam>({.to = Moved(20, 9), .settings = {}});
  // The border's two pixels beside slanting edges.
  const auto slanting = [](double x, double y) {
    return point2{.7 * x - .5 * y + 30, .5 * x + .7 * y};
  };
  ExpectAsPlain<TypeParam>(
      {.to = slanting, .settings = {.framing = Framing::stabilize_only, .additional_scale = 2}});
}

TYPED_TEST(FrameRenderer, WideCellsAndOddSizes) {
  ExpectAsPlain<TypeParam>({.width = 401, .height = 7, .cols = 2, .rows = 2, .to = Turned});
  for (const auto& [width, height] : {std::pair{3, 2}, {2, 3}, {1, 1}, {1, 9}, {9, 1}}) {
    ExpectAsPlain<TypeParam>({.width = width, .height = height, .cols = 2, .rows = 2});
  }
}

TYPED_TEST(FrameRenderer, BrokenMeshes) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  const struct {
    int c, r;
    point2 to;
  } vertices[] = {{2, 1, {nan, nan}}, {0, 3, {30, INFINITY}}, {1, 1, {50, 20}}, {1, 1, {15, 0}}};
  for (const auto& v : vertices) {
    ExpectAsPlain<TypeParam>({.damage = [&](SolvedClip& clip) { clip.Set(0, v.c, v.r, v.to); }});
  }
  for (const double all : {0.0, nan}) {
    ExpectAsPlain<TypeParam>({.damage = [&](SolvedClip& clip) {
      for (int i = 0; i < 20; ++i) clip.Set(0, i % 5, i / 5, {all, all});
    }});
  }
}

// Of a source of 4 x + 2 y, where a mesh is moved by (2.25, -1.5). All values are whole at each
// step of the interpolation.
TEST(FrameRendererByHand, PixelsWorkedOut) {
  const SolvedClip clip(40, 30, 4, 3, Moved(2.25, -1.5));
  Pictures<HX_Pixel8> pictures;
  pictures.Add(40, 30, {});
  for (int i = 0; i < 1200; ++i) {
    const auto green = static_cast<std::uint8_t>(4 * (i % 40) + i / 40 * 2);
    pictures.worlds[0]->data()[i] = {255, 0, green, 0};
  }
  cropper crop(1, 1, 1);
  crop.rects[0] = {5, 32, 4, 23};  // its middle at 18.5, 13.5 of the plane
  crop.cropWidth = 28;
  crop.cropHeight = 20;
  // Pixel 0 of the plane is the source's 0; half a pixel off lies what is sampled. With a crop the
  // output's middle, 19.5, 14.5, shows the window's.
  const RenderSettings plain{.framing = Framing::stabilize_only},
      shifted{.framing = Framing::stabilize_only, .shift_x = 3, .shift_y = -4},
      cropped{.framing = Framing::crop, .shift_x = 3, .shift_y = -4},
      scaled{.maximum_scale = 1.25f}, smaller{.maximum_scale = 1.25f, .additional_scale = 0.8f};
  const struct {
    const RenderSettings& settings;
    int x, y;
    double column, row;
  } cases[] = {{plain, 20, 10, 19.5, 9.5},   {plain, 1, 28, 0.5, 27.5},
               {shifted, 20, 10, 22.5, 5.5}, {cropped, 20, 10, 18.5, 8.5},
               {scaled, 22, 12, 20, 11},     {smaller, 22, 12, 20.5, 10.5}};
  for (const auto& c : cases) {
    const auto out = Rendered(clip, pictures, c.settings, 0, &crop);
    EXPECT_EQ(out.row(c.y)[c.x].green, 4 * c.column + 2 * c.row) << &c - cases;
  }
}

// Each kernel that this processor runs, to the bit: rows of many vectors and rests of all lengths,
// opaque stretches and edges of alpha. Strips on one thread and on many, over cells that overlap.
TYPED_TEST(FrameRenderer, NeitherInstructionSetNorThreadsShow) {
  for (const alphas alpha : {alphas::full, alphas::patches}) {
    SolvedClip clip(403, 257, 9, 14, Turned);
    clip.Set(0, 4, 6, {60, 190});
    Pictures<TypeParam> pictures;
    pictures.Add(Textured<TypeParam>(403, 257, 7, alpha));
    const auto render = [&] {
      return Rendered(clip, pictures, {.framing = Framing::stabilize_only});
    };
    const WorldX<TypeParam> first = render();
    tests::OnEachInstructionSet([&] { EXPECT_TRUE(Same(render(), first)); });
    const tbb::global_control single(tbb::global_control::max_allowed_parallelism, 1);
    EXPECT_TRUE(Same(render(), first));
  }
}

TEST(FrameRendererRecords, AFrameWithoutOneIsNotDrawn) {
  const SolvedClip clip(16, 16, 3, 3, Moved(0, 0));
  Renderer renderer = makeRenderer(clip, 1, 1);
  Pictures<HX_Pixel8> pictures;
  PixelOperations<HX_Pixel8> operations;
  WorldX<HX_Pixel8> out(16, 16);
  EXPECT_FALSE(renderFrame(clip, nullptr, {}, renderer, 1, pictures, operations, out));
}

}  // namespace
}  // namespace marrow::render
