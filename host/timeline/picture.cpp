#include "host/timeline/picture.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <boost/weak_ptr.hpp>
#include <cmath>
#include <cstring>
#include <limits>
#include <new>
#include <type_traits>

namespace calmframe::host {
namespace {

// What a bounded cache drops for one new frame, and a little more.
constexpr std::size_t kSpareBlocks = 3;

template <class Pixel>
constexpr float kTop = std::is_same_v<Pixel, HX_Pixel8>    ? 255.0f
                       : std::is_same_v<Pixel, HX_Pixel16> ? 32768.0f
                                                           : 1.0f;

// action(Pixel{}) with the pixel of the kind.
template <class Action>
void WithPixel(PixelKind kind, Action action) {
  switch (kind) {
    case PixelKind::argb8:
      return action(HX_Pixel8{});
    case PixelKind::argb16:
      return action(HX_Pixel16{});
    case PixelKind::argbf:
      return action(HX_PixelFloat{});
  }
}

// Floats may lie outside 0 .. 1.
template <class Pixel>
Pixel FromUnit(const HX_PixelFloat& colour) {
  if constexpr (std::is_same_v<Pixel, HX_PixelFloat>) {
    return colour;
  } else {
    using Sample = decltype(Pixel::alpha);
    const auto sample = [](float value) {
      return static_cast<Sample>(std::min(std::max(value, 0.0f), 1.0f) * kTop<Pixel> + 0.5f);
    };
    return {sample(colour.alpha), sample(colour.red), sample(colour.green), sample(colour.blue)};
  }
}

template <class Sample>
Sample Average(Sample a, Sample b) {
  return static_cast<Sample>((a + b + 1) / 2);
}
template <>
float Average(float a, float b) {
  return 0.5f * (a + b);
}

template <class Pixel>
void KeepFieldOf(Picture& picture, int parity) {
  const int height = picture.height();
  for (int y = 1 - parity; y < height; y += 2) {
    const Pixel* above = picture.row<Pixel>(y > 0 ? y - 1 : y + 1);
    const Pixel* below = picture.row<Pixel>(y + 1 < height ? y + 1 : y - 1);
    Pixel* row = picture.row<Pixel>(y);
    for (int x = 0; x < picture.width(); ++x) {
      row[x] = {Average(above[x].alpha, below[x].alpha), Average(above[x].red, below[x].red),
                Average(above[x].green, below[x].green), Average(above[x].blue, below[x].blue)};
    }
  }
}

// The samples that make up one sample of a resized line, with weights of sum 1.
struct Taps {
  int first = 0;
  std::vector<float> weights;
};

std::vector<Taps> TapsOf(int from, int to) {
  std::vector<Taps> all(static_cast<std::size_t>(to));
  const double step = static_cast<double>(from) / to;
  for (int i = 0; i < to; ++i) {
    Taps& taps = all[static_cast<std::size_t>(i)];
    if (step < 1) {
      const double centre = std::clamp((i + 0.5) * step - 0.5, 0.0, from - 1.0);
      taps.first = std::min(static_cast<int>(centre), std::max(from - 2, 0));
      const double second = centre - taps.first;
      taps.weights = {static_cast<float>(1 - second)};
      if (from > 1) taps.weights.push_back(static_cast<float>(second));
      continue;
    }
    const double left = i * step, right = std::min((i + 1) * step, static_cast<double>(from));
    taps.first = static_cast<int>(left);
    for (int x = taps.first; x < from && x < right; ++x) {
      const double covered = std::min(x + 1.0, right) - std::max<double>(x, left);
      taps.weights.push_back(static_cast<float>(covered / (right - left)));
    }
  }
  return all;
}

template <class Pixel>
void ScaleOf(const Picture& from, Picture& to) {
  const std::vector<Taps> across = TapsOf(from.width(), to.width());
  const std::vector<Taps> down = TapsOf(from.height(), to.height());
  // One line of the result at the source's width, colours times alpha.
  std::vector<HX_PixelFloat> line(static_cast<std::size_t>(from.width()));
  for (int y = 0; y < to.height(); ++y) {
    std::fill(line.begin(), line.end(), HX_PixelFloat{});
    const Taps& rows = down[static_cast<std::size_t>(y)];
    for (std::size_t k = 0; k < rows.weights.size(); ++k) {
      const Pixel* row = from.row<Pixel>(rows.first + static_cast<int>(k));
      for (std::size_t x = 0; x < line.size(); ++x) {
        const float alpha = rows.weights[k] * (static_cast<float>(row[x].alpha) / kTop<Pixel>);
        line[x].alpha += alpha;
        line[x].red += alpha * static_cast<float>(row[x].red);
        line[x].green += alpha * static_cast<float>(row[x].green);
        line[x].blue += alpha * static_cast<float>(row[x].blue);
      }
    }
    Pixel* out = to.row<Pixel>(y);
    for (int x = 0; x < to.width(); ++x) {
      const Taps& columns = across[static_cast<std::size_t>(x)];
      HX_PixelFloat sum{};
      for (std::size_t k = 0; k < columns.weights.size(); ++k) {
        const HX_PixelFloat& pixel = line[static_cast<std::size_t>(columns.first) + k];
        sum.alpha += columns.weights[k] * pixel.alpha;
        sum.red += columns.weights[k] * pixel.red;
        sum.green += columns.weights[k] * pixel.green;
        sum.blue += columns.weights[k] * pixel.blue;
      }
      const float gain = sum.alpha > 0 ? 1 / (sum.alpha * kTop<Pixel>) : 0;
      out[x] = FromUnit<Pixel>({sum.alpha, sum.red * gain, sum.green * gain, sum.blue * gain});
    }
  }
}

}  // namespace

std::size_t BytesOf(PixelKind kind) {
  std::size_t bytes = 0;
  WithPixel(kind, [&](auto pixel) { bytes = sizeof pixel; });
  return bytes;
}

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
  return boost::make_shared<PicturePool>();
}

boost::shared_ptr<Picture> PicturePool::NewPicture(PixelKind kind, int width, int height,
                                                   std::ptrdiff_t padding, bool top_down) {
  const auto row_bytes = static_cast<std::ptrdiff_t>(BytesOf(kind)) * width + padding;
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
  WithPixel(picture.kind(), [&]<class Pixel>(Pixel) {
    for (int y = 0; y < picture.height(); ++y) {
      Pixel* row = picture.row<Pixel>(y);
      for (int x = 0; x < picture.width(); ++x) row[x] = FromUnit<Pixel>(colour(x, y));
    }
  });
}

void KeepField(Picture& picture, int parity) {
  if (picture.height() < 2) return;
  WithPixel(picture.kind(), [&]<class Pixel>(Pixel) { KeepFieldOf<Pixel>(picture, parity); });
}

void ScalePicture(const Picture& from, Picture& to) {
  WithPixel(to.kind(), [&]<class Pixel>(Pixel) { ScaleOf<Pixel>(from, to); });
}

}  // namespace calmframe::host
