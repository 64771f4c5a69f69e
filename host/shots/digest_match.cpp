#include "host/shots/digest_match.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace calmframe::host {
namespace {

using Area = FrameDigest::Area;

constexpr int kColumns = FrameDigest::kColumns, kRows = FrameDigest::kRows;
constexpr int kHalfColumns = FrameDigest::kHalfColumns, kHalfRows = FrameDigest::kHalfRows;

// A variance of cells, in 255ths squared, that says nothing: what noise and a coder leave.
constexpr double kNoise = 4;

Area Intersection(const Area& a, const Area& b) {
  return {std::max(a.left, b.left), std::max(a.top, b.top), std::min(a.right, b.right),
          std::min(a.bottom, b.bottom)};
}
Area Moved(const Area& a, CellShift by) {
  return {a.left + by.x, a.top + by.y, a.right + by.x, a.bottom + by.y};
}

// What either shows; bars of both are left out.
Area SharedArea(const FrameDigest& a, const FrameDigest& b) {
  const Area area = Union(a.area, b.area);
  return area.IsEmpty() ? Area{0, 0, kColumns, kRows} : area;
}

// Whole cells of `half` within it.
Area HalfOf(const Area& area) {
  return {(area.left + 1) / 2, (area.top + 1) / 2, area.right / 2, area.bottom / 2};
}

// Sums of two values and of their products.
struct Moments {
  double n = 0, a = 0, b = 0, aa = 0, bb = 0, ab = 0;
  double var_a() const { return std::max(0.0, aa - a * a / n) / n; }
  double var_b() const { return std::max(0.0, bb - b * b / n) / n; }
  double cov() const { return (ab - a * b / n) / n; }
};

// Sums of a picture's values and of their squares over any rectangle (summed-area tables; Crow,
// 1984).
class AreaSums {
 public:
  explicit AreaSums(const std::array<std::uint8_t, kHalfColumns * kHalfRows>& cells) {
    for (int y = 0; y < kHalfRows; ++y) {
      std::int32_t sum = 0, squares = 0;
      for (int x = 0; x < kHalfColumns; ++x) {
        const int v = cells[static_cast<std::size_t>(y * kHalfColumns + x)];
        sum += v;
        squares += v * v;
        sums_[At(x + 1, y + 1)] = sums_[At(x + 1, y)] + sum;
        squares_[At(x + 1, y + 1)] = squares_[At(x + 1, y)] + squares;
      }
    }
  }
  std::int32_t Sum(const Area& area) const { return Of(sums_, area); }
  std::int32_t Squares(const Area& area) const { return Of(squares_, area); }

