#include "host/stabilize/path_correction.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

constexpr std::size_t kParabola = 18;    // frames of a parabola, to either side of its middle
constexpr std::size_t kShortest = 12;    // frames of a path that has one
constexpr std::size_t kFewestPaths = 8;  // paths that tell of a frame
constexpr int kCorrections = 3;          // each by what the one before has left

// Least squares through values at 0, 1, ... count - 1, by polynomials that are orthogonal there.
class Parabola {
 public:
  explicit Parabola(std::size_t count) {
    const auto n = static_cast<double>(count);
    middle_ = (n - 1) / 2;
    mean_square_ = (n * n - 1) / 12;
    squares_ = {n, n * mean_square_, n * (n * n - 1) * (n * n - 4) / 180};
  }

  void Add(std::size_t at, const Point& value) {
    const std::array<double, 3> terms = TermsAt(at);
    for (std::size_t i = 0; i < terms.size(); ++i) {
      sums_[i].x += terms[i] * value.x;
      sums_[i].y += terms[i] * value.y;
    }
  }
  Point At(std::size_t at) const {
    const std::array<double, 3> terms = TermsAt(at);
    Point value;
    for (std::size_t i = 0; i < terms.size(); ++i) {
      value.x += terms[i] / squares_[i] * sums_[i].x;
      value.y += terms[i] / squares_[i] * sums_[i].y;
    }
    return value;
  }
  // How much of a value goes into the parabola's own there.
  double ShareAt(std::size_t at) const {
    const std::array<double, 3> terms = TermsAt(at);
    double share = 0;
    for (std::size_t i = 0; i < terms.size(); ++i) share += terms[i] * terms[i] / squares_[i];
    return share;
  }

 private:
  std::array<double, 3> TermsAt(std::size_t at) const {
    const double t = static_cast<double>(at) - middle_;
    return {1, t, t * t - mean_square_};
  }

  double middle_, mean_square_;
  std::array<double, 3> squares_;  // of the polynomials, summed
  std::array<Point, 3> sums_{};
};

// What takes a frame's points to where the parabolas of its paths have them.
Similarity CorrectionOf(std::size_t frame, const std::vector<const TrackPath*>& paths,
                        double tolerance, const std::vector<Similarity>& motions) {
  if (paths.size() < kFewestPaths) return {};
  const std::size_t first = frame - std::min(frame, 2 * kParabola);
  const std::size_t last = std::min(motions.size() - 1, frame + 2 * kParabola);
  std::vector<Similarity> to_frame(last - first + 1);
  for (std::size_t f = frame; f < last; ++f) {
    to_frame[f + 1 - first] = Compose(to_frame[f - first], motions[f + 1]);
  }
  for (std::size_t f = frame; f > first; --f) {
    to_frame[f - 1 - first] = Compose(to_frame[f - first], Inverse(motions[f]));
  }
  std::vector<Point> from, to;
  std::vector<double> shares;
  for (const TrackPath* path : paths) {
    const std::size_t end = path->first + path->points.size();
    // As many frames as there are, also where the path begins or ends near by.
    std::size_t begin = std::max(path->first, frame - std::min(frame, kParabola));
    const std::size_t stop = std::min(end, begin + 2 * kParabola + 1);
    begin = std::max(path->first, stop - std::min(stop, 2 * kParabola + 1));
    const Point& here = path->points[frame - path->first];
    Parabola parabola(stop - begin);  // about where it is: of what stands still it is 0 exactly
    for (std::size_t f = begin; f < stop; ++f) {
      const Point there = to_frame[f - first](path->points[f - path->first]);
      parabola.Add(f - begin, {there.x - here.x, there.y - here.y});
    }
    const Point off = parabola.At(frame - begin);
    from.push_back(here);
    to.push_back({here.x + off.x, here.y + off.y});
    shares.push_back(1 - parabola.ShareAt(frame - begin));
  }
  return RefitMotion({}, from, to, shares, tolerance);
}

}  // namespace

void CorrectByPaths(const std::vector<TrackPath>& paths, double tolerance,
                    std::vector<Similarity>& motions) {
  // Where none is whole, parabolas take in what they are to tell apart.
  if (motions.size() <= 2 * kParabola) return;
  // A stretch of frames after the other, so that no more than its paths are listed at a time.
  constexpr std::size_t kStretch = 4096;
  for (int round = 0; round < kCorrections; ++round) {
    std::vector<Similarity> corrections(motions.size());
    for (std::size_t first = 0; first < motions.size(); first += kStretch) {
      std::vector<std::vector<const TrackPath*>> of_frames(
          std::min(kStretch, motions.size() - first));
      for (const TrackPath& path : paths) {
        if (path.points.size() < kShortest) continue;
        const std::size_t end = std::min(path.first + path.points.size(), first + of_frames.size());
        for (std::size_t f = std::max(path.first, first); f < end; ++f) {
          of_frames[f - first].push_back(&path);
        }
      }
      tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
          [&](std::size_t i) {
            corrections[first + i] = CorrectionOf(first + i, of_frames[i], tolerance, motions);
          },
          of_frames.size());
    }
    for (std::size_t f = motions.size(); f-- > 1;) {
      motions[f] = Compose(Inverse(corrections[f - 1]), Compose(motions[f], corrections[f]));
    }
  }
}

}  // namespace calmframe::host
