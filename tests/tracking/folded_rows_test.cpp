#include "tracking/folded_rows.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::tracking {
namespace {

TEST(FoldedRowsTest, SegmentsSideBySideAndHalosThatGoOnIntoTheNeighbours) {
  constexpr int kSegments = RowFolding::kSegments;
  std::mt19937 random(3);
  for (const int columns : {1, 15, 16, 17, 33, 100, 256, 257, 1000}) {
    const RowFolding folding{static_cast<std::size_t>(columns)};
    const int positions = folding.positions(), segments = positions * kSegments;
    ASSERT_EQ(positions, (columns + 15) / 16);
    std::vector<std::uint8_t> row(segments + kFoldingSlack);
    for (auto& v : row) v = random() % 256;
    for (const int halo : {0, 1, 4, 40}) {
      tests::OnEachInstructionSet([&] {
        const int room = std::max<int>(halo, kFoldingSlack);
        std::vector<float> folded((positions + halo + room) * kSegments, -1.0f);
        float* first = folded.data() + halo * kSegments;
        FoldRow(row.data(), positions, first);
        FillHalo(first, positions, halo, 1000.0f, 2000.0f);
        for (int p = -halo; p < positions + halo; ++p) {
          for (int segment = 0; segment < kSegments; ++segment) {
            const int column = segment * positions + p;
            const float expected = column < 0           ? 1000.0f
                                   : column >= segments ? 2000.0f
                                                        : static_cast<float>(row[column]);
            ASSERT_EQ(first[p * kSegments + segment], expected)
                << columns << " columns, position " << p << ", segment " << segment;
          }
        }
        for (int x = 0; x < columns; ++x) {
          ASSERT_EQ(first[folding.IndexOf(x)], row[x]);
          ASSERT_EQ(folding.ColumnAt(folding.IndexOf(x)), x);
        }
      });
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
