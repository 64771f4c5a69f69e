#pragma once

#include <cstdint>

namespace kelp::analysis {

// A time in seconds as a fraction, kept as it was given: not reduced. The denominator is above 0;
// functions throw std::domain_error where it isn't, and std::overflow_error where a result has no
// 64-bit form.
struct RationalTime {
  std::int64_t numerator = 0;
  std::int64_t denominator = 1;
};

// Equal in both parts, where Compare tells equality of value.
inline bool IdenticalTimes(const RationalTime& a, const RationalTime& b) {
  return a.numerator == b.numerator && a.denominator == b.denominator;
}

// Below 0, 0 or above 0 as a is less than, equal to or greater than b, by value. Compares continued
// fractions, so that no product overflows.
int Compare(const RationalTime& a, const RationalTime& b);
// The same for a + a_more and b + b_more.
int CompareSums(const RationalTime& a, const RationalTime& a_more, const RationalTime& b,
                const RationalTime& b_more);

// Reduced results.
RationalTime Reduced(std::int64_t numerator, std::int64_t denominator);
RationalTime operator+(const RationalTime& a, const RationalTime& b);
RationalTime operator*(const RationalTime& time, std::int64_t factor);
RationalTime operator/(const RationalTime& time, std::int64_t divisor);

// How many steps fit into the time, rounded down or up. The step is above 0.
std::int64_t FloorSteps(const RationalTime& time, const RationalTime& step);
std::int64_t CeilSteps(const RationalTime& time, const RationalTime& step);

}  // namespace kelp::analysis
