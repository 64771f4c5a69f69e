#include "stabilization/transitions/transition_smoother.h"

#include <utility>

namespace marrow::stabilization {
namespace {

point2 scaled(point2 p, double k) {
  return {k * p.x, k * p.y};
}
point2 quarter_turn(point2 p) {
  return {-p.y, p.x};
}

// How the neighbour `other` contributes to the second difference seen in frame `middle`.
struct neighbour_term {
  point2 rotated;  // R(angle_other - angle) o / scale: the derivative by scale_other
  point2 value;    // rotated * scale_other

  neighbour_term(const frame_unknowns& other, const frame_unknowns& middle, point2 o) {
    const double c = other.c * middle.c + other.s * middle.s;
    const double s = other.s * middle.c - other.c * middle.s;
    rotated = scaled({c * o.x - s * o.y, s * o.x + c * o.y}, 1 / middle.scale);
    value = scaled(rotated, other.scale);
  }
};

// R(-angle) v / scale.
point2 into_frame(const frame_unknowns& frame, point2 v) {
  return scaled({frame.c * v.x + frame.s * v.y, frame.c * v.y - frame.s * v.x}, 1 / frame.scale);
}

point2 translation_difference(const frame_unknowns& before, const frame_unknowns& middle,
                              const frame_unknowns& after) {
  return into_frame(middle,
                    {after.tx + before.tx - 2 * middle.tx, after.ty + before.ty - 2 * middle.ty});
}

}  // namespace

transition_smoother::transition_smoother(std::int64_t frames,
                                         const std::vector<smoothing_track>& tracks,
                                         std::vector<bool> held)
    : tracks_(tracks), held_(std::move(held)) {
  try {
    start_blocks(frames);
    for (const smoothing_track& track : tracks_) {
      for (std::int64_t f = track.first; f < track.end(); ++f) add_block(f, 1);
      for (std::int64_t f = track.first + 1; f + 1 < track.end(); ++f) add_block(f - 1, 3);
    }
    finish_blocks();
  } catch (...) {
    failed = true;
  }
}

void transition_smoother::compute_cost(const double* x, double* f) {
  const std::vector<frame_unknowns> frames = unpack(x);
  for (const smoothing_track& track : tracks_) {
    const frame_unknowns* frame = &frames[static_cast<std::size_t>(track.first)];
    const std::size_t count = track.points.size();
    for (std::size_t i = 0; i < count; ++i) {
      const point2 o = track.points[i];
      const point2 moved = frame[i](o);
      *f++ = track.data_weight[i] * (moved.x - o.x);
      *f++ = track.data_weight[i] * (moved.y - o.y);
    }
    for (std::size_t i = 1; i + 1 < count; ++i) {
      const point2 before = neighbour_term(frame[i - 1], frame[i], track.points[i - 1]).value;
      const point2 after = neighbour_term(frame[i + 1], frame[i], track.points[i + 1]).value;
      const point2 t = translation_difference(frame[i - 1], frame[i], frame[i + 1]);
      const double ws = track.smoothness_weight[i];
      *f++ = ws * (before.x + after.x + t.x - 2 * track.points[i].x);
      *f++ = ws * (before.y + after.y + t.y - 2 * track.points[i].y);
    }
  }
}

void transition_smoother::compute_sparse_jacobian(const double* x, const double*) {
  jacobian_changed();
  const std::vector<frame_unknowns> frames = unpack(x);
  std::size_t index = 0;
  for (const smoothing_track& track : tracks_) {
    const frame_unknowns* frame = &frames[static_cast<std::size_t>(track.first)];
    const std::size_t count = track.points.size();
    for (std::size_t i = 0; i < count; ++i) {
      const double wd = track.data_weight[i];
      const point2 rotated = scaled(frame[i].rotate(track.points[i]), wd);
      set_columns(jacobian(index++), 1, 0, rotated, scaled(quarter_turn(rotated), frame[i].scale),
                  {wd, 0}, {0, wd});
    }
    for (std::size_t i = 1; i + 1 < count; ++i) {
      const double ws = track.smoothness_weight[i];
      const frame_unknowns& middle = frame[i];
      const neighbour_term before(frame[i - 1], middle, track.points[i - 1]);
      const neighbour_term after(frame[i + 1], middle, track.points[i + 1]);
      const point2 t = translation_difference(frame[i - 1], middle, frame[i + 1]);
      // Everything but the sample itself turns and shrinks with the middle frame.
      const point2 whole = {ws * (before.value.x + after.value.x + t.x),
                            ws * (before.value.y + after.value.y + t.y)};
      const point2 tx = scaled(into_frame(middle, {1, 0}), ws);
      const point2 ty = scaled(into_frame(middle, {0, 1}), ws);
      double* columns = jacobian(index++);
      set_columns(columns, 3, 0, scaled(before.rotated, ws), scaled(quarter_turn(before.value), ws),
                  tx, ty);
      set_columns(columns, 3, 1, scaled(whole, -1 / middle.scale), scaled(quarter_turn(whole), -1),
                  scaled(tx, -2), scaled(ty, -2));
      set_columns(columns, 3, 2, scaled(after.rotated, ws), scaled(quarter_turn(after.value), ws),
                  tx, ty);
    }
  }
  if (!held_.empty()) hold(held_);
}

}  // namespace marrow::stabilization
