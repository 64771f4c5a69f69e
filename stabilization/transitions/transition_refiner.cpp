#include "stabilization/transitions/transition_refiner.h"

namespace marrow::stabilization {
namespace {

// How much more the kink at the start counts than one inside.
constexpr double kJoinFactor = 100.0;
constexpr double kOne[] = {1};
constexpr double kSecondDifference[] = {1, -2, 1};
constexpr double kSecondFrameOfJoin[] = {-2, 1};

}  // namespace

transition_refiner::transition_refiner(const std::vector<double>& frame_weights,
                                       const std::vector<refiner_track>& tracks, double lambda,
                                       double lambda2)
    : tracks_(tracks), lambda_(lambda), join_weight_(lambda2 * kJoinFactor) {
  try {
    frame_weights_ = frame_weights;
    const std::int64_t frames = static_cast<std::int64_t>(frame_weights.size());
    start_blocks(frames);
    for (const refiner_track& track : tracks_) {
      for (std::int64_t f = track.first; f < track.end(); ++f) add_block(f, 1);
      for (std::int64_t f = track.first + 1; f + 1 < track.end(); ++f) add_block(f - 1, 3);
      if (track.continues) {
        add_block(0, 1);
        if (frames > 1) add_block(0, 2);
      }
    }
    finish_blocks();
  } catch (...) {
    failed = true;
  }
}

void transition_refiner::compute_cost(const double* x, double* f) {
  const std::vector<frame_unknowns> frames = unpack(x);
  const auto add = [&f](double weight, point2 residual) {
    *f++ = weight * residual.x;
    *f++ = weight * residual.y;
  };
  for (const refiner_track& track : tracks_) {
    const point2 p = track.point;
    for (std::int64_t g = track.first; g < track.end(); ++g) {
      const point2 moved = frames[static_cast<std::size_t>(g)](p);
      const point2 o = track.observations[static_cast<std::size_t>(g - track.first)];
      add(frame_weights_[static_cast<std::size_t>(g)], {moved.x - o.x, moved.y - o.y});
    }
    for (std::int64_t g = track.first + 1; g + 1 < track.end(); ++g) {
      const frame_unknowns* frame = &frames[static_cast<std::size_t>(g)];
      const point2 before = frame[-1](p);
      const point2 middle = frame[0](p);
      const point2 after = frame[1](p);
      add(lambda_, {before.x + after.x - 2 * middle.x, before.y + after.y - 2 * middle.y});
    }
    if (!track.continues) continue;
    const point2 start = frames[0](p);
    add(join_weight_, {start.x + track.two_before.x - 2 * track.one_before.x,
                       start.y + track.two_before.y - 2 * track.one_before.y});
    if (frames.size() < 2) continue;
    const point2 second = frames[1](p);
    add(join_weight_,
        {second.x + track.one_before.x - 2 * start.x, second.y + track.one_before.y - 2 * start.y});
  }
}

void transition_refiner::add_columns(std::size_t index, const frame_unknowns* frame, int frames,
                                     const double* coefficients, double weight, point2 point) {
  for (int k = 0; k < frames; ++k) {
    const double w = weight * coefficients[k];
    const point2 r = frame[k].rotate(point);
    const double ws = w * frame[k].scale;
    set_columns(jacobian(index), frames, k, {w * r.x, w * r.y}, {-ws * r.y, ws * r.x}, {w, 0},
                {0, w});
  }
}

void transition_refiner::compute_sparse_jacobian(const double* x, const double*) {
  jacobian_changed();
  const std::vector<frame_unknowns> frames = unpack(x);
  std::size_t index = 0;
  for (const refiner_track& track : tracks_) {
    for (std::int64_t g = track.first; g < track.end(); ++g) {
      const std::size_t i = static_cast<std::size_t>(g);
      add_columns(index++, &frames[i], 1, kOne, frame_weights_[i], track.point);
    }
    for (std::int64_t g = track.first + 1; g + 1 < track.end(); ++g) {
      add_columns(index++, &frames[static_cast<std::size_t>(g - 1)], 3, kSecondDifference, lambda_,
                  track.point);
    }
    if (!track.continues) continue;
    add_columns(index++, frames.data(), 1, kOne, join_weight_, track.point);
    if (frames.size() > 1) {
      add_columns(index++, frames.data(), 2, kSecondFrameOfJoin, join_weight_, track.point);
    }
  }
}

}  // namespace marrow::stabilization
