#pragma once

#include <gmock/gmock.h>

#include <algorithm>
#include <array>
#include <boost/make_shared.hpp>
#include <cstring>
#include <functional>
#include <limits>
#include <random>
#include <set>
#include <type_traits>
#include <utility>
#include <vector>

#include "host/pixels/world_operations.h"
#include "stabilizer/render/frame_renderer.h"
#include "stabilizer/render/output_rect.h"

// A solved clip as a render sees it: meshes as a test wants them, pictures, and the host's
// operations.
namespace marrow::render {

using stabilization::point2;
using stabilization::VarVector;

using Depths = testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
template <class Pixel>
using channel_of = decltype(Pixel::alpha);
template <class Pixel>
inline constexpr double full = world_view<Pixel>::full;
template <class Pixel>
inline constexpr bool rounds = !std::is_same_v<Pixel, HX_PixelFloat>;

// Of fractions of full scale.
template <class Pixel>
Pixel PixelOf(double alpha, double red, double green, double blue) {
  const auto channel = [](double v) {
    return static_cast<channel_of<Pixel>>(v * full<Pixel> + (rounds<Pixel> ? 0.5 : 0));
  };
  return {channel(alpha), channel(red), channel(green), channel(blue)};
}

using Channels = std::array<double, 4>;
template <class Pixel>
Channels Of(const Pixel& p) {
  return {double(p.alpha), double(p.red), double(p.green), double(p.blue)};
}

// Where a point of the source lands in the output.
using Motion = std::function<point2(double x, double y)>;

inline Motion Moved(double dx, double dy) {
  return [=](double x, double y) { return point2{x + dx, y + dy}; };
}

class SolvedClip final : public ClipWarps {
 public:
  SolvedClip(int width, int height, int cols, int rows, const Motion& to = {})
      : width_(width), height_(height), cols_(cols), rows_(rows) {
    if (to) Add(to);
  }
  void Add(const Motion& to) {
    warps_.emplace_back(cols_, rows_);
    for (int i = 0; i < cols_ * rows_; ++i) {
      const point2 p =
          to(i % cols_ * (width_ - 1.0) / (cols_ - 1), i / cols_ * (height_ - 1.0) / (rows_ - 1));
      Set(warps_.size() - 1, i % cols_, i / cols_, p);
      bounds_ = {std::min(bounds_.min_x, p.x), std::min(bounds_.min_y, p.y),
                 std::max(bounds_.max_x, p.x), std::max(bounds_.max_y, p.y)};
    }
  }
  // Moves one vertex; the bounds stay.
  void Set(std::size_t frame, int c, int r, point2 p) {
    warps_[frame].values[2 * (r * cols_ + c)] = p.x;
    warps_[frame].values[2 * (r * cols_ + c) + 1] = p.y;
  }

  std::size_t frameCount() const override { return warps_.size(); }
  boost::shared_ptr<const VarVector> frameWarp(std::size_t frame) const override {
    return boost::make_shared<const VarVector>(warps_.at(frame));
  }
  bool warpedGridOfFrame(std::size_t M, std::size_t N, VarVector& warp) const override {
    EXPECT_NE(M, N);
    if (without_motion.count(M)) return false;
    warp = warps_.at(M);
    return true;
  }
  stabilization::frame_bounds unionBounds() const override { return bounds_; }
  std::int32_t frameWidth() const override { return width_; }
  std::int32_t frameHeight() const override { return height_; }
  std::int32_t gridCols() const override { return cols_; }
  std::int32_t gridRows() const override { return rows_; }

  std::set<std::size_t> without_motion;  // frames without one to any other

 private:
  int width_, height_, cols_, rows_;
  std::vector<VarVector> warps_;
  stabilization::frame_bounds bounds_{1e9, 1e9, -1e9, -1e9};
};

// The clip's pictures, and what was asked for.
template <class Pixel>
class Pictures final : public SourceFrames<Pixel> {
 public:
  using world = boost::shared_ptr<WorldX<Pixel>>;

