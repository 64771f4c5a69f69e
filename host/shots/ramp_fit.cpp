#include "host/shots/ramp_fit.h"

#include <algorithm>
#include <numeric>

namespace calmframe::host {
namespace {

constexpr std::size_t kCount = FrameParts::kCount;
constexpr int kCellsAcross = FrameDigest::kColumns / FrameParts::kAcross;
constexpr int kCellsDown = FrameDigest::kRows / FrameParts::kDown;

// A square of detail that says nothing: what noise and a coder leave.
constexpr double kFaintSquare = 2 * FrameDetail::kNothing;

// Values as first * u + second * v by least squares, for u and v that many values share.
class Pair {
 public:
  void Add(double u, double v) {
    uu_ += u * u;
    uv_ += u * v;
    vv_ += v * v;
  }
  struct Ends {
    double first = 0, second = 0, explained = 0;  // of the sum of the values' squares
  };
  // The sums of the values' products with u and with v.
  Ends Fit(double u, double v) const {
    const double determinant = uu_ * vv_ - uv_ * uv_;
    if (!(determinant > 1e-9 * uu_ * vv_)) return {};
    Ends ends{(u * vv_ - v * uv_) / determinant, (v * uu_ - u * uv_) / determinant, 0};
    ends.explained = ends.first * u + ends.second * v;
    return ends;
  }

 private:
  double uu_ = 0, uv_ = 0, vv_ = 0;
};

std::vector<double> SharesOf(const Ramp& ramp) {
  std::vector<double> shares;
  const auto before = static_cast<double>(ramp.before), behind = static_cast<double>(ramp.behind);
  for (std::size_t t = 0; t < ramp.frames.size(); ++t) {
    const double along = (static_cast<double>(t) - before) / (behind - before);
    shares.push_back(std::clamp(along, 0.0, 1.0));
  }
  return shares;
}

// See ToneFit::light. The line is of the frames that show one shot alone: one through all would
// give way to the arc.
double LightOf(const Ramp& ramp, const std::vector<double>& shares) {
  std::vector<double> lumas;
  double sums[2] = {}, counts[2] = {};
  for (std::size_t t = 0; t < shares.size(); ++t) {
    const std::array<double, kCount>& parts = ramp.frames[t]->tone[0];
    lumas.push_back(std::accumulate(parts.begin(), parts.end(), 0.0) / kCount);
    if (shares[t] > 0 && shares[t] < 1) continue;
    sums[shares[t] > 0] += lumas.back();
    counts[shares[t] > 0] += 1;
  }
  double bent = 0, bend = 0;
  for (std::size_t t = 0; t < shares.size(); ++t) {
    const double a = shares[t], bow = 4 * a * (1 - a);
    const double expected = (1 - a) * sums[0] / counts[0] + a * sums[1] / counts[1];
    bent += bow * (lumas[t] / std::max(expected, 1.0) - 1);
    bend += bow * bow;
  }
  return bend > 0 ? bent / bend : 0;
}

}  // namespace

FrameParts PartsOf(const FrameDigest& digest, const FrameDetail& detail) {
  FrameParts parts;
  for (std::size_t k = 0; k < kCount; ++k) {
    const int left = static_cast<int>(k) % FrameParts::kAcross * kCellsAcross;
    const int top = static_cast<int>(k) / FrameParts::kAcross * kCellsDown;
    const FrameDigest::Area& a = detail.area;
    const FrameDigest::Area part{std::max(left, a.left), std::max(top, a.top),
                                 std::min(left + kCellsAcross, a.right),
                                 std::min(top + kCellsDown, a.bottom)};
    parts.square[k] = part.IsEmpty() ? 0 : detail.SquareIn(part) / part.size();
    const FrameDigest::Area half{(part.left + 1) / 2, (part.top + 1) / 2, part.right / 2,
                                 part.bottom / 2};
    std::array<int, 3> sums{};
    for (int y = half.top; y < half.bottom; ++y) {
      for (int x = half.left; x < half.right; ++x) {
        const auto at = static_cast<std::size_t>(y * FrameDigest::kHalfColumns + x);
        sums[0] += digest.half[at];
        sums[1] += digest.blue[at];
        sums[2] += digest.red[at];
      }
    }
    for (std::size_t plane = 0; plane < sums.size(); ++plane) {
      parts.tone[plane][k] = half.IsEmpty() ? 0 : static_cast<double>(sums[plane]) / half.size();
    }
  }
  return parts;
}

DipFit FitDip(const Ramp& ramp) {
  const std::vector<double> shares = SharesOf(ramp);
  Pair mixed, straight;
  for (const double a : shares) {
    mixed.Add((1 - a) * (1 - a), a * a);
    straight.Add(1 - a, a);
  }
  double left_mixed = 0, left_straight = 0, deep = 0, expected = 0;
  for (std::size_t k = 0; k < kCount; ++k) {
    double sum = 0, squares = 0, first = 0, second = 0, first_mixed = 0, second_mixed = 0;
    for (std::size_t t = 0; t < shares.size(); ++t) {
      const double a = shares[t], value = ramp.frames[t]->square[k];
      sum += value;
      squares += value * value;
      first += (1 - a) * value;
      second += a * value;
      first_mixed += (1 - a) * (1 - a) * value;
      second_mixed += a * a * value;
    }
    const Pair::Ends ends = mixed.Fit(first_mixed, second_mixed);
    // All parts with detail count alike.
    const double scale = sum / static_cast<double>(shares.size()) + kFaintSquare;
    const double weight = 1 / (scale * scale);
    left_mixed += weight * (squares - ends.explained);
    left_straight += weight * (squares - straight.Fit(first, second).explained);
    const double from = std::max(ends.first, 0.0), to = std::max(ends.second, 0.0);
    for (std::size_t t = 0; t < shares.size(); ++t) {
      const double a = shares[t], dip = a * (1 - a) * (from + to);
      deep += weight * dip * ((1 - a) * from + a * to - ramp.frames[t]->square[k]);
      expected += weight * dip * dip;
    }
  }
  DipFit fit;
  if (left_straight > 0) fit.evidence = 1 - left_mixed / left_straight;
  if (expected > 0) fit.depth = deep / expected;
  return fit;
}

ToneFit FitTone(const Ramp& ramp) {
  const std::vector<double> shares = SharesOf(ramp);
  Pair straight;
  for (const double a : shares) straight.Add(1 - a, a);
  const auto n = static_cast<double>(shares.size());
  double left = 0, all = 0, distance = 0, variances = 0;
  for (std::size_t plane = 0; plane < 3; ++plane) {
    Pair::Ends sums, squares;
    for (std::size_t k = 0; k < kCount; ++k) {
      double sum = 0, square = 0, first = 0, second = 0;
      for (std::size_t t = 0; t < shares.size(); ++t) {
        const double value = ramp.frames[t]->tone[plane][k];
        sum += value;
        square += value * value;
        first += (1 - shares[t]) * value;
        second += shares[t] * value;
      }
      const Pair::Ends ends = straight.Fit(first, second);
      left += square - ends.explained;
      all += square - sum * sum / n;
      distance += (ends.second - ends.first) * (ends.second - ends.first);
      sums.first += ends.first;
      sums.second += ends.second;
      squares.first += ends.first * ends.first;
      squares.second += ends.second * ends.second;
    }
    variances += squares.first - sums.first * sums.first / kCount + squares.second -
                 sums.second * sums.second / kCount;
  }
  // A 255th of each part is as good as nothing.
  return {1 - left / (all + n), distance / (variances + kCount), LightOf(ramp, shares)};
}

}  // namespace calmframe::host
