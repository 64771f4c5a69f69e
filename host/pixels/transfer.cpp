#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

// Where a format's alpha stands, as the bits of its channel.
template <class Bits, int Place, Bits Full>
struct AlphaOf {
  static constexpr Bits full = Full;
  static constexpr bool is_float = sizeof(Bits) == 4;

  static Bits At(const std::uint8_t* pixels, int i) {
    Bits bits;
    std::memcpy(&bits, pixels + (4 * i + Place) * static_cast<int>(sizeof(Bits)), sizeof(Bits));
    return bits;
  }
  static bool IsClear(Bits bits) {
    if constexpr (is_float) return (bits & 0x7fffffffu) == 0;  // of either sign
    return bits == 0;
  }
  static bool IsPositive(Bits bits) {
    if constexpr (is_float) return std::bit_cast<float>(bits) > 0.0f;
    return bits != 0;
  }
  static bool AllFull(const std::uint8_t* pixels, int count) {
    Bits other = 0;
    for (int i = 0; i < count; ++i) other = static_cast<Bits>(other | (At(pixels, i) ^ full));
    return other == 0;
  }
  static bool AllClear(const std::uint8_t* pixels, int count) {
    Bits set = 0;
    for (int i = 0; i < count; ++i) set = static_cast<Bits>(set | At(pixels, i));
    return IsClear(set);
  }
  static bool NoneClear(const std::uint8_t* pixels, int count) {
    bool clear = false;
    for (int i = 0; i < count; ++i) clear |= IsClear(At(pixels, i));
    return !clear;
  }
};

template <class Visit>
void ForFormat(std::uint32_t format, const Visit& visit) {
  switch (format) {
    case HX_FORMAT_ARGB8:
      return visit(AlphaOf<std::uint8_t, 0, 255>());
    case HX_FORMAT_BGRA8:
      return visit(AlphaOf<std::uint8_t, 3, 255>());
    case HX_FORMAT_ARGB16:
      return visit(AlphaOf<std::uint16_t, 0, 32768>());
    default:
      return visit(AlphaOf<std::uint32_t, 0, std::bit_cast<std::uint32_t>(1.0f)>());
  }
}

// Into `to`, which is either of both; alpha of `front` is what it covers with.
void Compose(const float* front, const float* back, float* to) {
  const float behind = back[0] * (1.0f - front[0]);
  const float alpha = front[0] + behind;
  for (std::size_t c = 1; c < 4; ++c) {
    to[c] = alpha > 0.0f ? (front[c] * front[0] + back[c] * behind) / alpha : 0.0f;
  }
  to[0] = alpha > 0.0f ? alpha : 0.0f;
}

struct Formats {
  std::uint32_t from;
  std::uint32_t to;
  int from_bytes;  // of a pixel
  int to_bytes;
};

// Few enough that rows of floats stay in the first cache, enough for the loops over one.
constexpr int kChunk = 64;

// By the formula; at most kChunk pixels.
void Mix(const Formats& formats, const std::uint8_t* from, std::uint8_t* to, int count,
         bool in_front, float opacity) {
  std::array<float, 4 * kChunk> source, target;
  LoadRow(formats.from, from, count, source.data());
  LoadRow(formats.to, to, count, target.data());
  for (int i = 0; i < count; ++i) {
    float* const s = source.data() + 4 * i;
    float* const d = target.data() + 4 * i;
    s[0] *= opacity;
    if (in_front) {
      Compose(s, d, d);
    } else {
      Compose(d, s, d);
    }
  }
  StoreRow(formats.to, target.data(), count, to);
}

enum class Fate : std::uint8_t { stays, is_cleared, is_replaced, is_mixed };

// At most kChunk pixels: what needs no arithmetic is left alone or copied, in runs. With `covers`
// an opaque source hides the target, and a source is stored as it is where there is no target.
template <class From, class To>
void TransferChunk(const Formats& formats, const std::uint8_t* from, std::uint8_t* to, int count,
                   bool in_front, float opacity, bool covers) {
  if (!in_front && To::AllFull(to, count)) return;
  if (From::AllClear(from, count) && To::NoneClear(to, count)) return;
  const auto fate = [&](int i) {
    const auto source = From::At(from, i);
    const auto target = To::At(to, i);
    if (!in_front && target == To::full) return Fate::stays;
    if (From::IsClear(source)) return To::IsClear(target) ? Fate::is_cleared : Fate::stays;
    if (covers &&
        ((To::IsClear(target) && From::IsPositive(source)) || (in_front && source == From::full))) {
      return Fate::is_replaced;
    }
    return Fate::is_mixed;
  };
  for (int i = 0; i < count;) {
    const Fate common = fate(i);
    int end = i + 1;
    while (end < count && fate(end) == common) ++end;
    const std::uint8_t* const source = from + std::ptrdiff_t{i} * formats.from_bytes;
    std::uint8_t* const target = to + std::ptrdiff_t{i} * formats.to_bytes;
    const std::size_t bytes = static_cast<std::size_t>(end - i) * formats.to_bytes;
    if (common == Fate::is_cleared) {
      std::memset(target, 0, bytes);
    } else if (common == Fate::is_replaced) {
      std::memcpy(target, source, bytes);
    } else if (common == Fate::is_mixed) {
      Mix(formats, source, target, end - i, in_front, opacity);
    }
    i = end;
  }
}

}  // namespace

HX_Err Transfer(const HX_World& from, const HX_TransferMode& mode, int x, int y, HX_World& to) {
  Formats formats{FormatOf(from), FormatOf(to), 0, 0};
  formats.from_bytes = BytesPerPixel(formats.from);
  formats.to_bytes = BytesPerPixel(formats.to);
  const bool in_front = mode.mode == HX_TRANSFER_IN_FRONT;
  if (!from.data || !to.data || formats.from_bytes == 0 || formats.to_bytes == 0 ||
      (!in_front && mode.mode != HX_TRANSFER_BEHIND)) {
    return HX_ERR_UNKNOWN;
  }
  const HX_Rect part =
      Intersect({x, y, x + from.width, y + from.height}, {0, 0, to.width, to.height});
  if (IsEmpty(part)) return HX_ERR_NONE;
  const float opacity = formats.to_bytes == 4 ? static_cast<float>(mode.opacity) / 255.0f
                                              : static_cast<float>(mode.opacity_u16) / 32768.0f;
  const bool covers = formats.from == formats.to && opacity == 1.0f;
  ForFormat(formats.from, [&](auto from_alpha) {
    ForFormat(formats.to, [&](auto to_alpha) {
      for (int row = part.top; row < part.bottom; ++row) {
        const auto* source = static_cast<const std::uint8_t*>(from.data) +
                             std::ptrdiff_t{from.row_bytes} * (row - y) +
                             std::ptrdiff_t{part.left - x} * formats.from_bytes;
        auto* target = static_cast<std::uint8_t*>(to.data) + std::ptrdiff_t{to.row_bytes} * row +
                       std::ptrdiff_t{part.left} * formats.to_bytes;
        for (int left = part.right - part.left; left > 0; left -= kChunk) {
          TransferChunk<decltype(from_alpha), decltype(to_alpha)>(
              formats, source, target, std::min(left, kChunk), in_front, opacity, covers);
          source += kChunk * formats.from_bytes;
          target += kChunk * formats.to_bytes;
        }
      }
    });
  });
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