 private:
  using Table = std::array<std::int32_t, (kHalfColumns + 1) * (kHalfRows + 1)>;
  static std::size_t At(int x, int y) {
    return static_cast<std::size_t>(y * (kHalfColumns + 1) + x);
  }
  static std::int32_t Of(const Table& t, const Area& a) {
    return t[At(a.right, a.bottom)] - t[At(a.left, a.bottom)] - t[At(a.right, a.top)] +
           t[At(a.left, a.top)];
  }
  Table sums_{}, squares_{};
};

// The sum of products over an area of the first picture.
template <int columns>
std::int32_t Products(const std::uint8_t* a, const std::uint8_t* b, const Area& area,
                      CellShift by) {
  std::int32_t sum = 0;
  const int width = area.right - area.left;
  for (int y = area.top; y < area.bottom; ++y) {
    const std::uint8_t* const p = a + y * columns + area.left;
    const std::uint8_t* const q = b + (y + by.y) * columns + area.left + by.x;
    for (int x = 0; x < width; ++x) sum += p[x] * q[x];
  }
  return sum;
}

struct HalfMatch {
  CellShift shift;  // in cells of `half`
  double correlation = -2;
};

// The best of the shifts about a middle one that leave at least `least` of the area. `noise`: a
// variance that says nothing.
HalfMatch BestShift(const FrameDigest& a, const FrameDigest& b, const Area& area, CellShift middle,
                    int reach_x, int reach_y, double least, double noise) {
  const AreaSums a_sums(a.half), b_sums(b.half);
  HalfMatch best;
  for (int y = middle.y - reach_y; y <= middle.y + reach_y; ++y) {
    for (int x = middle.x - reach_x; x <= middle.x + reach_x; ++x) {
      const CellShift shift{x, y};
      const Area in_a = Intersection(area, Moved(area, {-x, -y}));
      if (in_a.IsEmpty() || in_a.size() < least * area.size()) continue;
      const Area in_b = Moved(in_a, shift);
      const Moments m{1.0 * in_a.size(),
                      1.0 * a_sums.Sum(in_a),
                      1.0 * b_sums.Sum(in_b),
                      1.0 * a_sums.Squares(in_a),
                      1.0 * b_sums.Squares(in_b),
                      1.0 * Products<kHalfColumns>(a.half.data(), b.half.data(), in_a, shift)};
      const double correlation = m.cov() / std::sqrt((m.var_a() + noise) * (m.var_b() + noise));
      if (correlation > best.correlation) best = {shift, correlation};
    }
  }
  return best;
}

// -- Blocks --

constexpr int kBlocksAcross = 8, kBlocksDown = 4, kBlocks = kBlocksAcross * kBlocksDown;
constexpr int kBlockWidth = kColumns / kBlocksAcross, kBlockHeight = kRows / kBlocksDown;
// How far a block may lie beside the frame's shift, in cells, a 64th of the width each: what a turn
// by some degrees, a zoom or depth do from one frame to the next.
constexpr int kBeside = 3;
// Of the contrast's square: a block with more than that counts in full.
constexpr double kFullContrast = 8 * kNoise;
// The share of the blocks that DigestMatch::common is of, and what counts in full there: sky and
// road are alike in two views of a place.
constexpr double kCommon = 0.35, kRichContrast = 256;

Moments BlockMoments(const FrameDigest& a, const FrameDigest& b, const Area& in_a, CellShift by) {
  std::int32_t n = in_a.size(), sa = 0, sb = 0, aa = 0, bb = 0, ab = 0;
  const int width = in_a.right - in_a.left;
  for (int y = in_a.top; y < in_a.bottom; ++y) {
    const std::uint8_t* const p = a.cells.data() + y * kColumns + in_a.left;
    const std::uint8_t* const q = b.cells.data() + (y + by.y) * kColumns + in_a.left + by.x;
    for (int x = 0; x < width; ++x) {
      sa += p[x];
      sb += q[x];
      aa += p[x] * p[x];
      bb += q[x] * q[x];
      ab += p[x] * q[x];
    }
  }
  return {1.0 * n, 1.0 * sa, 1.0 * sb, 1.0 * aa, 1.0 * bb, 1.0 * ab};
}

// The part of a block of the first frame that the second shows too; empty where that is less than
// half of it.
Area SharedBlock(const Area& area, CellShift shift, int block) {
  const int left = block % kBlocksAcross * kBlockWidth, top = block / kBlocksAcross * kBlockHeight;
  const Area whole{left, top, left + kBlockWidth, top + kBlockHeight};
  const Area shared = Intersection(Intersection(area, Moved(area, {-shift.x, -shift.y})), whole);
  return shared.size() < kBlockWidth * kBlockHeight / 2 ? Area{} : shared;
}

// By how much the contrast of the second frame is that of the first: what half of the blocks have
// at least, so that neither a title nor a lamp in a part of the frame counts.
double GainOf(const FrameDigest& first, const FrameDigest& second, const Area& area,
              CellShift shift) {
  std::vector<double> ratios;
  for (int k = 0; k < kBlocks; ++k) {
    const Area in_first = SharedBlock(area, shift, k);
    if (in_first.IsEmpty()) continue;
    const Moments m = BlockMoments(first, second, in_first, shift);
    if (std::max(m.var_a(), m.var_b()) < kFullContrast / 2) continue;
    ratios.push_back((m.var_b() + kNoise) / (m.var_a() + kNoise));
  }
  if (ratios.empty()) return 1;
  const auto middle = ratios.begin() + static_cast<std::ptrdiff_t>(ratios.size() / 2);
  std::nth_element(ratios.begin(), middle, ratios.end());
  return std::clamp(std::sqrt(*middle), 0.25, 4.0);
}

}  // namespace

Area Union(const Area& a, const Area& b) {
  if (a.IsEmpty()) return b;
  if (b.IsEmpty()) return a;
  return {std::min(a.left, b.left), std::min(a.top, b.top), std::max(a.right, b.right),
          std::max(a.bottom, b.bottom)};
}

