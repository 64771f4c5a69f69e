#include "stabilizer/effect/src/instance_handle.h"

#include <gtest/gtest.h>

#include <cstring>

#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

template <class T>
T WordAt(const std::string& bytes, std::size_t offset) {
  T word;
  std::memcpy(&word, bytes.data() + offset, sizeof word);
  return word;
}

TEST(InstanceHandleTest, LayoutLiveAndFlattened) {
  StabilizerHost test;
  ASSERT_EQ(test.Call(HX_CMD_CREATE_INSTANCE), HX_ERR_NONE);
  std::string bytes = test.host.handle_bytes(test.host.in.instance_handle);
  ASSERT_EQ(bytes.size(), 32u);
  EXPECT_EQ(WordAt<std::uint32_t>(bytes, 0), 16u);
  EXPECT_EQ(WordAt<std::uint16_t>(bytes, 4), 0u);
  EXPECT_EQ(WordAt<StabilizerState*>(bytes, 8), test.state());
  EXPECT_EQ(WordAt<std::uint64_t>(bytes, 16), 1u);

  ASSERT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
  bytes = test.host.handle_bytes(test.host.in.instance_handle);
  EXPECT_EQ(WordAt<std::uint32_t>(bytes, 0), 16u);
  EXPECT_EQ(WordAt<std::uint16_t>(bytes, 4), 1u) << "flattened, not raw";
  EXPECT_EQ(WordAt<std::uint64_t>(bytes, 8), 0u);
  EXPECT_EQ(WordAt<std::uint64_t>(bytes, 16), bytes.size() - 31);
  EXPECT_EQ(test.opaque_uses, 0) << "a flattened instance shares nothing";
  EXPECT_EQ(test.state(), nullptr);
  // Neither a tick nor a second flattening finds anything to do.
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
  EXPECT_EQ(test.host.handle_bytes(test.host.in.instance_handle), bytes);

  ASSERT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  ASSERT_NE(test.state(), nullptr);
  EXPECT_FALSE(test.state()->keep_jobs);
  EXPECT_EQ(test.opaque_uses, 1);
  const StabilizerState* const live = test.state();
  ASSERT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  EXPECT_EQ(test.state(), live) << "a live handle stays as it is";
}

TEST(InstanceHandleTest, ASaveThatFailsLeavesTheInstanceLive) {
  StabilizerHost test;
  const StabilizerState* const live = &test.Analysed(ShakenTable(20, 40));
  for (int n = 1; n < 100; ++n) {
    test.host.FailOperation(n);
    const HX_Err code = test.Call(HX_CMD_FLATTEN_INSTANCE);
    test.host.FailOperation(0);
    if (code == HX_ERR_NONE) {
      EXPECT_EQ(test.state(), nullptr);
      EXPECT_GT(n, 5);
      return;
    }
    EXPECT_EQ(test.state(), live) << n;
    EXPECT_EQ(test.opaque_uses, 1) << n;
    EXPECT_TRUE(live->shared) << n;
  }
  FAIL() << "no end of host calls";
}

}  // namespace
}  // namespace kelp::effect
