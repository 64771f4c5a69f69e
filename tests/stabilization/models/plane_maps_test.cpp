#include <gtest/gtest.h>

#include <cmath>

#include "stabilization/models/inverse_bilinear.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/models/similarity.h"
#include "tests/stabilization/clips.h"

// Matrices, similarities and cells: maps of the plane and their inverses.
namespace marrow::stabilization {
namespace {

TEST(SquareToQuadTest, TakesTheCornersOfTheUnitSquareToTheQuad) {
  const point2 corners[] = {{10, 20}, {110, 25}, {5, 130}, {120, 118}};
  const matrix3 m = square_to_quad(corners[0], corners[1], corners[2], corners[3]);
  for (int k = 0; k < 4; ++k) {
    expect_point_near(transform(m, {k % 2 * 1.0, k / 2 * 1.0}), corners[k], 1e-9);
  }
  expect_point_near(transform(m, {.5, .5}), {65.5288462, 69.4711538}, 1e-7);
  expect_point_near(transform(m, {.25, .75}), {37.7702033, 97.2297968}, 1e-7);
  // A parallelogram in either coordinate is affine.
  expect_matrix_near(square_to_quad({0, 0}, {100, 0}, {0, 100}, {100, 110}),
                     {100, 0, 0, 0, 110, 0, 0, 0, 1}, 0);
}

TEST(Matrix3Test, InverseUndoesAProjectiveMap) {
  const matrix3 m = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-4, -2e-4, 1};
  expect_point_near(transform(inverse(m), transform(m, {640, 360})), {640, 360}, 1e-9);
  expect_point_near(transform(multiply(inverse(m), m), {64, 36}), {64, 36}, 1e-9);
  EXPECT_DOUBLE_EQ(inverse(m)[8], 1);
}

TEST(Matrix3Test, SimilarityTurnsTheXAxisTowardsY) {
  const double quarter = std::acos(-1.0) / 2;
  expect_point_near(transform(similarity_matrix(2.0, quarter, 3, 4), {1, 0}), {3, 6}, 1e-12);
  expect_point_near(transform(similarity{2.0, quarter, 3, 4}, {0, 1}), {1, 4}, 1e-12);
}

TEST(FitSimilarityPairs, FindsTheLeastSquaresMotion) {
  const struct {
    std::vector<point2> source, target;
    similarity expected;
  } cases[] = {
      // Exact: each (x, y) is at 2 (-y, x) + (1, 1).
      {{{900, 500}, {910, 500}, {900, 510}},
       {{-999, 1801}, {-999, 1821}, {-1019, 1801}},
       {2, std::acos(0.0), 1, 1}},
      // Noisy: about the means (5/3, 1) and (-1/3, 2) the products sum to 47/3, those across to 13,
      // the sources' squares to 44/3.
      {{{0, 0}, {4, 0}, {1, 3}},
       {{0, 0}, {3, 2}, {-4, 4}},
       {std::hypot(47, 39) / 44, std::atan2(39, 47), -27 / 22., -6 / 11.}},
      {{{0, 0}, {2, 0}}, {{1, 1}, {1, 5}}, {2, std::acos(0.0), 1, 1}},
      // Too few, or all in one place: the identity.
      {{}, {}, {}},
      {{{3, 4}}, {{9, 9}}, {}},
      {{{1900.1, 1000.3}, {1900.1, 1000.3}}, {{5, 6}, {7, 8}}, {}}};
  for (const auto& e : cases) {
    const similarity fit = fit_similarity_pairs(e.source, e.target);
    EXPECT_NEAR(fit.scale, e.expected.scale, 1e-9) << e.source.size();
    EXPECT_NEAR(fit.angle, e.expected.angle, 1e-9);
    expect_point_near({fit.tx, fit.ty}, {e.expected.tx, e.expected.ty}, 1e-7);
  }
}

TEST(InverseBilinearTest, UndoesTheBilinearMix) {
  const point2 cells[][4] = {{{10, 20}, {42, 21}, {9, 53}, {43, 55}},
                             {{3, 1}, {31, 6}, {-2, 29}, {37, 40}},
                             {{0, 0}, {30, 0}, {0, 30}, {30, 30}}};
  for (const auto& [a, b, c, d] : cells) {
    for (const double x : {0.0, 0.3, 1.0}) {
      for (const double y : {0.0, 0.6, 1.0}) {
        const double w[4] = {(1 - x) * (1 - y), x * (1 - y), (1 - x) * y, x * y};
        const point2 p = {w[0] * a.x + w[1] * b.x + w[2] * c.x + w[3] * d.x,
                          w[0] * a.y + w[1] * b.y + w[2] * c.y + w[3] * d.y};
        expect_point_near(inverse_bilinear(p, a, b, c, d), {x, y}, 1e-12);
      }
    }
  }
  // A cell collapsed to a point leaves both open.
  expect_point_near(inverse_bilinear({5, 5}, {2, 2}, {2, 2}, {2, 2}, {2, 2}), {0, 0}, 0);
}

}  // namespace
}  // namespace marrow::stabilization