namespace {

// With the second frame about `shift` beside the first.
DigestMatch BlocksAbout(const FrameDigest& first, const FrameDigest& second, const Area& area,
                        CellShift shift) {
  const double gain = GainOf(first, second, area, shift);

  struct BlockMatch {
    double least = 2, contrast = 0;  // the contrast's square
  };
  std::array<BlockMatch, kBlocks> blocks;
  DigestMatch match;
  double best = 2;
  for (int y = -kBeside; y <= kBeside; ++y) {
    for (int x = -kBeside; x <= kBeside; ++x) {
      const CellShift tried = shift + CellShift{x, y};
      double residuals = 0, contrasts = 0;
      for (int k = 0; k < kBlocks; ++k) {
        const Area in_first = SharedBlock(area, tried, k);
        if (in_first.IsEmpty()) continue;
        const Moments m = BlockMoments(first, second, in_first, tried);
        const double a = gain * gain * m.var_a(), b = m.var_b();
        const double residual = std::max(0.0, a + b - 2 * gain * m.cov());
        BlockMatch& block = blocks[static_cast<std::size_t>(k)];
        block.least = std::min(block.least, std::min(1.0, residual / (a + b + 2 * kNoise)));
        block.contrast = std::max({block.contrast, m.var_a(), b});
        residuals += residual;
        contrasts += a + b;
      }
      if (contrasts > 0 && residuals / contrasts < best) {
        best = residuals / contrasts;
        match.shift = tried;
      }
    }
  }
  const auto end = std::remove_if(blocks.begin(), blocks.end(),
                                  [](const BlockMatch& block) { return block.least > 1; });
  double sum = 0, weights = 0, rich = 0;
  for (auto block = blocks.begin(); block != end; ++block) {
    const double weight = std::min(1.0, block->contrast / kFullContrast);
    sum += weight * block->least;
    weights += weight;
    rich += std::min(1.0, block->contrast / kRichContrast);
  }
  if (!(weights > 0)) return match;
  // A tenth of full weight for each block that says nothing.
  match.difference = sum / (weights + 0.1 * static_cast<double>(end - blocks.begin()));
  std::sort(blocks.begin(), end,
            [](const BlockMatch& a, const BlockMatch& b) { return a.least < b.least; });
  double alike = 0;
  for (auto block = blocks.begin(); block != end && alike < kCommon * rich; ++block) {
    alike += std::min(1.0, block->contrast / kRichContrast);
    match.common = block->least;
  }
  return match;
}

}  // namespace

DigestMatch MatchOf(const FrameDigest& first, const FrameDigest& second) {
  const Area area = SharedArea(first, second);
  const Area half = HalfOf(area);
  // Less than two fifths of a frame fit too easily.
  const HalfMatch whole = BestShift(first, second, half, {}, (half.right - half.left) / 2,
                                    (half.bottom - half.top) / 2, 0.4, kNoise);
  const CellShift shift{2 * whole.shift.x, 2 * whole.shift.y};
  const DigestMatch match = BlocksAbout(first, second, area, shift);
  // A title that comes or goes may draw the shift to itself where the picture repeats.
  constexpr double kFits = 0.05;
  if (match.difference < kFits || shift == CellShift{}) return match;
  const DigestMatch standing = BlocksAbout(first, second, area, {});
  return standing.difference < match.difference ? standing : match;
}

// -- Light --

namespace {

// The first frame in the tones of the second, which lies `shift` beside it: each tone becomes the
// mean of what the second shows there, and no brighter one a darker. Straight between 16 tones.
FrameDigest InTonesOf(const FrameDigest& first, const FrameDigest& second, CellShift shift) {
  constexpr int kTones = 16;
  constexpr double kStep = 255.0 / (kTones - 1);
  constexpr double kFew = 4;  // cells, fewer of which say nothing
  std::array<double, kTones> sums{}, counts{};
  const Area shared =
      Intersection(SharedArea(first, second), Moved({0, 0, kColumns, kRows}, {-shift.x, -shift.y}));
  for (int y = shared.top; y < shared.bottom; ++y) {
    for (int x = shared.left; x < shared.right; ++x) {
      const double tone = first.cells[static_cast<std::size_t>(y * kColumns + x)] / kStep;
      const auto k = static_cast<std::size_t>(std::min(tone, kTones - 1.001));
      const double part = tone - static_cast<double>(k);
      const double value =
          second.cells[static_cast<std::size_t>((y + shift.y) * kColumns + x + shift.x)];
      sums[k] += (1 - part) * value;
      counts[k] += 1 - part;
      sums[k + 1] += part * value;
      counts[k + 1] += part;
    }
  }
  // Tones that hardly occur are those below them, or what stands at the start.
  std::array<double, kTones> curve{};
  double last = 0;
  for (std::size_t k = 0; k < curve.size(); ++k) {
    if (counts[k] > kFew) last = std::max(last, sums[k] / counts[k]);
    curve[k] = last;
  }
  FrameDigest toned = first;
  for (std::uint8_t& cell : toned.cells) {
    const double tone = cell / kStep;
    const auto k = static_cast<std::size_t>(std::min(tone, kTones - 1.001));
    const double part = tone - static_cast<double>(k);
    cell = static_cast<std::uint8_t>(std::lround((1 - part) * curve[k] + part * curve[k + 1]));
  }
  return toned;
}

}  // namespace

double DifferenceButForLight(const FrameDigest& first, const FrameDigest& second,
                             const DigestMatch& match) {
  // What is too bright in one can't be made of it, but of the other.
  const Area area = SharedArea(first, second);
  const FrameDigest toned_first = InTonesOf(first, second, match.shift);
  const FrameDigest toned_second = InTonesOf(second, first, {-match.shift.x, -match.shift.y});
  return std::min({match.difference, BlocksAbout(toned_first, second, area, match.shift).difference,
                   BlocksAbout(first, toned_second, area, match.shift).difference});
}

}  // namespace calmframe::host
