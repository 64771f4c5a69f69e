#include "host/stabilize/window/window_path.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>

#include "host/stabilize/window/band_programme.h"

namespace calmframe::host {
namespace {

// A frame's unknowns: the shift, and the motion of the right edge's middle by the scale and by the
// turn; in thousandths of the output's width.
constexpr int kUnknowns = 4;
constexpr int kShiftX = 0, kShiftY = 1, kScale = 2, kTurn = 3;
constexpr double kEdge = 500;
constexpr double kMostTurn = 0.15;  // sine and cosine's ratio, about
constexpr double kInside = 1e-3;    // thousandths of the width that a window keeps to its limits

int IndexOf(std::size_t frame, int unknown) {
  return static_cast<int>(frame) * kUnknowns + unknown;
}

// How a similarity's four unknowns add up to something.
using Terms = std::array<double, kUnknowns>;

class WindowProgramme {
 public:
  WindowProgramme(double width, double height, const std::vector<WindowFrame>& frames)
      : unit_(width / 1000), height_(height / unit_), frames_(frames) {}

  std::vector<Similarity> Solve(const WindowWeights& weights) const {
    const std::vector<double> largest = Largest();
    BandProgramme programme = Limits(&largest);
    for (std::size_t f = 0; f < frames_.size(); ++f) {
      programme.linear[IndexOf(f, kScale)] = -1000 / kEdge * weights.width;
    }
    AddCharges(weights, programme);
    if (weights.growth > 0) AddGrowthCharges(weights.growth, programme);
    std::vector<double> found = host::Solve(programme, Start(largest));
    Keep(programme, largest, found);
    std::vector<Similarity> path(frames_.size());
    for (std::size_t f = 0; f < path.size(); ++f) {
      path[f] = {found[IndexOf(f, kScale)] / kEdge, found[IndexOf(f, kTurn)] / kEdge,
                 found[IndexOf(f, kShiftX)] * unit_, found[IndexOf(f, kShiftY)] * unit_};
    }
    return path;
  }

 private:
  // What holds for each frame alone. `largest`: the windows that no limit of the zoom may exceed;
  // null: it does not count.
  BandProgramme Limits(const std::vector<double>* largest) const {
    BandProgramme programme;
    programme.unknowns = static_cast<int>(frames_.size()) * kUnknowns;
    programme.linear.assign(static_cast<std::size_t>(programme.unknowns), 0.0);
    programme.tether = 1e-9;
    const auto add = [&](std::size_t f, const Terms& terms, double limit) {
      const BandRow row = programme.AddRow(IndexOf(f, 0), kUnknowns);
      std::copy(terms.begin(), terms.end(), programme.Of(row));
      programme.limits.push_back({row, limit - kInside});
    };
    std::size_t limits = 0;
    for (const WindowFrame& frame : frames_) limits += 4 * frame.covered.size() + 3;
    programme.limits.reserve(limits);
    programme.coefficients.reserve(limits * kUnknowns);
    for (std::size_t f = 0; f < frames_.size(); ++f) {
      for (const HalfPlane& side : frames_[f].covered) {
        for (const double x : {-kEdge, kEdge}) {
          for (const double y : {-height_ / 2, height_ / 2}) {
            add(f,
                {side.nx, side.ny, (side.nx * x + side.ny * y) / kEdge,
                 (side.ny * x - side.nx * y) / kEdge},
                side.limit / unit_);
          }
        }
      }
      add(f, {0, 0, 0, 1}, kMostTurn * kEdge);
      add(f, {0, 0, 0, -1}, kMostTurn * kEdge);
      double least = 0;
      if (largest) {
        constexpr double kRoom = 0.9995;
        least = std::min(kEdge / frames_[f].most_zoom, kRoom * (*largest)[IndexOf(f, kScale)]);
      }
      add(f, {0, 0, -1, 0}, -least);
    }
    return programme;
  }

  // The largest window of each frame.
  std::vector<double> Largest() const {
    BandProgramme programme = Limits(nullptr);
    std::vector<double> start(static_cast<std::size_t>(programme.unknowns), 0.0);
    for (std::size_t f = 0; f < frames_.size(); ++f) {
      programme.linear[IndexOf(f, kScale)] = -1;
      start[IndexOf(f, kScale)] = kEdge / 2;
    }
    return host::Solve(programme, std::move(start));
  }

  // Inside all limits: between the largest windows and the smallest.
  std::vector<double> Start(std::vector<double> largest) const {
    for (std::size_t f = 0; f < frames_.size(); ++f) {
      const double least = std::min(kEdge / frames_[f].most_zoom, largest[IndexOf(f, kScale)]);
      double& scale = largest[IndexOf(f, kScale)];
      const double shrunk = (scale + least) / 2 / scale;
      scale *= shrunk;
      largest[IndexOf(f, kTurn)] *= shrunk;
    }
    return largest;
  }

