#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

#include "synthetic/frame_source.h"
#include "tracking/tracking_run.h"

// The whole tracking loop on frames of a known world: where its tracks are, against where they
// should be.
namespace marrow::tracking {
namespace {

using synthetic::point2;

struct tracked_scene {
  tracked_scene(std::vector<synthetic::surface> surfaces, synthetic::camera_path path,
                const synthetic::scene_options& options)
      : world(std::move(surfaces), std::move(path), options) {
    SelectorParams selector;
    selector.max_count = 120;
    selector.spacing = 12;
    selector.half_winx = selector.half_winy = 7;
    selector.threshold = 0.01f;
    TrackerParams tracker;
    tracker.kill_tracks_shorter_than = 5;
    synthetic::scene_frame_source source(world);
    TrackFrames(source, selector, tracker, table);
    tracks = BuildTrajectories(table.features->data(), table.feature_count, table.frame_count);
  }

  const tracking_feature<float>& cell(int frame, int slot) const {
    return (*table.features)[frame * table.feature_count + slot];
  }
  std::optional<point2> truth(const Trajectory& track, int frame) const {
    const auto& seed = cell(track.first, track.feature);
    return world.locate(track.first, {seed.x, seed.y}, frame);
  }
  double error(const Trajectory& track, int frame, point2 right) const {
    const auto& found = cell(frame, track.feature);
    return std::hypot(found.x - right.x, found.y - right.y);
  }
  // Of all tracks, every fifth frame and the last, where the world tells a place.
  std::vector<double> errors() const {
    std::vector<double> all;
    for (const Trajectory& track : tracks) {
      for (int f = track.first + 1; f < track.last; ++f) {
        if (f % 5 != 0 && f + 1 != track.last) continue;
        if (const auto right = truth(track, f)) all.push_back(error(track, f, *right));
      }
    }
    std::sort(all.begin(), all.end());
    return all;
  }
  int alive(int frame) const {
    int count = 0;
    for (int s = 0; s < table.feature_count; ++s) count += cell(frame, s).status >= 0;
    return count;
  }

  synthetic::scene world;
  AllFeatures table;
  std::vector<Trajectory> tracks;
};

TEST(TrackedSceneTest, X) {
  for (int k = 0; k < 4; ++k) {
  synthetic::scene_options o{.width = 480, .height = 270, .frame_count = 100, .noise = 1};
  if (k & 1) o.gain = 0.15, o.bias = 8;
  if (k & 2) o.occluder = true;
  const tracked_scene t(k & 2 ? synthetic::street(2) : synthetic::street(1), synthetic::handheld_path({}), o);
  const auto e = t.errors();
  double length = 0;
  for (auto& x : t.tracks) length += x.last - x.first;
  printf("k %d tracks %zu length %.1f n %zu median %.3f p90 %.3f p99 %.3f max %.3f\n", k, t.tracks.size(), length / t.tracks.size(), e.size(), e[e.size()/2], e[e.size()*9/10], e[e.size()*99/100], e.back());
  for (int f = 0; f < 100; f += 10) printf(" %d", t.alive(f));
  int hidden = 0; std::vector<int> runs;
  for (const Trajectory& track : t.tracks) {
    int run = 0;
    if (!t.world.locate(track.first, {t.cell(track.first, track.feature).x, t.cell(track.first, track.feature).y}, track.first)) continue;
    for (int f = track.first + 1; f < track.last; ++f) if (!t.truth(track, f)) ++run, ++hidden; else if (run) { runs.push_back(run); run = 0; }
    if (run) runs.push_back(run);
  }
  std::sort(runs.begin(), runs.end());
  printf("\nhidden cells %d runs %zu max", hidden, runs.size()); for (size_t i = runs.size() > 10 ? runs.size() - 10 : 0; i < runs.size(); ++i) printf(" %d", runs[i]); printf("\n");
  }
}

}  // namespace
}  // namespace marrow::tracking
