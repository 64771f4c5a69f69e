#include "analysis/src/progress.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "analysis/src/analysis_state.h"
#include "effect/host_text.h"
#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

namespace kelp::analysis {
namespace {

using tessel::utility::HighPrecisionTime;

constexpr std::int64_t kFramesBeforeEstimate = 3;
constexpr double kSecondsOfFrames = 6.0;  // in a display cycle, before the time left is shown
constexpr double kSecondsOfCycle = 9.0;
constexpr std::int32_t kSecondsForMinutes = 55;  // from here on the time is told in minutes
constexpr std::int32_t kSecondsTooFew = 3;       // up to here it is not told
constexpr std::size_t kTextSize = 512;           // bound of HX_Callbacks.format

const char* Literal(ProgressKind kind) {
  switch (kind) {
    case ProgressKind::Minute:
      return "$$$/kelp/analysis/progress/time_remaining_minute=Time remaining: %d minute";
    case ProgressKind::Minutes:
      return "$$$/kelp/analysis/progress/time_remaining_minutes=Time remaining: %d minutes";
    case ProgressKind::Seconds:
      return "$$$/kelp/analysis/progress/time_remaining_seconds=Time remaining: %d seconds";
    default:
      return "$$$/kelp/analysis/progress/frame_of_frame=%d%% (frame %d%s of %d)";
  }
}

// Runs the display's cycle; whether the time left is its turn.
bool TimeIsShown(ProgressClock& clock, std::int64_t done, std::uint64_t now) {
  if (done <= kFramesBeforeEstimate) return false;
  if (clock.display_tick == 0) {
    clock.display_tick = now;
    return false;
  }
  const double age = HighPrecisionTime::Seconds(clock.display_tick, now);
  if (age > kSecondsOfCycle) {
    clock.display_tick = 0;
    return false;
  }
  return age > kSecondsOfFrames;
}

std::int32_t Limited(std::int64_t value) {
  return static_cast<std::int32_t>(
      std::clamp<std::int64_t>(value, 0, std::numeric_limits<std::int32_t>::max()));
}

}  // namespace

ProgressMessage NextProgress(ProgressClock& clock, std::int64_t first, std::int64_t end,
                             std::int64_t position, std::uint64_t now) {
  const std::int64_t total = end - first;
  // A job that is gone says time 0, which may lie before the clip.
  const std::int64_t current = std::min(total, std::max(position, first) - first + 1);
  const std::int64_t done = current - 1;

  ProgressMessage message;
  message.percent = total == 0 ? 0 : Limited(done * 100 / total);
  message.current = Limited(current);
  message.total = Limited(total);
  if (!TimeIsShown(clock, done, now)) return message;

  const double elapsed = HighPrecisionTime::Seconds(clock.start_tick, now);
  const double estimate =
      std::ceil(static_cast<double>(total - done) * (elapsed / static_cast<double>(done)));
  const std::int32_t seconds =
      static_cast<std::int32_t>(std::clamp(estimate, 0.0, double{1 << 30}));
  if (clock.remaining_seconds == 0 || seconds < clock.remaining_seconds) {
    clock.remaining_seconds = seconds;
  }
  const auto minutes = static_cast<std::int32_t>(clock.remaining_seconds / 60.0 + 0.5);
  if (clock.remaining_seconds >= kSecondsForMinutes && minutes != 0) {
    message.kind = minutes == 1 ? ProgressKind::Minute : ProgressKind::Minutes;
    message.value = minutes;
  } else if (clock.remaining_seconds > kSecondsTooFew) {
    message.kind = ProgressKind::Seconds;
    message.value = clock.remaining_seconds;
  }
  return message;
}

std::string GetProgressText(AnalysisState& state, HX_InData* host_in, HX_OutData* host_out) {
  Analyzer& analyzer = *state.analyzer;
  RationalTime time;
  if (analyzer.job_stage() != JobStage::NotStarted) time = analyzer.GetStatus().time;
  const std::int64_t position = FloorSteps(time, analyzer.record().job_input_parameters.StepTime);
  const ProgressMessage message =
      NextProgress(state.progress, analyzer.FirstFrame(), analyzer.EndFrame(), position,
                   HighPrecisionTime::Now());

  char format[effect::kHostTextSize];
  effect::ConvertToHostText(effect::RecordsOnly(host_in, host_out),
                            tessel::config::Localizer::LocalizeUTF16(Literal(message.kind)),
                            format);
  char text[kTextSize];
  if (message.kind == ProgressKind::Frames) {
    const char* const no_suffix = "";
    host_in->cb->format(text, format, message.percent, message.current, no_suffix, message.total);
  } else {
    host_in->cb->format(text, format, message.value);
  }
  return text;
}

}  // namespace kelp::analysis
