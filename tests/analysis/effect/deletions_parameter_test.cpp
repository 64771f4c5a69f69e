#include "analysis/effect/deletions_parameter.h"

#include <gmock/gmock.h>

#include <vector>

#include "tests/support/hosted_effect.h"

namespace kelp::analysis::effect {
namespace {

using calmframe::host::HostedEffect;
using calmframe::host::Operations;
using Key = DeletedTrackPoints::Key;
using ::testing::ElementsAre;

TEST(DeletedTrackPointsTest, KeysHaveTheFrameAboveTheSlotAndSortSo) {
  DeletedTrackPoints set(marrow::tracking::TrackPoints{{7, 3}, {6, 499}, {0, 5}});
  EXPECT_THAT(set.keys(), ElementsAre(Key{5}, (Key{6} << 32) + 499, (Key{7} << 32) + 3));
  EXPECT_EQ(DeletedTrackPoints(set.Points()), set);
  EXPECT_TRUE(DeletedTrackPoints().Identity().IsNil());
  const auto identity = set.Identity();
  set.Add({7, 3});
  EXPECT_EQ(set.Identity(), identity) << "it is there already";
  set.Add({7, 4});
  EXPECT_NE(set.Identity(), identity);
  using marrow::tracking::TrackPoints;
  EXPECT_NE(DeletedTrackPoints(TrackPoints{{1, 2}}).Identity(),
            DeletedTrackPoints(TrackPoints{{2, 1}}).Identity());
}

// The operations through the effect's entry.
class DeletionsParameterTest : public ::testing::Test {
 protected:
  HostedEffect hosted_{calmframe::host::SmallClip(), {.keeps_deletions = true}};
};

TEST_F(DeletionsParameterTest, OperationsOnValues) {
  const HX_Handle empty = hosted_.DataOp(HX_DATA_NEW).out;
  EXPECT_EQ(hosted_.DataOp(HX_DATA_FLAT_SIZE, empty).size, 0u);
  EXPECT_EQ(hosted_.DataOp(HX_DATA_FLATTEN, empty).buffer, nullptr);
  const HX_Handle value = hosted_.MakeDeletions({30, 10, 20, 10});
  EXPECT_THAT(hosted_.DeletionsIn(value), ElementsAre(10u, 20u, 30u));
  const HX_Handle copy = hosted_.DataOp(HX_DATA_COPY, value).out,
                  between = hosted_.DataOp(HX_DATA_INTERPOLATE, value, empty).out;
  EXPECT_NE(copy, value);
  EXPECT_THAT(hosted_.DeletionsIn(between), ElementsAre(10u, 20u, 30u));
  const HX_Handle greater = hosted_.MakeDeletions({10, 21});
  EXPECT_EQ(hosted_.DataOp(HX_DATA_COMPARE, value, copy).compare, 0);
  EXPECT_EQ(hosted_.DataOp(HX_DATA_COMPARE, value, greater).compare, -1);
  EXPECT_EQ(hosted_.DataOp(HX_DATA_COMPARE, greater, value).compare, 1);
  EXPECT_EQ(hosted_.DataOp(HX_DATA_COMPARE, value, empty).compare, 1);
  hosted_.DataOp(HX_DATA_DISPOSE, value);
  EXPECT_THAT(hosted_.DeletionsIn(copy), ElementsAre(10u, 20u, 30u)) << "a set of its own";

  // Other parameters, other operations.
  HX_CustomDataExtra other = hosted_.DataExtra(HX_DATA_DISPOSE, copy);
  other.param_id = 304;
  EXPECT_EQ(hosted_.DataOp(other).code, HX_ERR_NONE);
  for (const std::int32_t op : {-1, 8}) EXPECT_EQ(hosted_.DataOp(op, copy).out, nullptr);
  std::vector<Key> one = {1};
  HX_CustomDataExtra torn = hosted_.DataExtra(HX_DATA_UNFLATTEN, nullptr, nullptr, &one);
  torn.size = 7;
  EXPECT_EQ(hosted_.DataOp(torn).code, HX_ERR_UNKNOWN);
  for (const HX_Handle each : {empty, copy, between, greater})
    hosted_.DataOp(HX_DATA_DISPOSE, each);
}

// Whatever fails, its code comes back, nothing is left behind, and the values are whole.
TEST_F(DeletionsParameterTest, FaultsInEachOperation) {
  const HX_Handle a = hosted_.MakeDeletions({1, 2}), b = hosted_.MakeDeletions({3});
  std::vector<Key> room(2);
  for (std::int32_t op = HX_DATA_NEW; op <= HX_DATA_COMPARE; ++op) {
    bool failed = true;
    for (std::size_t n = 1; failed; ++n) {
      const HX_Handle operand = hosted_.DataOp(HX_DATA_COPY, a).out;
      HX_CustomDataExtra extra = hosted_.DataExtra(op, operand, b, &room);
      HX_Err code = HX_ERR_NONE;
      Operations::Get().FailNth(static_cast<std::int64_t>(n));
      const auto names = HostedEffect::OperationsOf([&] { code = hosted_.DataOp(extra).code; });
      Operations::Get().FailNone();
      failed = names.size() >= n;
      if (failed) {
        const bool lock = names.back() == "lock_handle";
        EXPECT_EQ(code, lock ? HX_ERR_HANDLE_LOCK : HX_ERR_MEMORY) << op;
        EXPECT_EQ(extra.out, nullptr);
      } else {
        EXPECT_EQ(code, HX_ERR_NONE);
      }
      if (extra.out) hosted_.DataOp(HX_DATA_DISPOSE, extra.out);
      if (op == HX_DATA_DISPOSE && !failed) continue;
      EXPECT_THAT(hosted_.DeletionsIn(operand), ElementsAre(1u, 2u));
      hosted_.DataOp(HX_DATA_DISPOSE, operand);
    }
  }
  HX_CustomDataExtra none = hosted_.DataExtra(HX_DATA_COPY);
  EXPECT_EQ(hosted_.DataOp(none).code, HX_ERR_HANDLE_LOCK);
  for (const HX_Handle each : {a, b}) hosted_.DataOp(HX_DATA_DISPOSE, each);
}

}  // namespace
}  // namespace kelp::analysis::effect
