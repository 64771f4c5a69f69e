#include "apps/report/picture.h"

#include <cairo.h>

extern "C" {
#include <libavutil/base64.h>
}

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <memory>
#include <new>
#include <vector>

namespace calmframe::report {
namespace {

struct DestroySurface {
  void operator()(cairo_surface_t* surface) const { cairo_surface_destroy(surface); }
};
using SurfacePtr = std::unique_ptr<cairo_surface_t, DestroySurface>;

// Ends of the source pixels under each of `count` output pixels, at least one each.
std::vector<int> Ends(int size, int count) {
  std::vector<int> ends(static_cast<std::size_t>(count));
  for (int i = 0; i < count; ++i) {
    const auto end = static_cast<int>(std::int64_t{size} * (i + 1) / count);
    ends[static_cast<std::size_t>(i)] = std::max(end, 1);
  }
  return ends;
}

// Premultiplied, as cairo has it.
std::uint32_t MeanOf(const PictureView& picture, int left, int right, int top, int bottom) {
  std::array<std::uint64_t, 4> sums{};  // alpha; the others times alpha
  for (int y = top; y < bottom; ++y) {
    const auto* row = reinterpret_cast<const HX_Pixel8*>(
        reinterpret_cast<const std::uint8_t*>(picture.pixels) + y * picture.row_bytes);
    for (int x = left; x < right; ++x) {
      const std::uint32_t alpha = row[x].alpha;
      sums[0] += alpha;
      sums[1] += alpha * row[x].red;
      sums[2] += alpha * row[x].green;
      sums[3] += alpha * row[x].blue;
    }
  }
  const auto count =
      static_cast<std::uint64_t>(right - left) * static_cast<std::uint64_t>(bottom - top);
  const auto mean = [&](std::size_t channel, std::uint64_t unit) {
    return static_cast<std::uint32_t>((sums[channel] + count * unit / 2) / (count * unit));
  };
  return mean(0, 1) << 24 | mean(1, 255) << 16 | mean(2, 255) << 8 | mean(3, 255);
}

cairo_status_t Append(void* bytes, const unsigned char* data, unsigned length) {
  auto& to = *static_cast<std::vector<unsigned char>*>(bytes);
  to.insert(to.end(), data, data + length);
  return CAIRO_STATUS_SUCCESS;
}

}  // namespace

std::string DataUrlOf(const PictureView& picture, int width) {
  width = std::clamp(width, 1, picture.width);
  const double shape = picture.width * picture.pixel_aspect / picture.height;
  const int height = std::clamp(static_cast<int>(std::lround(width / shape)), 1, picture.height);
  const SurfacePtr surface(cairo_image_surface_create(CAIRO_FORMAT_ARGB32, width, height));
  if (cairo_surface_status(surface.get()) != CAIRO_STATUS_SUCCESS) throw std::bad_alloc();
  const std::vector<int> columns = Ends(picture.width, width);
  const std::vector<int> rows = Ends(picture.height, height);
  cairo_surface_flush(surface.get());
  unsigned char* data = cairo_image_surface_get_data(surface.get());
  const int stride = cairo_image_surface_get_stride(surface.get());
  int top = 0;
  for (int y = 0; y < height; ++y) {
    const int bottom = rows[static_cast<std::size_t>(y)];
    auto* out = reinterpret_cast<std::uint32_t*>(data + std::ptrdiff_t{y} * stride);
    int left = 0;
    for (int x = 0; x < width; ++x) {
      const int right = columns[static_cast<std::size_t>(x)];
      out[x] = MeanOf(picture, left, right, top, bottom);
      left = right;
    }
    top = bottom;
  }
  cairo_surface_mark_dirty(surface.get());
  std::vector<unsigned char> png;
  if (cairo_surface_write_to_png_stream(surface.get(), Append, &png) != CAIRO_STATUS_SUCCESS) {
    throw std::bad_alloc();
  }
  std::string text(AV_BASE64_SIZE(png.size()), '\0');
  if (!av_base64_encode(text.data(), static_cast<int>(text.size()), png.data(),
                        static_cast<int>(png.size()))) {
    throw std::bad_alloc();
  }
  text.pop_back();  // the terminating zero
  return "data:image/png;base64," + text;
}

}  // namespace calmframe::report
