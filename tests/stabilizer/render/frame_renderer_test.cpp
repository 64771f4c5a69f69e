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
  PlainRender(const Renderer& renderer, const VarVector& warp, const RenderSettings& settings,
              const crop_rect& window, double zoom, const WorldX<Pixel>& source, int width,
              int height)
      : R(renderer), source_(source), zoom_(zoom), crop_(crops(settings.framing)) {
    const double scale[] = {R.scaleX, R.scaleY};
    const double shift[] = {crop_ ? 0 : settings.shift_x, crop_ ? 0 : settings.shift_y};
    for (std::size_t i = 0; i < warp.values.size(); ++i) {
      vertices_.push_back(warp.values[i] * scale[i % 2] - shift[i % 2] / settings.additional_scale);
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
  point2 Vertex(int c, int r) const {
    return {vertices_[2 * (r * R.cols + c)], vertices_[2 * (r * R.cols + c) + 1]};
  }
  static double Cross(point2 a, point2 b, point2 p) {
    return (b.x - a.x) * (p.y - a.y) - (b.y - a.y) * (p.x - a.x);
  }
  bool Near(point2 a, point2 b, point2 p) const {
    const double length2 = (b.x - a.x) * (b.x - a.x) + (b.y - a.y) * (b.y - a.y);
    return length2 == 0 ||
           Cross(a, b, p) * Cross(a, b, p) / length2 < std::max(4.0, 4 / (zoom_ * zoom_));
  }

  void Draw(int c, int r, int dx, int dy, Channels& last) const {
    const point2 q[] = {Vertex(c, r), Vertex(c + 1, r), Vertex(c + 1, r + 1), Vertex(c, r + 1)};
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
    const point2 tested{x / zoom_, y / zoom_};
    bool inside = true, near = false;
    for (int i = 0; i < 4; ++i) {
      inside = inside && Cross(q[i], q[(i + 1) % 4], tested) >= 0;
      near = near || (border && outer[i] && Near(q[i], q[(i + 1) % 4], tested));
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
  std::vector<double> vertices_;
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
  // Padded rows, and for bytes rows that begin anywhere; padding must stay as it is.
  const int width = std::max(size.width, 1), height = std::max(size.height, 1);
  const std::ptrdiff_t used = sizeof(Pixel) * width, row_bytes = used + 3 * alignof(Pixel);
  std::vector<unsigned char> buffer(static_cast<std::size_t>(row_bytes * height) + 64, 0xAB);
  WorldX<Pixel> out(width, height, row_bytes, reinterpret_cast<Pixel*>(buffer.data()));
  ASSERT_TRUE(renderFrame(clip, &crop, s.settings, R, 0, pictures, operations, out));

  const PlainRender<Pixel> plain(R, clip.frameWarp(0), s.settings, crop.rects[0],
                                 getZoom(clip, &crop, s.settings, R), *pictures.worlds[0], width,
                                 height);
  double worst = 0;
  int uncovered = 0;
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      const Channels found = Of(out.row(y)[x]), e = plain.At(x, y);
      uncovered += (found[0] == 0) != (e[0] == 0);
      worst = std::max(worst, std::fabs(found[0] - e[0]));
      // Where alpha is small a colour is a quotient of two small numbers: what counts is how it
      // shows.
      for (int i = 1; i < 4; ++i) {
        worst = std::max(worst, std::fabs(found[i] * found[0] - e[i] * e[0]) / full<Pixel>);
      }
    }
    for (std::ptrdiff_t i = used; i < row_bytes; ++i) {
      ASSERT_EQ(buffer[static_cast<std::size_t>(row_bytes * y + i)], 0xAB);
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
          RenderSettings settings{.framing = framing, .additional_scale = additional};
          settings.shift_x = 5;
          settings.shift_y = -3;
          ExpectAsPlain<TypeParam>(
              {.to = Turned, .settings = settings, .scale = scale, .alpha = alpha});
        }
      }
    }
  }
  // The plane's width limits pixels far from its origin.
  ExpectAsPlain<TypeParam>({.to = Moved(20, 9), .settings = {}});
  // The border's two pixels beside slanting edges.
  RenderSettings doubled{.framing = Framing::stabilize_only, .additional_scale = 2};
  const auto slanting = [](double x, double y) {
    return point2{.7 * x - .5 * y + 30, .5 * x + .7 * y};
  };
  ExpectAsPlain<TypeParam>({.to = slanting, .settings = doubled});
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
TYPED_TEST(FrameRenderer, PixelsWorkedOut) {
  const SolvedClip clip(40, 30, 4, 3, Moved(2.25, -1.5));
  Pictures<TypeParam> pictures;
  pictures.Add(40, 30, {});
  for (int i = 0; i < 1200; ++i) {
    const double v = 4 * (i % 40) + 2 * (i / 40);
    const auto value = static_cast<channel_of<TypeParam>>(rounds<TypeParam> ? v : v / 256);
    pictures.worlds[0]->data()[i] = {world_view<TypeParam>::full, 0, value, value};
  }
  cropper crop(1, 1, 1);
  crop.rects[0] = {5, 32, 4, 23};  // its middle at 18.5, 13.5 of the plane
  crop.cropWidth = 28;
  crop.cropHeight = 20;
  const auto shown = [&](const RenderSettings& settings, int x, int y) {
    const double v = Rendered<TypeParam>(clip, pictures, settings, 0, &crop).row(y)[x].green;
    return rounds<TypeParam> ? v : v * 256;
  };
  const double near = rounds<TypeParam> ? 0 : 1e-3;
  RenderSettings settings;
  settings.framing = Framing::stabilize_only;
  // Pixel 0 of the plane is the source's 0; half a pixel off lies what is sampled.
  EXPECT_NEAR(shown(settings, 20, 10), 4 * 19.5 + 2 * 9.5, near);
  EXPECT_NEAR(shown(settings, 1, 28), 4 * 0.5 + 2 * 27.5, near);
  settings.shift_x = 3;
  settings.shift_y = -4;
  EXPECT_NEAR(shown(settings, 20, 10), 4 * 22.5 + 2 * 5.5, near);
  // The output's middle, 19.5, 14.5, shows the window's.
  settings.framing = Framing::crop;
  EXPECT_NEAR(shown(settings, 20, 10), 4 * 18.5 + 2 * 8.5, near);
  settings.framing = Framing::crop_auto_scale;
  settings.maximum_scale = 1.25;
  EXPECT_NEAR(shown(settings, 22, 12), 4 * (18.5 + 2 - 0.5) + 2 * (13.5 - 2 - 0.5), near);
  settings.additional_scale = 0.8f;
  EXPECT_NEAR(shown(settings, 22, 12), 4 * 20.5 + 2 * 10.5, near);
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
