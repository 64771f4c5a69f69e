#include "host/timeline/picture.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <boost/weak_ptr.hpp>
#include <limits>
#include <new>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

// What a bounded cache drops for one new frame, and a little more.
constexpr std::size_t kSpareBlocks = 3;

template <class Sample>
Sample Average(Sample a, Sample b) {
  return static_cast<Sample>((a + b + 1) / 2);
}
template <>
float Average(float a, float b) {
  return 0.5f * (a + b);
}

// A colour counts as much as its alpha; without any there is none.
template <class Sample>
Sample Weighted(Sample a, Sample alpha_a, Sample b, Sample alpha_b) {
  const std::uint64_t sum = std::uint64_t{alpha_a} + alpha_b;
  return static_cast<Sample>((std::uint64_t{a} * alpha_a + std::uint64_t{b} * alpha_b + sum / 2) /
                             sum);
}
template <>
float Weighted(float a, float alpha_a, float b, float alpha_b) {
  return (a * alpha_a + b * alpha_b) / (alpha_a + alpha_b);
}

template <class Pixel>
Pixel AveragePixel(const Pixel& a, const Pixel& b) {
  if (a.alpha == b.alpha && a.alpha > 0) {
    return {a.alpha, Average(a.red, b.red), Average(a.green, b.green), Average(a.blue, b.blue)};
  }
  if (!(a.alpha + b.alpha > 0)) return {};
  const auto weighted = [&](auto of_a, auto of_b) {
    return Weighted(of_a, a.alpha, of_b, b.alpha);
  };
  return {Average(a.alpha, b.alpha), weighted(a.red, b.red), weighted(a.green, b.green),
          weighted(a.blue, b.blue)};
}

template <class Pixel>
void KeepFieldOf(Picture& picture, int parity) {
  const int height = picture.height();
  for (int y = 1 - parity; y < height; y += 2) {
    const Pixel* above = picture.row<Pixel>(y > 0 ? y - 1 : y + 1);
    const Pixel* below = picture.row<Pixel>(y + 1 < height ? y + 1 : y - 1);
    Pixel* row = picture.row<Pixel>(y);
    for (int x = 0; x < picture.width(); ++x) row[x] = AveragePixel(above[x], below[x]);
  }
}

}  // namespace

std::uint32_t FormatOf(PixelKind kind) {
  switch (kind) {
    case PixelKind::argb8:
      return HX_FORMAT_ARGB8;
    case PixelKind::argb16:
      return HX_FORMAT_ARGB16;
    default:
      return HX_FORMAT_ARGBF;
  }
}

PixelKind KindOfDepth(int bits) {
  return bits <= 8 ? PixelKind::argb8 : bits <= 16 ? PixelKind::argb16 : PixelKind::argbf;
}

boost::shared_ptr<PicturePool> PicturePool::Make() {
  const auto pool = boost::make_shared<PicturePool>();
  pool->spare_.reserve(kSpareBlocks);  // a picture that goes takes no memory
  return pool;
}

boost::shared_ptr<Picture> PicturePool::NewPicture(PixelKind kind, int width, int height,
                                                   std::ptrdiff_t padding, bool top_down) {
  const auto row_bytes = std::ptrdiff_t{BytesPerPixel(FormatOf(kind))} * width + padding;
  // Row bytes are 32 bits wide in the host's records.
  if (width < 1 || height < 1 || row_bytes > std::numeric_limits<std::int32_t>::max()) {
    throw std::bad_alloc();
  }
  const std::size_t bytes = static_cast<std::size_t>(row_bytes) * static_cast<std::size_t>(height);
  std::unique_ptr<std::uint8_t[]> memory;
  {
    std::lock_guard lock(mutex_);
    const auto fits = [&](const Block& block) { return block.bytes == bytes; };
    if (const auto found = std::find_if(spare_.begin(), spare_.end(), fits);
        found != spare_.end()) {
      memory = std::move(found->memory);
      spare_.erase(found);
    }
  }
  if (!memory) memory.reset(new std::uint8_t[bytes]);
  const boost::weak_ptr<PicturePool> weak = shared_from_this();
  return boost::shared_ptr<Picture>(
      new Picture(kind, width, height, row_bytes, top_down, std::move(memory)),
      [weak](Picture* picture) {
        if (const auto pool = weak.lock()) pool->Recycle(*picture);
        delete picture;
      });
}

void PicturePool::Recycle(Picture& picture) {
  Block block{picture.bytes(), picture.TakeMemory()};
  std::lock_guard lock(mutex_);
  if (spare_.size() >= kSpareBlocks) spare_.erase(spare_.begin());
  spare_.push_back(std::move(block));
}

HX_World WorldOf(const Picture& picture) {
  HX_World world{};
  world.data = const_cast<std::uint8_t*>(picture.memory());
  world.row_bytes = static_cast<std::int32_t>(picture.row_bytes());
  world.width = picture.width();
  world.height = picture.height();
  world.flags = picture.kind() == PixelKind::argb16 ? HX_WORLD_DEEP : 0;
  world.format = FormatOf(picture.kind());
  world.extent = {0, 0, picture.width(), picture.height()};
  return world;
}

void FillPicture(Picture& picture, const std::function<HX_PixelFloat(int, int)>& colour) {
  std::vector<HX_PixelFloat> row(static_cast<std::size_t>(picture.width()));
  for (int y = 0; y < picture.height(); ++y) {
    for (int x = 0; x < picture.width(); ++x) row[static_cast<std::size_t>(x)] = colour(x, y);
    StoreRow(FormatOf(picture.kind()), &row[0].alpha, picture.width(), picture.row<void>(y));
  }
}

void KeepField(Picture& picture, int parity) {
  if (picture.height() < 2) return;
  switch (picture.kind()) {
    case PixelKind::argb8:
      return KeepFieldOf<HX_Pixel8>(picture, parity);
    case PixelKind::argb16:
      return KeepFieldOf<HX_Pixel16>(picture, parity);
    case PixelKind::argbf:
      return KeepFieldOf<HX_PixelFloat>(picture, parity);
  }
}

void ScalePicture(const Picture& from, Picture& to) {
  HX_World target = WorldOf(to);
  CopyWorld(WorldOf(from), target, nullptr, nullptr);
}

}  // namespace calmframe::host
