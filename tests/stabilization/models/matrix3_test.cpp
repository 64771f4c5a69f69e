#include "stabilization/models/matrix3.h"

#include <gtest/gtest.h>

#include <cmath>

namespace marrow::stabilization {
namespace {

void ExpectNear(const matrix3& actual, const matrix3& expected, double tolerance) {
  for (int i = 0; i < 9; ++i) EXPECT_NEAR(actual[i], expected[i], tolerance) << "entry " << i;
}

TEST(SquareToQuadTest, GeneralCorners) {
  const matrix3 m = square_to_quad({10, 20}, {110, 25}, {5, 130}, {120, 118});
  ExpectNear(m, {118.0536292, -5.7235321, 10, 9.1030975, 91.1881646, 20, .1641239, -.1447064, 1},
             1e-7);
  const point2 middle = transform(m, {.5, .5});
  EXPECT_NEAR(middle.x, 65.5288462, 1e-7);
  EXPECT_NEAR(middle.y, 69.4711538, 1e-7);
  const point2 aside = transform(m, {.25, .75});
  EXPECT_NEAR(aside.x, 37.7702033, 1e-7);
  EXPECT_NEAR(aside.y, 97.2297968, 1e-7);
  const point2 corner = transform(m, {1, 1});
  EXPECT_NEAR(corner.x, 120, 1e-9);
  EXPECT_NEAR(corner.y, 118, 1e-9);
}

TEST(SquareToQuadTest, AParallelogramInEitherCoordinateIsAffine) {
  ExpectNear(square_to_quad({0, 0}, {100, 0}, {0, 100}, {100, 110}),
             {100, 0, 0, 0, 110, 0, 0, 0, 1}, 0);
}

TEST(Matrix3Test, InverseUndoesAProjectiveMap) {
  const matrix3 m = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-4, -2e-4, 1};
  ExpectNear(
      multiply(m, inverse(m)),
      [&] {
        const double w = multiply(m, inverse(m))[8];
        return matrix3{w, 0, 0, 0, w, 0, 0, 0, w};
      }(),
      1e-12);
  const point2 there_and_back = transform(inverse(m), transform(m, {640, 360}));
  EXPECT_NEAR(there_and_back.x, 640, 1e-9);
  EXPECT_NEAR(there_and_back.y, 360, 1e-9);
}

TEST(Matrix3Test, SimilarityTurnsTheXAxisTowardsY) {
  const point2 p = transform(similarity_matrix(2.0, std::acos(-1.0) / 2, 3, 4), {1, 0});
  EXPECT_NEAR(p.x, 3, 1e-12);
  EXPECT_NEAR(p.y, 6, 1e-12);
}

}  // namespace
}  // namespace marrow::stabilization
