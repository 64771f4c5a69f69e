#include "analysis/src/rational_time.h"

#include <limits>
#include <stdexcept>

namespace kelp::analysis {
namespace {

__extension__ using Wide = __int128;  // holds the sum of two products of a numerator and a scale

// A fraction with a denominator above 0.
struct WideFraction {
  Wide numerator;
  Wide denominator;
};

Wide FloorDivide(Wide a, Wide b) {
  const Wide quotient = a / b;
  return a % b < 0 ? quotient - 1 : quotient;
}

WideFraction Widen(const RationalTime& time) {
  if (time.denominator <= 0) throw std::domain_error("denominator of a time not above 0");
  return {time.numerator, time.denominator};
}

WideFraction Sum(const RationalTime& a, const RationalTime& b) {
  const WideFraction x = Widen(a), y = Widen(b);
  return {x.numerator * y.denominator + y.numerator * x.denominator, x.denominator * y.denominator};
}

int CompareFractions(WideFraction a, WideFraction b) {
  for (int sign = 1;; sign = -sign) {
    const Wide whole_a = FloorDivide(a.numerator, a.denominator);
    const Wide whole_b = FloorDivide(b.numerator, b.denominator);
    if (whole_a != whole_b) return whole_a < whole_b ? -sign : sign;
    const Wide rest_a = a.numerator - whole_a * a.denominator;
    const Wide rest_b = b.numerator - whole_b * b.denominator;
    if (rest_a == 0 || rest_b == 0) return rest_a == rest_b ? 0 : rest_a == 0 ? -sign : sign;
    // Of two proper fractions the one with the greater reciprocal is the lesser.
    a = {a.denominator, rest_a};
    b = {b.denominator, rest_b};
  }
}

std::int64_t Narrowed(Wide value) {
  if (value < std::numeric_limits<std::int64_t>::min() ||
      value > std::numeric_limits<std::int64_t>::max()) {
    throw std::overflow_error("time out of range");
  }
  return static_cast<std::int64_t>(value);
}

RationalTime ReducedFraction(WideFraction fraction) {
  Wide a = fraction.numerator < 0 ? -fraction.numerator : fraction.numerator;
  Wide b = fraction.denominator;
  while (b != 0) {
    const Wide rest = a % b;
    a = b;
    b = rest;
  }
  return {Narrowed(fraction.numerator / a), Narrowed(fraction.denominator / a)};
}

WideFraction Quotient(const RationalTime& time, const RationalTime& step) {
  const WideFraction a = Widen(time), b = Widen(step);
  if (b.numerator <= 0) throw std::domain_error("step time not above 0");
  return {a.numerator * b.denominator, a.denominator * b.numerator};
}

}  // namespace

int Compare(const RationalTime& a, const RationalTime& b) {
  return CompareFractions(Widen(a), Widen(b));
}

int CompareSums(const RationalTime& a, const RationalTime& a_more, const RationalTime& b,
                const RationalTime& b_more) {
  return CompareFractions(Sum(a, a_more), Sum(b, b_more));
}

RationalTime Reduced(std::int64_t numerator, std::int64_t denominator) {
  return ReducedFraction(Widen({numerator, denominator}));
}

RationalTime operator+(const RationalTime& a, const RationalTime& b) {
  return ReducedFraction(Sum(a, b));
}

RationalTime operator*(const RationalTime& time, std::int64_t factor) {
  const WideFraction fraction = Widen(time);
  return ReducedFraction({fraction.numerator * factor, fraction.denominator});
}

RationalTime operator/(const RationalTime& time, std::int64_t divisor) {
  if (divisor <= 0) throw std::domain_error("divisor of a time not above 0");
  const WideFraction fraction = Widen(time);
  return ReducedFraction({fraction.numerator, fraction.denominator * divisor});
}

std::int64_t FloorSteps(const RationalTime& time, const RationalTime& step) {
  const WideFraction steps = Quotient(time, step);
  return Narrowed(FloorDivide(steps.numerator, steps.denominator));
}

std::int64_t CeilSteps(const RationalTime& time, const RationalTime& step) {
  const WideFraction steps = Quotient(time, step);
  return Narrowed(-FloorDivide(-steps.numerator, steps.denominator));
}

}  // namespace kelp::analysis
