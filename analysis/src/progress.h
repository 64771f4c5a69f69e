#pragma once

#include <cstdint>
#include <string>

#include "platform/hx/hx_effect.h"

namespace kelp::analysis {

class AnalysisState;

// What the display of an analysis remembers between two looks; ticks of HighPrecisionTime.
struct ProgressClock {
  std::uint64_t start_tick = 0;        // when the analysis began
  std::uint64_t display_tick = 0;      // when the display's cycle began; 0 while none runs
  std::int32_t remaining_seconds = 0;  // the smallest estimate so far; 0 if there is none
};

enum class ProgressKind { Frames, Minute, Minutes, Seconds };

struct ProgressMessage {
  ProgressKind kind = ProgressKind::Frames;
  std::int32_t value = 0;                            // minutes or seconds left
  std::int32_t percent = 0, current = 0, total = 0;  // of Frames
};

// What to show at `now` of a clip of frames [first, end) of which `position` is the one finished
// last. Shows frames for 6 s, then the time left for 3 s, and so on, after the first four frames,
// which guard against an estimate from too little; the time only ever counts down.
ProgressMessage NextProgress(ProgressClock& clock, std::int64_t first, std::int64_t end,
                             std::int64_t position, std::uint64_t now);

// The progress of the state's analyzer, which it must have, in the host's form. Throws the host's
// code.
std::string GetProgressText(AnalysisState& state, HX_InData* host_in, HX_OutData* host_out);

}  // namespace kelp::analysis
