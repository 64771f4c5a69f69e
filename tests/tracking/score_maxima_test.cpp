#include "tracking/score_maxima.h"

#include <gmock/gmock.h>

#include <random>
#include <utility>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tests/tracking/folded_image.h"

namespace marrow::tracking {
namespace {

TEST(FindMaximaTest, StrictOverAllEightNeighboursAndNotUnderTheLeast) {
  std::mt19937 random(9);
  for (const std::size_t count : {3, 4, 15, 16, 17, 18, 31, 32, 33, 60, 200}) {
    std::vector<float> image(3 * count);
    for (float& v : image) v = random() % 12;  // with many ties
    const float least = count % 3 * 4;
    const std::size_t first = count % 2, last = count - 1 - first;
    std::vector<std::pair<std::size_t, float>> expected;
    for (std::size_t x = first + 1; x < last; ++x) {
      int under = 0;
      for (int y = 0; y < 3; ++y) {
        for (int dx = -1; dx <= 1; ++dx) under += image[y * count + x + dx] < image[count + x];
      }
      if (under == 8 && image[count + x] >= least) expected.push_back({x, image[count + x]});
    }
    tests::OnEachInstructionSet([&] {
      FoldedImage rows(image, count);
      std::vector<score_maximum> maxima;
      FindMaxima(rows.Row(0), rows.Row(1), rows.Row(2), rows.folding(), first, last, least, maxima);
      std::vector<std::pair<std::size_t, float>> found;
      for (const auto& m : maxima) found.push_back({m.column, m.score});
      EXPECT_THAT(found, testing::UnorderedElementsAreArray(expected)) << count;
    });
  }
}

}  // namespace
}  // namespace marrow::tracking
