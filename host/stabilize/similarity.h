#pragma once

namespace calmframe::host {

struct Point {
  double x = 0, y = 0;

  bool operator==(const Point&) const = default;
};

// (x, y) -> (a x - b y + dx, b x + a y + dy): scale and angle in a + ib, then a shift in pixels.
struct Similarity {
  double a = 1, b = 0, dx = 0, dy = 0;

  Point operator()(Point p) const { return {a * p.x - b * p.y + dx, b * p.x + a * p.y + dy}; }
};

// `first`, then `then`.
inline Similarity Compose(const Similarity& then, const Similarity& first) {
  const Point shift = then({first.dx, first.dy});
  return {then.a * first.a - then.b * first.b, then.b * first.a + then.a * first.b, shift.x,
          shift.y};
}

// Not finite where a and b are 0.
inline Similarity Inverse(const Similarity& m) {
  const double square = m.a * m.a + m.b * m.b;
  const double a = m.a / square, b = -m.b / square;
  return {a, b, b * m.dy - a * m.dx, -(b * m.dx + a * m.dy)};
}

}  // namespace calmframe::host
