#include "platform/tesselmedia/time.h"

#include <limits>
#include <stdexcept>

namespace tesselmedia {
namespace {

__extension__ using Wide = __int128;  // a 64-bit value times a scale

Wide DivideRounded(Wide numerator, Wide denominator) {
  const Wide half = denominator / 2;
  return numerator < 0 ? -((-numerator + half) / denominator) : (numerator + half) / denominator;
}

std::int64_t Limited(Wide value) {
  constexpr Wide kMin = std::numeric_limits<std::int64_t>::min();
  constexpr Wide kMax = std::numeric_limits<std::int64_t>::max();
  return static_cast<std::int64_t>(value < kMin ? kMin : value > kMax ? kMax : value);
}

// 0 for a scale that is none of them.
std::int64_t ScaleMeant(std::int64_t legacy) {
  switch (legacy) {
    case 2398:
    case 23976:
      return 24000;
    case 2997:
    case 29970:
      return 30000;
    case 5994:
    case 59940:
      return 60000;
    default:
      return 0;
  }
}

}  // namespace

TickTime ToTickTime(const LegacyRatioTime& time) {
  if (time.scale <= 0) throw std::domain_error("time scale not above 0");
  return TickTime(Limited(DivideRounded(Wide{time.value} * TickTime::kTicksPerSecond, time.scale)));
}

bool IsLegacyTimeScale(std::int64_t scale) {
  return ScaleMeant(scale) != 0;
}

LegacyRatioTime CorrectLegacyRatioTimeAtTimeScale(std::int64_t value, std::int64_t scale) {
  const std::int64_t meant = ScaleMeant(scale);
  if (meant == 0) return {value, scale};
  constexpr int kUnit = 1001;
  const Wide units = DivideRounded(Wide{value} * meant, Wide{scale} * kUnit);
  return {Limited(units * kUnit), meant};
}

}  // namespace tesselmedia
