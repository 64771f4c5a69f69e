#pragma once

#include <optional>
#include <string>

#include "apps/calmframe/flags.h"
#include "host/media/clip.h"

namespace calmframe {

// A point of a clip as a person names it: a frame, or a time. Both count from the clip's first
// frame, whatever its time stamp.
struct Moment {
  std::string text;  // as it was given
  bool is_frame = false;
  double value = 0;  // frames or seconds
};

// What a whole number without a unit stands for.
enum class BareNumber { seconds, frame };

// As the flags of a stretch take it; none of what is no moment.
std::optional<Moment> MomentOf(const std::string& text, BareNumber bare);
// Why a text is no moment, in words; empty of one.
std::string MomentTrouble(const std::string& text, BareNumber bare);
// The first frame that begins to be shown at the moment or later; the clip's end where none does.
std::size_t FrameAt(const Moment& moment, const media::ClipInfo& clip);
// When a frame, or the clip's end, is shown: seconds from the first frame.
double SecondsAt(const media::ClipInfo& clip, std::size_t frame);

// The frames from one moment to another; without any all that there are.
struct Stretch {
  std::optional<Moment> from, to;
  bool is_given() const { return from || to; }
};

// Adds --from and --to. Times are seconds ("12.5", "12s"), "M:SS" or "H:MM:SS", both with a
// fraction where need be; a frame is "300f".
void AddStretchFlags(CLI::App& command, Stretch& stretch, BareNumber bare);

// What can be said without the clip: throws UsageFailure where nothing lies between the moments.
void CheckOrder(const Stretch& stretch);

// The frames that begin to be shown at `from` or later, and before `to`; at least one. A time
// behind the end is the end for `to`. clip: a whole one. Throws UsageFailure.
media::FrameRange FramesOf(const Stretch& stretch, const media::ClipInfo& clip);

// The same for a reader; none where all frames are meant.
media::ClipReader::Part PartFor(const Stretch& stretch);

// "1:05.3": the time of a frame, or of the clip's end, as these flags take it.
std::string TimeText(const media::ClipInfo& clip, std::size_t frame);

}  // namespace calmframe
