#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

const std::uint8_t* PixelAt(const HX_World& world, int x, int y) {
  return static_cast<const std::uint8_t*>(world.data) + std::ptrdiff_t{world.row_bytes} * y +
         std::ptrdiff_t{x} * BytesPerPixel(FormatOf(world));
}
std::uint8_t* PixelAt(HX_World& world, int x, int y) {
  return const_cast<std::uint8_t*>(PixelAt(static_cast<const HX_World&>(world), x, y));
}

void CopyPixels(const HX_World& from, HX_World& to, const HX_Rect& source, const HX_Rect& target) {
  const int dx = source.left - target.left, dy = source.top - target.top;
  const HX_Rect part = Intersect(Intersect(target, {0, 0, to.width, to.height}),
                                 {-dx, -dy, from.width - dx, from.height - dy});
  if (IsEmpty(part)) return;
  const std::uint32_t from_format = FormatOf(from), to_format = FormatOf(to);
  const int width = part.right - part.left;
  std::vector<float> row(from_format == to_format ? 0 : static_cast<std::size_t>(width) * 4);
  for (int y = part.top; y < part.bottom; ++y) {
    const std::uint8_t* pixels = PixelAt(from, part.left + dx, y + dy);
    if (from_format == to_format) {
      std::memcpy(PixelAt(to, part.left, y), pixels,
                  static_cast<std::size_t>(width) * BytesPerPixel(to_format));
    } else {
      LoadRow(from_format, pixels, width, row.data());
      StoreRow(to_format, row.data(), width, PixelAt(to, part.left, y));
    }
  }
}

struct Tap {
  int at;
  float weight;
};

// What pixel i of `count` on an axis takes of the pixels from `begin` to `end` (of those inside
// `limit`); weights sum to 1.
std::vector<Tap> Taps(int i, int count, int begin, int end, int limit) {
  const double step = static_cast<double>(end - begin) / count;
  const auto inside = [limit](int at) { return std::clamp(at, 0, limit - 1); };
  if (step <= 1.0) {
    const double centre = std::clamp((i + 0.5) * step - 0.5, 0.0, end - begin - 1.0);
    const int first = static_cast<int>(centre);
    const auto second_weight = static_cast<float>(centre - first);
    return {{inside(begin + first), 1.0f - second_weight},
            {inside(begin + std::min(first + 1, end - begin - 1)), second_weight}};
  }
  const double low = i * step, high = (i + 1) * step;
  std::vector<Tap> taps;
  for (int at = static_cast<int>(low); at < high && at < end - begin; ++at) {
    const double covered = std::min(high, at + 1.0) - std::max<double>(low, at);
    if (covered > 0) taps.push_back({inside(begin + at), static_cast<float>(covered / step)});
  }
  return taps;
}

void ScalePixels(const HX_World& from, HX_World& to, const HX_Rect& source, const HX_Rect& target) {
  const HX_Rect part = Intersect(target, {0, 0, to.width, to.height});
  if (IsEmpty(part) || IsEmpty(source) || from.width < 1 || from.height < 1) return;
  const std::uint32_t from_format = FormatOf(from), to_format = FormatOf(to);
  const auto width = static_cast<std::size_t>(part.right - part.left);

  std::vector<std::vector<Tap>> columns;
  for (int x = part.left; x < part.right; ++x) {
    columns.push_back(
        Taps(x - target.left, target.right - target.left, source.left, source.right, from.width));
  }
  std::vector<float> row(static_cast<std::size_t>(from.width) * 4), sum(row.size()),
      result(width * 4);
  for (int y = part.top; y < part.bottom; ++y) {
    std::fill(sum.begin(), sum.end(), 0.0f);
    for (const Tap& tap :
         Taps(y - target.top, target.bottom - target.top, source.top, source.bottom, from.height)) {
      if (tap.weight == 0.0f) continue;
      LoadRow(from_format, PixelAt(from, 0, tap.at), from.width, row.data());
      for (std::size_t i = 0; i < row.size(); i += 4) {
        const float weight = tap.weight * row[i];
        sum[i] += weight;
        for (std::size_t c = 1; c < 4; ++c) sum[i + c] += weight * row[i + c];
      }
    }
    for (std::size_t x = 0; x < width; ++x) {
      float pixel[4] = {};
      for (const Tap& tap : columns[x]) {
        for (std::size_t c = 0; c < 4; ++c) {
          pixel[c] += tap.weight * sum[static_cast<std::size_t>(tap.at) * 4 + c];
        }
      }
      result[x * 4] = pixel[0];
      for (std::size_t c = 1; c < 4; ++c) {
        result[x * 4 + c] = pixel[0] > 0.0f ? pixel[c] / pixel[0] : 0.0f;
      }
    }
    StoreRow(to_format, result.data(), static_cast<int>(width), PixelAt(to, part.left, y));
  }
}

}  // namespace

HX_Err CopyWorld(const HX_World& from, HX_World& to, const HX_Rect* from_rect,
                 const HX_Rect* to_rect) {
  if (!from.data || !to.data || BytesPerPixel(FormatOf(from)) == 0 ||
      BytesPerPixel(FormatOf(to)) == 0) {
    return HX_ERR_UNKNOWN;
  }
  const HX_Rect source = from_rect ? *from_rect : HX_Rect{0, 0, from.width, from.height};
  const HX_Rect target = to_rect ? *to_rect : HX_Rect{0, 0, to.width, to.height};
  if (source.right - source.left == target.right - target.left &&
      source.bottom - source.top == target.bottom - target.top) {
    CopyPixels(from, to, source, target);
  } else {
    ScalePixels(from, to, source, target);
  }
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
