#include "host/shots/mixture.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <vector>

namespace calmframe::host {
namespace {

using Area = FrameDigest::Area;

constexpr int kGridWide = FrameDigest::kColumns, kGridHigh = FrameDigest::kRows;
constexpr int kHalfGridWide = FrameDigest::kHalfColumns, kHalfGridHigh = FrameDigest::kHalfRows;

// Parts of the frame that move each by itself, as depth, turns and things that move want it. They
// are large, since a small part fits anything at some place.
constexpr int kPartsAcross = 4, kPartsDown = 3, kParts = kPartsAcross * kPartsDown;
constexpr int kPartWide = kGridWide / kPartsAcross, kPartHigh = kGridHigh / kPartsDown;
// How far, in cells.
constexpr int kPartBeside = 2, kPartTried = 2 * kPartBeside + 1;
// How far the frame as a whole is looked for, in cells of `half`.
constexpr int kReachX = 8, kReachY = 5;
constexpr double kNothing = FrameDetail::kNothing;

Area Common(const Area& a, const Area& b) {
  return {std::max(a.left, b.left), std::max(a.top, b.top), std::min(a.right, b.right),
          std::min(a.bottom, b.bottom)};
}
Area At(const Area& a, CellShift by) {
  return {a.left + by.x, a.top + by.y, a.right + by.x, a.bottom + by.y};
}
Area Less(const Area& a, int by) {
  return {a.left + by, a.top + by, a.right - by, a.bottom - by};
}

// The sum of products over an area of the first, the second's cell for (x, y) being at (x - by.x,
// y - by.y). Eight at a time, for vectors.
template <int columns>
std::int32_t Products(const std::int16_t* p, const std::int16_t* q, const Area& area,
                      CellShift by) {
  constexpr int kLanes = 8;
  std::int32_t lanes[kLanes] = {}, sum = 0;
  for (int y = area.top; y < area.bottom; ++y) {
    const std::int16_t* const a = p + y * columns;
    const std::int16_t* const b = q + (y - by.y) * columns - by.x;
    int x = area.left;
    for (; x + kLanes <= area.right; x += kLanes) {
      for (int k = 0; k < kLanes; ++k) lanes[k] += a[x + k] * b[x + k];
    }
    for (; x < area.right; ++x) sum += a[x] * b[x];
  }
  for (const std::int32_t lane : lanes) sum += lane;
  return sum;
}

// Summed-area tables (Crow, 1984), and the sum over a rectangle from one.
template <int columns, std::size_t cells, std::size_t sums>
void SumSquares(const std::array<std::int16_t, cells>& values,
                std::array<std::uint32_t, sums>& table) {
  table.fill(0);
  for (std::size_t k = 0; k < cells; ++k) {
    const std::size_t at = k / columns * (columns + 1) + k % columns;
    table[at + columns + 2] = table[at + columns + 1] + table[at + 1] - table[at] +
                              static_cast<std::uint32_t>(values[k] * values[k]);
  }
}
template <int columns, std::size_t sums>
double SquareIn(const std::array<std::uint32_t, sums>& table, const Area& area) {
  const auto at = [&table](int x, int y) {
    return table[static_cast<std::size_t>(y * (columns + 1) + x)];
  };
  return at(area.right, area.bottom) - at(area.left, area.bottom) - at(area.right, area.top) +
         at(area.left, area.top);
}

// The place of the whole frame, in cells, by correlation.
std::optional<CellShift> Place(const FrameDetail& other, const FrameDetail& frame,
                               CellShift about) {
  const auto halved = [](const Area& a) {
    return Area{(a.left + 1) / 2, (a.top + 1) / 2, a.right / 2, a.bottom / 2};
  };
  const Area mine = halved(frame.area), its = halved(other.area);
  const CellShift middle{static_cast<int>(std::lround(about.x / 2.0)),
                         static_cast<int>(std::lround(about.y / 2.0))};
  std::optional<CellShift> best;
  double most = -2;
  for (int y = middle.y - kReachY; y <= middle.y + kReachY; ++y) {
    for (int x = middle.x - kReachX; x <= middle.x + kReachX; ++x) {
      const CellShift shift{x, y};
      const Area both = Common(mine, At(its, shift));
      if (both.IsEmpty() || 2 * both.size() < mine.size()) continue;
      const auto* const f = frame.half.data();
      const auto* const o = other.half.data();
      const double n = kNothing / 2 * both.size();
      const double product = Products<kHalfGridWide>(f, o, both, shift);
      const double own = SquareIn<kHalfGridWide>(frame.half_squares, both);
      const double others = SquareIn<kHalfGridWide>(other.half_squares, At(both, {-x, -y}));
      const double correlation = product / std::sqrt((own + n) * (others + n));
      if (correlation > most) {
        most = correlation;
        best = CellShift{2 * x, 2 * y};
      }
    }
  }
  return best;
}

// What of a part is seen wherever it is tried, in the frame's cells; empty where that is little.
Area Seen(int part, const FrameDetail& frame, const FrameDetail& other, CellShift shift) {
  const int left = part % kPartsAcross * kPartWide, top = part / kPartsAcross * kPartHigh;
  const Area whole{left, top, left + kPartWide, top + kPartHigh};
  const Area seen = Common(Common(whole, frame.area), At(Less(other.area, kPartBeside), shift));
  return 3 * seen.size() < kPartWide * kPartHigh ? Area{} : seen;
}

CellShift Trial(int k) {
  return {k % kPartTried - kPartBeside, k / kPartTried - kPartBeside};
}

// Where a part of another frame correlates best with it; `cells` as a frame's.
CellShift BestBeside(const std::int16_t* cells, const FrameDetail& other, const Area& seen,
                     CellShift shift) {
  CellShift best = shift;
  double most = 0;
  for (int k = 0; k < kPartTried * kPartTried; ++k) {
    const CellShift tried = shift + Trial(k);
    const double product = Products<kGridWide>(cells, other.cells.data(), seen, tried);
    if (!(product > 0)) continue;
    const double square = other.SquareIn(At(seen, {-tried.x, -tried.y}));
    const double score = product * product / (square + kNothing * seen.size());
    if (score > most) {
      most = score;
      best = tried;
    }
  }
  return best;
}

// How much a part counts: all with detail alike, whatever its contrast.
double WeightOf(double square, const Area& seen) {
  return 1 / (square + 2 * kNothing * seen.size());
}

// A part of a frame, and where it lies in the two that it may be a mixture of.
struct PartOfBoth {
  Area seen;
  CellShift a, b;
};

// Weighted sums of squares and products over the parts: of the frame, A, and B.
struct Sums {
  double ff = 0, aa = 0, bb = 0, fa = 0, fb = 0, ab = 0;
};

Sums SumsOf(const std::vector<PartOfBoth>& parts, const FrameDetail& a, const FrameDetail& frame,
            const FrameDetail& b) {
  const std::int16_t* const f = frame.cells.data();
  const std::int16_t* const p = a.cells.data();
  const std::int16_t* const q = b.cells.data();
  Sums sums;
  for (const PartOfBoth& part : parts) {
    const Area in_a = At(part.seen, {-part.a.x, -part.a.y});
    const Area in_b = At(part.seen, {-part.b.x, -part.b.y});
    const double own = frame.SquareIn(part.seen);
    const double weight = WeightOf(own, part.seen);
    sums.ff += weight * own;
    sums.aa += weight * a.SquareIn(in_a);
    sums.bb += weight * b.SquareIn(in_b);
    sums.fa += weight * Products<kGridWide>(f, p, part.seen, part.a);
    sums.fb += weight * Products<kGridWide>(f, q, part.seen, part.b);
    sums.ab += weight * Products<kGridWide>(p, q, in_a, part.b - part.a);
  }
  return sums;
}

double LeftBy(double product, double frame, double other) {
  return product > 0 ? 1 - product * product / (frame * other) : 1;
}

// Frame = first * A + second * B by its normal equations.
struct Weights {
  double first = 0, second = 0, left = 1;
};
Weights Solve(const Sums& s) {
  const double determinant = s.aa * s.bb - s.ab * s.ab;
  if (!(determinant > 1e-6 * s.aa * s.bb)) return {s.fa / s.aa, 0, LeftBy(s.fa, s.ff, s.aa)};
  Weights w;
  w.first = (s.fa * s.bb - s.fb * s.ab) / determinant;
  w.second = (s.fb * s.aa - s.fa * s.ab) / determinant;
  w.left = 1 - (w.first * s.fa + w.second * s.fb) / s.ff;
  return w;
}

// A frame's cells in an area less a share of another's.
using PartCells = std::array<std::int16_t, kGridWide * kGridHigh>;
void Subtract(const FrameDetail& frame, const FrameDetail& other, double share, const Area& area,
              CellShift shift, PartCells& rest) {
  const int factor = static_cast<int>(std::lround(256 * std::clamp(share, 0.0, 2.0)));
  for (int y = area.top; y < area.bottom; ++y) {
    const std::int16_t* const f = frame.cells.data() + y * kGridWide;
    const std::int16_t* const o = other.cells.data() + (y - shift.y) * kGridWide - shift.x;
    std::int16_t* const out = rest.data() + y * kGridWide;
    for (int x = area.left; x < area.right; ++x) {
      out[x] = static_cast<std::int16_t>(f[x] - ((factor * o[x]) >> 8));
    }
  }
}

// The frame's parts by A and by B: A where it fits best, B where it fits what A leaves, A where it
// fits what B leaves.
Weights Explain(const std::vector<Area>& seen, const FrameDetail& a, CellShift at_a,
                const FrameDetail& frame, const FrameDetail& b, CellShift at_b) {
  std::vector<PartOfBoth> parts;
  for (const Area& area : seen) {
    const CellShift best = BestBeside(frame.cells.data(), a, area, at_a);
    parts.push_back({area, best, best});
  }
  const Sums alone = SumsOf(parts, a, frame, a);
  PartCells rest;
  for (PartOfBoth& part : parts) {
    Subtract(frame, a, alone.fa / alone.aa, part.seen, part.a, rest);
    part.b = BestBeside(rest.data(), b, part.seen, at_b);
  }
  const double second = Solve(SumsOf(parts, a, frame, b)).second;
  for (PartOfBoth& part : parts) {
    Subtract(frame, b, second, part.seen, part.b, rest);
    part.a = BestBeside(rest.data(), a, part.seen, at_a);
  }
  return Solve(SumsOf(parts, a, frame, b));
}

}  // namespace

double FrameDetail::SquareIn(const Area& within) const {
  return host::SquareIn<kGridWide>(squares, within);
}

FrameDetail DetailOf(const FrameDigest& digest) {
  constexpr int kAbout = 4;  // cells to each side
  FrameDetail detail;
  detail.cells.fill(0);
  detail.half.fill(0);
  const Area area = digest.area.IsEmpty() ? Area{0, 0, kGridWide, kGridHigh} : digest.area;
  detail.area = area;
  // Sums over rectangles from the area's corner (summed-area table; Crow, 1984).
  std::array<std::int32_t, (kGridWide + 1) * (kGridHigh + 1)> sums{};
  const auto sum_at = [&](int x, int y) -> std::int32_t& {
    return sums[static_cast<std::size_t>(y * (kGridWide + 1) + x)];
  };
  for (int y = area.top; y < area.bottom; ++y) {
    std::int32_t row = 0;
    for (int x = area.left; x < area.right; ++x) {
      row += digest.cells[static_cast<std::size_t>(y * kGridWide + x)];
      sum_at(x + 1, y + 1) = sum_at(x + 1, y) + row;
    }
  }
  for (int y = area.top; y < area.bottom; ++y) {
    const int top = std::max(y - kAbout, area.top), bottom = std::min(y + kAbout + 1, area.bottom);
    for (int x = area.left; x < area.right; ++x) {
      const int left = std::max(x - kAbout, area.left),
                right = std::min(x + kAbout + 1, area.right);
      const std::int32_t sum =
          sum_at(right, bottom) - sum_at(left, bottom) - sum_at(right, top) + sum_at(left, top);
      const double mean = static_cast<double>(sum) / ((right - left) * (bottom - top));
      const auto k = static_cast<std::size_t>(y * kGridWide + x);
      // In quarters, so that faint pictures keep their shape; one part of the frame's sum of
      // products stays below 2^31.
      detail.cells[k] =
          static_cast<std::int16_t>(std::lround(FrameDetail::kUnit * (digest.cells[k] - mean)));
    }
  }
  for (int y = 0; y < kHalfGridHigh; ++y) {
    for (int x = 0; x < kHalfGridWide; ++x) {
      const std::int16_t* const four = detail.cells.data() + 2 * (y * kGridWide + x);
      detail.half[static_cast<std::size_t>(y * kHalfGridWide + x)] = static_cast<std::int16_t>(
          (four[0] + four[1] + four[kGridWide] + four[kGridWide + 1]) / 4);
    }
  }
  SumSquares<kGridWide>(detail.cells, detail.squares);
  SumSquares<kHalfGridWide>(detail.half, detail.half_squares);
  return detail;
}

std::optional<Laid> Lay(const FrameDetail& other, const FrameDetail& frame, CellShift about) {
  const std::optional<CellShift> place = Place(other, frame, about);
  if (!place) return {};
  Laid laid{*place, 1};
  double own = 0, others = 0, products = 0;
  for (int part = 0; part < kParts; ++part) {
    const Area seen = Seen(part, frame, other, *place);
    if (seen.IsEmpty()) continue;
    const std::int16_t* const f = frame.cells.data();
    const std::int16_t* const o = other.cells.data();
    const CellShift best = BestBeside(f, other, seen, *place);
    const double square = frame.SquareIn(seen);
    const double weight = WeightOf(square, seen);
    own += weight * square;
    others += weight * other.SquareIn(At(seen, {-best.x, -best.y}));
    products += weight * Products<kGridWide>(f, o, seen, best);
  }
  laid.left = LeftBy(products, own, others);
  return laid;
}

std::optional<Mixture> MixtureOf(const FrameDetail& first, const Laid& a, const FrameDetail& frame,
                                 const FrameDetail& second, const Laid& b) {
  std::vector<Area> parts;
  int cells = 0;
  for (int k = 0; k < kParts; ++k) {
    const Area seen = Common(Seen(k, frame, first, a.shift), Seen(k, frame, second, b.shift));
    if (seen.IsEmpty() || 3 * seen.size() < kPartWide * kPartHigh) continue;
    parts.push_back(seen);
    cells += seen.size();
  }
  if (3 * cells < frame.area.size()) return {};
  const Weights both = Explain(parts, first, a.shift, frame, second, b.shift);
  Mixture m;
  m.first_weight = both.first;
  m.second_weight = both.second;
  m.left = both.left;
  m.first_left = Explain(parts, first, a.shift, frame, first, a.shift).left;
  m.second_left = Explain(parts, second, b.shift, frame, second, b.shift).left;
  return m;
}

}  // namespace calmframe::host