  void AddCharges(const WindowWeights& weights, BandProgramme& programme) const {
    // Binomial coefficients of the differences, first to third.
    constexpr double kDifferences[3][3] = {{1, 0, 0}, {-1, 1, 0}, {1, -2, 1}};
    const double weight_of[] = {weights.motion, weights.change, weights.jerk};
    constexpr std::size_t kRows = 3 * kUnknowns + 2;  // of a frame, with those of its growth
    constexpr std::size_t kCoefficients = ((2 + 3 + 4) * kUnknowns + 2 * 2) * kUnknowns;
    programme.charges.reserve(frames_.size() * kRows);
    programme.coefficients.reserve(programme.coefficients.size() + frames_.size() * kCoefficients);
    for (std::size_t order = 0; order < 3; ++order) {
      if (weight_of[order] <= 0) continue;
      for (std::size_t f = 0; f + order + 1 < frames_.size(); ++f) {
        for (int unknown = 0; unknown < kUnknowns; ++unknown) {
          BandProgramme::Charge charge;
          charge.row = programme.AddRow(IndexOf(f, 0), static_cast<int>(order + 2) * kUnknowns);
          charge.weight = weight_of[order];
          for (std::size_t k = 0; k <= order; ++k) {
            AddMotion(f + k, unknown, kDifferences[order][k],
                      programme.Of(charge.row) + k * kUnknowns, charge.target);
          }
          programme.charges.push_back(charge);
        }
      }
    }
  }

  // By how much the scale of motion[f + 1] window[f + 1] is beyond that of window[f] over the
  // growth that is allowed, upwards and downwards: max(0, z), as (z + |z|) / 2.
  void AddGrowthCharges(double weight, BandProgramme& programme) const {
    for (std::size_t f = 0; f + 1 < frames_.size(); ++f) {
      const WindowFrame& next = frames_[f + 1];
      const auto add = [&](double growth, double sign) {
        if (!(growth > 0 && std::isfinite(growth))) return;
        BandProgramme::Charge charge;
        charge.row = programme.AddRow(IndexOf(f, 0), 2 * kUnknowns);
        double* const coefficients = programme.Of(charge.row);
        coefficients[kScale] = -sign / growth;
        coefficients[kUnknowns + kScale] = sign * next.motion.a;
        coefficients[kUnknowns + kTurn] = -sign * next.motion.b;
        charge.weight = weight / 2;
        programme.charges.push_back(charge);
        for (int i = 0; i < charge.row.count; ++i) {
          programme.linear[static_cast<std::size_t>(charge.row.first + i)] +=
              charge.weight * coefficients[i];
        }
      };
      add(next.least_growth, 1);
      add(next.most_growth, -1);
    }
  }

  // What the output shows of the background's motion from the frame behind `f` to `f`, through the
  // windows of both: motion[f + 1] window[f + 1] - window[f], in the plane. `now`: coefficients of
  // the unknowns of `f`, with those of the next frame behind them.
  void AddMotion(std::size_t f, int unknown, double factor, double* now, double& target) const {
    const Similarity& motion = frames_[f + 1].motion;
    double* const next = now + kUnknowns;
    now[unknown] -= factor;
    next[unknown] += factor * motion.a;
    switch (unknown) {
      case kShiftX:
        next[kShiftY] -= factor * motion.b;
        target -= factor * motion.dx / unit_;
        break;
      case kShiftY:
        next[kShiftX] += factor * motion.b;
        target -= factor * motion.dy / unit_;
        break;
      case kScale:
        next[kTurn] -= factor * motion.b;
        break;
      default:
        next[kScale] += factor * motion.b;
    }
  }

  // Frames that rounding left outside of a limit go towards their largest window, shrunk, as far as
  // it takes: the limits are convex.
  void Keep(const BandProgramme& programme, const std::vector<double>& largest,
            std::vector<double>& found) const {
    const std::vector<double> inside = Start(largest);
    std::vector<double> share(frames_.size(), 0.0);
    for (const BandProgramme::Limit& limit : programme.limits) {
      const double* const coefficients = programme.Of(limit.row);
      double reached = 0, safe = 0;
      for (int i = 0; i < limit.row.count; ++i) {
        const auto k = static_cast<std::size_t>(limit.row.first + i);
        reached += coefficients[i] * found[k];
        safe += coefficients[i] * inside[k];
      }
      const double most = limit.limit + kInside;
      if (reached <= most) continue;
      double& of_frame = share[static_cast<std::size_t>(limit.row.first / kUnknowns)];
      of_frame =
          std::max(of_frame, std::min(1.0, (reached - most) / std::max(reached - safe, 1e-9)));
    }
    for (std::size_t f = 0; f < frames_.size(); ++f) {
      for (int unknown = 0; unknown < kUnknowns; ++unknown) {
        const auto k = static_cast<std::size_t>(IndexOf(f, unknown));
        found[k] += share[f] * (inside[k] - found[k]);
      }
    }
  }

  const double unit_;    // pixels
  const double height_;  // of the output, thousandths of its width
  const std::vector<WindowFrame>& frames_;
};

}  // namespace

std::vector<Similarity> FindWindowPath(double width, double height,
                                       const std::vector<WindowFrame>& frames,
                                       const WindowWeights& weights) {
  if (frames.empty()) return {};
  return WindowProgramme(width, height, frames).Solve(weights);
}

}  // namespace calmframe::host