  void Add(world picture) { worlds.push_back(std::move(picture)); }
  void Add(int width, int height, Pixel colour) {
    Add(boost::make_shared<WorldX<Pixel>>(width, height));
    std::fill_n(worlds.back()->data(), width * height, colour);
  }
  boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t frame) override {
    asked.push_back(frame);
    if (frame == refused) throw std::int32_t{42};
    return worlds.at(frame);
  }

  std::vector<world> worlds;
  std::vector<std::size_t> asked;
  std::size_t refused = 1000;
};

template <class Pixel>
class PixelOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    HX_World target = world_of(to);
    EXPECT_EQ(calmframe::host::Transfer(world_of(from), kBehind, x, y, target), HX_ERR_NONE);
  }
  void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) override {
    HX_World target = world_of(to);
    EXPECT_EQ(calmframe::host::Blur(world_of(from), target, radius), HX_ERR_NONE);
  }
};

// A frame's picture in an output as it was set up.
template <class Pixel>
WorldX<Pixel> Rendered(const SolvedClip& clip, Pictures<Pixel>& pictures,
                       const RenderSettings& settings, std::size_t frame = 0,
                       const cropper* crop = nullptr) {
  Renderer renderer = makeRenderer(clip, 1, 1);
  const OutputRect rect =
      setupOutputRect(settings.framing, renderer, clip.frameWidth(), clip.frameHeight());
  WorldX<Pixel> output(rect.width, rect.height);
  PixelOperations<Pixel> operations;
  EXPECT_TRUE(
      renderFrame<Pixel>(clip, crop, settings, renderer, frame, pictures, operations, output));
  return output;
}

// Rows that are padded, and for bytes begin anywhere; what lies between them must stay as it is.
template <class Pixel>
struct PaddedWorld {
  PaddedWorld(int width, int height)
      : row_bytes(sizeof(Pixel) * width + 3 * alignof(Pixel)),
        buffer(static_cast<std::size_t>(row_bytes * height), 0xAB),
        pixels(width, height, row_bytes, reinterpret_cast<Pixel*>(buffer.data())) {}
  ~PaddedWorld() {
    int changed = 0;
    for (std::size_t i = 0; i < buffer.size(); ++i) {
      changed += i % row_bytes >= sizeof(Pixel) * pixels.width() && buffer[i] != 0xAB;
    }
    EXPECT_EQ(changed, 0) << "bytes between the rows";
  }

  const std::ptrdiff_t row_bytes;
  std::vector<unsigned char> buffer;
  WorldX<Pixel> pixels;
};

template <class Pixel>
bool Same(const WorldX<Pixel>& a, const WorldX<Pixel>& b) {
  return a.width() == b.width() && a.height() == b.height() &&
         std::memcmp(a.data(), b.data(),
                     sizeof(Pixel) * static_cast<std::size_t>(a.width() * a.height())) == 0;
}

// Alpha full everywhere; or in patches full, none and in between; the last may hold what no picture
// should, which floats can.
enum class alphas { full, patches, odd };

template <class Pixel>
boost::shared_ptr<WorldX<Pixel>> Textured(int width, int height, unsigned seed, alphas kind) {
  const auto world = boost::make_shared<WorldX<Pixel>>(width, height);
  std::mt19937 random(seed);
  const auto value = [&] {
    return static_cast<channel_of<Pixel>>(full<Pixel> * (random() % 1000 / 999.0));
  };
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      Pixel& p = world->row(y)[x];
      p = {world_view<Pixel>::full, value(), value(), value()};
      const unsigned patch = ((x + seed) / 7 * 7 + y / 5 * 3 + seed) % 8;
      if (kind == alphas::full || patch > 2) continue;
      p.alpha = patch == 0 ? channel_of<Pixel>{0} : value();
      if constexpr (!rounds<Pixel>) {
        const float odd[] = {-0.25f, 1.5f, std::numeric_limits<float>::quiet_NaN()};
        if (kind == alphas::odd && patch == 2 && random() % 9 == 0) p.alpha = odd[random() % 3];
      }
    }
  }
  return world;
}

}  // namespace marrow::render
