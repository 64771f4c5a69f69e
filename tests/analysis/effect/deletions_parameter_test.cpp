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
  std::vector<Key> flat(3);
  ASSERT_EQ(set.FlatSize(), 24u);
  set.Flatten(flat.data());
  EXPECT_THAT(flat, ElementsAre(5u, 0x6000001f3u, 0x700000003u));
  EXPECT_EQ(DeletedTrackPoints(flat.data(), 24), set);

  EXPECT_TRUE(DeletedTrackPoints().Identity().IsNil());
  EXPECT_EQ(DeletedTrackPoints().FlatSize(), 0u);
  const auto identity = set.Identity();
  set.Add({7, 3});
  EXPECT_EQ(set.Identity(), identity) << "it is there already";
  set.Add({7, 4});
  EXPECT_NE(set.Identity(), identity);
  using marrow::tracking::TrackPoints;
  EXPECT_NE(DeletedTrackPoints(TrackPoints{{1, 2}}).Identity(),
            DeletedTrackPoints(TrackPoints{{2, 1}}).Identity());
}

HX_CustomDataExtra Extra(std::int32_t op, HX_Handle a = nullptr, HX_Handle b = nullptr) {
  return {op, 305, a, b, nullptr, 0, nullptr, 0.5, 99};
}

// The operations through the effect's entry.
class DeletionsParameterTest : public ::testing::Test {
 protected:
  HX_Err Run(HX_CustomDataExtra& extra) { return hosted_.DataOp(extra).code; }
  HX_CustomDataExtra Op(std::int32_t op, HX_Handle a = nullptr, HX_Handle b = nullptr) {
    HX_CustomDataExtra extra = Extra(op, a, b);
    EXPECT_EQ(Run(extra), HX_ERR_NONE) << op;
    return extra;
  }
  HX_Handle Value(std::vector<Key> keys) {
    HX_CustomDataExtra extra = Extra(HX_DATA_UNFLATTEN);
    extra.buffer = keys.data();
    extra.size = static_cast<std::uint32_t>(8 * keys.size());
    EXPECT_EQ(Run(extra), HX_ERR_NONE);
    return extra.out;
  }
  std::vector<Key> KeysOf(HX_Handle value) {
    std::vector<Key> keys(Op(HX_DATA_FLAT_SIZE, value).size / 8);
    HX_CustomDataExtra extra = Extra(HX_DATA_FLATTEN, value);
    extra.buffer = keys.data();
    EXPECT_EQ(Run(extra), HX_ERR_NONE);
    return keys;
  }

  HostedEffect hosted_{calmframe::host::SmallClip(), {.keeps_deletions = true}};
};

TEST_F(DeletionsParameterTest, OperationsOnValues) {
  const HX_Handle empty = Op(HX_DATA_NEW).out;
  EXPECT_EQ(Op(HX_DATA_FLAT_SIZE, empty).size, 0u);
  EXPECT_EQ(Op(HX_DATA_FLATTEN, empty).buffer, nullptr);
  const HX_Handle value = Value({30, 10, 20, 10});
  EXPECT_THAT(KeysOf(value), ElementsAre(10u, 20u, 30u));
  const HX_Handle copy = Op(HX_DATA_COPY, value).out,
                  between = Op(HX_DATA_INTERPOLATE, value, empty).out;
  EXPECT_NE(copy, value);
  EXPECT_THAT(KeysOf(between), ElementsAre(10u, 20u, 30u));
  const HX_Handle greater = Value({10, 21});
  EXPECT_EQ(Op(HX_DATA_COMPARE, value, copy).compare, 0);
  EXPECT_EQ(Op(HX_DATA_COMPARE, value, greater).compare, -1);
  EXPECT_EQ(Op(HX_DATA_COMPARE, greater, value).compare, 1);
  EXPECT_EQ(Op(HX_DATA_COMPARE, value, empty).compare, 1);
  Op(HX_DATA_DISPOSE, value);
  EXPECT_THAT(KeysOf(copy), ElementsAre(10u, 20u, 30u)) << "a set of its own";

  // Other parameters, other operations.
  HX_CustomDataExtra other = Extra(HX_DATA_DISPOSE, copy);
  other.param_id = 304;
  EXPECT_EQ(Run(other), HX_ERR_NONE);
  for (const std::int32_t op : {-1, 8}) EXPECT_EQ(Op(op, copy).out, nullptr);
  Key key = 1;
  HX_CustomDataExtra torn = Extra(HX_DATA_UNFLATTEN);
  torn.buffer = &key;
  torn.size = 7;
  EXPECT_EQ(Run(torn), HX_ERR_UNKNOWN);
  for (const HX_Handle each : {empty, copy, between, greater}) Op(HX_DATA_DISPOSE, each);
}

// Whatever fails, its code comes back, nothing is left behind, and the values are whole.
TEST_F(DeletionsParameterTest, FaultsInEachOperation) {
  const HX_Handle a = Value({1, 2}), b = Value({3});
  Key room[2];
  for (std::int32_t op = HX_DATA_NEW; op <= HX_DATA_COMPARE; ++op) {
    for (int n = 1;; ++n) {
      const HX_Handle operand = op == HX_DATA_DISPOSE ? Op(HX_DATA_COPY, a).out : a;
      HX_CustomDataExtra extra = Extra(op, operand, b);
      extra.buffer = room;
      extra.size = 16;
      Operations::Get().FailNth(n);
      HX_Err code = HX_ERR_NONE;
      const auto names = HostedEffect::OperationsOf([&] { code = Run(extra); });
      Operations::Get().FailNone();
      const bool failed = names.size() >= static_cast<std::size_t>(n);
      if (failed) {
        const bool lock = names.back() == "lock_handle";
        EXPECT_EQ(code, lock ? HX_ERR_HANDLE_LOCK : HX_ERR_MEMORY) << op;
        EXPECT_EQ(extra.out, nullptr);
      } else {
        EXPECT_EQ(code, HX_ERR_NONE);
        if (extra.out) Op(HX_DATA_DISPOSE, extra.out);
      }
      if (op == HX_DATA_DISPOSE && failed) Op(HX_DATA_DISPOSE, operand);
      if (!failed) break;
    }
  }
  HX_CustomDataExtra none = Extra(HX_DATA_COPY);
  EXPECT_EQ(Run(none), HX_ERR_HANDLE_LOCK);
  EXPECT_THAT(KeysOf(a), ElementsAre(1u, 2u));
  Op(HX_DATA_DISPOSE, a);
  Op(HX_DATA_DISPOSE, b);
}

}  // namespace
}  // namespace kelp::analysis::effect
