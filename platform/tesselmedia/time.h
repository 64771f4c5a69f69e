#pragma once

#include <compare>
#include <cstdint>

namespace tesselmedia {

// A time in ticks, of which all usual frame durations are whole numbers.
class TickTime {
 public:
  static constexpr std::int64_t kTicksPerSecond = 705600000;

  TickTime() = default;
  explicit TickTime(std::int64_t ticks) : ticks_(ticks) {}
  std::int64_t ticks() const { return ticks_; }
  auto operator<=>(const TickTime&) const = default;

 private:
  std::int64_t ticks_ = 0;
};

// value / scale seconds.
struct LegacyRatioTime {
  std::int64_t value = 0;
  std::int64_t scale = 1;
};

// To the nearest tick, halves away from zero, limited to what ticks can hold. Throws
// std::domain_error unless the scale is positive.
TickTime ToTickTime(const LegacyRatioTime& time);

// Scales that stood for 24000/1001, 30000/1001 and 60000/1001 frames a second in short: 2398,
// 23976, 2997, 29970, 5994, 59940.
bool IsLegacyTimeScale(std::int64_t scale);

// The same time at 24000, 30000 or 60000, as the nearest multiple of 1001; at any other scale, as
// it is.
LegacyRatioTime CorrectLegacyRatioTimeAtTimeScale(std::int64_t value, std::int64_t scale);

}  // namespace tesselmedia
