#include <algorithm>
#include <cmath>

#include "examples/outside_renderer/drawing/frame_drawer.h"

namespace outside {
namespace {

struct Colour {
  float alpha, red, green, blue;
};

float Rounded(float value) {  // value >= 0
  return static_cast<float>(static_cast<std::int32_t>(value + 0.5f));
}

// Colours count by their alpha; what has none has no colour either.
Colour Between(const Colour& p, const Colour& q, float t) {
  const float s = 1 - t;
  if (p.alpha == q.alpha) {
    if (p.alpha == 0) return {0, 0, 0, 0};
    return {p.alpha, Rounded(p.red * s + q.red * t), Rounded(p.green * s + q.green * t),
            Rounded(p.blue * s + q.blue * t)};
  }
  const float wp = p.alpha * s, wq = q.alpha * t, alpha = wp + wq;
  if (alpha == 0) return {0, 0, 0, 0};
  return {Rounded(alpha), Rounded((p.red * wp + q.red * wq) / alpha),
          Rounded((p.green * wp + q.green * wq) / alpha),
          Rounded((p.blue * wp + q.blue * wq) / alpha)};
}

class Sampler {
 public:
  explicit Sampler(const SourceView& source) : source_(source) {}

  HX_Pixel8 At(const Cell& cell, float x, float y) const {
    x = Clamped(x, cell.source_origin[0], source_.width);
    y = Clamped(y, cell.source_origin[1], source_.height);
    const float left = std::floor(x), top = std::floor(y);
    const auto ix = Column(left, cell.source_origin[0], source_.width);
    const auto iy = Column(top, cell.source_origin[1], source_.height);
    const float tx = x - left, ty = y - top;
    const Colour c = Between(Between(Fetch(ix, iy), Fetch(ix, iy + 1), ty),
                             Between(Fetch(ix + 1, iy), Fetch(ix + 1, iy + 1), ty), tx);
    return {static_cast<std::uint8_t>(c.alpha), static_cast<std::uint8_t>(c.red),
            static_cast<std::uint8_t>(c.green), static_cast<std::uint8_t>(c.blue)};
  }

 private:
  // So far inside that both neighbours are there.
  static float Clamped(float place, std::int32_t origin, std::int32_t size) {
    const float low = 0.0001f - static_cast<float>(origin);
    const float high = static_cast<float>(size - 1 - origin) - 0.0001f;
    return !(place >= low) ? low : !(place <= high) ? high : place;
  }
  static std::int32_t Column(float whole, std::int32_t origin, std::int32_t size) {
    return std::clamp(static_cast<std::int32_t>(whole) + origin, 0, size - 2);
  }
  Colour Fetch(std::int32_t x, std::int32_t y) const {
    const auto* row = reinterpret_cast<const HX_Pixel8*>(
        reinterpret_cast<const std::uint8_t*>(source_.pixels) + source_.row_bytes * y);
    return {static_cast<float>(row[x].alpha), static_cast<float>(row[x].red),
            static_cast<float>(row[x].green), static_cast<float>(row[x].blue)};
  }

  const SourceView& source_;
};

// The pixels of one row that lie inside the cell, edges included; none where the cell is folded
// over.
void CutRow(const Cell& cell, std::int32_t y, std::int32_t& begin, std::int32_t& end) {
  for (std::size_t k = 0; k < 4; ++k) {
    const double x0 = cell.x[k], y0 = cell.y[k];
    const double dx = cell.x[(k + 1) % 4] - x0, dy = cell.y[(k + 1) % 4] - y0;
    // Inside: dx * (y - y0) >= dy * (x - x0).
    const double rise = dx * (y - y0);
    if (dy == 0) {
      if (rise < 0) end = begin;
    } else if (dy > 0) {
      end = std::min(end, static_cast<std::int32_t>(
                              std::floor(std::clamp(x0 + rise / dy, begin - 1.0, end - 1.0))) +
                              1);
    } else {
      begin = std::max(begin, static_cast<std::int32_t>(std::ceil(
                                  std::clamp(x0 + rise / dy, double(begin), double(end)))));
    }
    if (begin >= end) return;
  }
}

class PlainDrawer final : public FrameDrawer {
 public:
  std::string name() const override { return "plain C++"; }

  void Draw(const FrameMesh& mesh, const SourceView& source, Picture& output) override {
    output.width = mesh.width;
    output.height = mesh.height;
    output.pixels.assign(
        static_cast<std::size_t>(mesh.width) * static_cast<std::size_t>(mesh.height), HX_Pixel8{});
    const Sampler sampler(source);
    for (const Cell& cell : mesh.cells) {
      const auto [x0, x1] = std::minmax_element(cell.x.begin(), cell.x.end());
      const auto [y0, y1] = std::minmax_element(cell.y.begin(), cell.y.end());
      const auto within = [](float value, std::int32_t low, std::int32_t high) {
        return static_cast<std::int32_t>(
            std::clamp(value, static_cast<float>(low), static_cast<float>(high)));
      };
      const std::int32_t left = within(std::ceil(*x0), mesh.left, mesh.right);
      const std::int32_t right = within(std::floor(*x1) + 1, mesh.left, mesh.right);
      const std::int32_t top = within(std::ceil(*y0), mesh.top, mesh.bottom);
      const std::int32_t bottom = within(std::floor(*y1) + 1, mesh.top, mesh.bottom);
      for (std::int32_t y = top; y < bottom; ++y) {
        std::int32_t begin = left, end = right;
        CutRow(cell, y, begin, end);
        HX_Pixel8* const row = output.pixels.data() + std::ptrdiff_t{y} * mesh.width;
        const auto& m = cell.source_from_output;
        const auto down = static_cast<float>(y - cell.output_origin[1]);
        for (std::int32_t x = begin; x < end; ++x) {
          const auto across = static_cast<float>(x - cell.output_origin[0]);
          const float w = m[6] * across + m[7] * down + m[8];
          row[x] = sampler.At(cell, (m[0] * across + m[1] * down + m[2]) / w,
                              (m[3] * across + m[4] * down + m[5]) / w);
        }
      }
    }
  }
};

}  // namespace

std::unique_ptr<FrameDrawer> MakePlainDrawer() {
  return std::make_unique<PlainDrawer>();
}

}  // namespace outside
