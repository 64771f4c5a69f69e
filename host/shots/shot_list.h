#pragma once

#include <cstdint>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "host/shots/shot_finder.h"

namespace calmframe::host {

// Frames of a clip between two borders, the end excluded.
struct Shot {
  std::int64_t first = 0, end = 0;
  ShotBorder::Kind begins = ShotBorder::Kind::cut;  // what is at its first frame; of a clip's first
                                                    // shot nothing is, which reads as a cut
  bool operator==(const Shot&) const = default;
};

// Of a clip of that many frames; borders ascend and lie within it.
std::vector<Shot> ShotsBetween(const std::vector<ShotBorder>& borders, std::int64_t frame_count);

// The time code of a frame, counted from 00:00:00:00 on and from that anew after 24 hours: hours,
// minutes, seconds, frames by the whole rate next to `rate`. At 29.97 and 59.94 frames a second two
// and four numbers are left out at each minute but the tenth ones (drop frame; SMPTE 12M), so that
// it follows the clock, and a ; stands before the frames.
std::string TimeCode(std::int64_t frame, media::Ratio rate);
bool DropsFrames(media::Ratio rate);

// A clip's shots, as texts for people and programs. Times are in seconds, rounded to milliseconds,
// and are the clip's own; time codes count frames.
class ShotList {
 public:
  // The clip's name is the last part of its path.
  ShotList(std::vector<Shot> shots, const media::ClipInfo& clip);

  // {"clip", "rate": frames a second, "frames", "shots": [{"first_frame", "end_frame", "start",
  // "end", "begins": "cut", "dissolve" or "fade"}]}
  nlohmann::ordered_json Json() const;
  // A line of names, then a line for each shot; names with commas are quoted (RFC 4180, but for its
  // line ends).
  std::string Csv() const;
  // CMX 3600: an event for each shot, all of them cuts, at the same time codes in source and
  // record. Of more than 999 events the numbers have four digits.
  std::string Edl() const;

 private:
  struct Row {
    Shot shot;
    double start, end;  // seconds
  };
  std::string clip_;
  media::Ratio rate_;
  std::int64_t frames_;
  std::vector<Row> rows_;
};

}  // namespace calmframe::host
