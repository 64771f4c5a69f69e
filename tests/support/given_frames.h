#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "host/stabilize/solved_clip.h"

namespace calmframe::host {

// Frames of a clip as a test has them: by frame, then as SolvedFrames tells.
struct GivenFrames final : SolvedFrames {
  std::vector<Point> vertices, tracks;
  std::vector<std::int32_t> statuses;
  std::size_t frame_count = 0;

  // Puts such frames into a clip that has its counts, with all that it has of its own.
  static GivenFrames& In(SolvedClip& clip) {
    const auto given = std::make_shared<GivenFrames>();
    given->frame_count = static_cast<std::size_t>(clip.frame_count);
    for (std::size_t f = 0; clip.frames && f < given->frame_count; ++f) {
      Append(clip.VerticesOf(f), given->vertices);
      const TrackRow row = clip.TracksOf(f);
      Append(row.places, given->tracks);
      Append(row.statuses, given->statuses);
    }
    clip.frames = given;
    return *given;
  }
  // Of any clip.
  static GivenFrames Of(SolvedClip clip) { return In(clip); }

  void ReadVertices(std::size_t frame, std::vector<Point>& of_frame) const override {
    of_frame = Part(vertices, frame);
  }
  void ReadTracks(std::size_t frame, TrackRow& row) const override {
    row = {Part(tracks, frame), Part(statuses, frame)};
  }

 private:
  template <class Value>
  static void Append(const std::vector<Value>& more, std::vector<Value>& to) {
    to.insert(to.end(), more.begin(), more.end());
  }
  template <class Value>
  std::vector<Value> Part(const std::vector<Value>& all, std::size_t frame) const {
    const auto size = static_cast<std::ptrdiff_t>(all.size() / frame_count);
    const auto first = all.begin() + static_cast<std::ptrdiff_t>(frame) * size;
    return {first, first + size};
  }
};

}  // namespace calmframe::host
