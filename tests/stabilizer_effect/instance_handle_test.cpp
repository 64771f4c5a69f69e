#include "stabilizer/effect/src/instance_handle.h"

#include <gtest/gtest.h>

#include <cstring>

#include "tests/stabilizer_effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

template <class T>
T WordAt(const std::string& bytes, std::size_t offset) {
  T word;
  std::memcpy(&word, bytes.data() + offset, sizeof word);
  return word;
}

// A handle of the host's with these bytes, as the host-in's instance.
void Restore(StabilizerHost& test, const std::string& bytes) {
  HX_Handle handle = test.host.in.cb->new_handle(bytes.size());
  std::memcpy(test.host.in.cb->lock_handle(handle), bytes.data(), bytes.size());
  test.host.in.cb->unlock_handle(handle);
  test.host.in.instance_handle = handle;
  EXPECT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
}

// Little-endian: version, flags, slot, payload length, and 7 bytes that nobody uses.
std::string FlatHandle(std::uint32_t version, std::uint64_t length, const std::string& payload) {
  std::string bytes(24 + payload.size() + 7, '\0');
  std::memcpy(bytes.data(), &version, 4);
  bytes[4] = 1;
  std::memset(bytes.data() + 8, 0xee, 8);  // a pointer of another process
  std::memcpy(bytes.data() + 16, &length, 8);
  std::memcpy(bytes.data() + 24, payload.data(), payload.size());
  return bytes;
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
  EXPECT_EQ(bytes, FlatHandle(16, 0, "").replace(8, 8, 8, '\0'));
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

TEST(InstanceHandleTest, WhatCannotBeReadBecomesAnEmptyStateAndAMessage) {
  const struct {
    std::string bytes;
    std::string message;
  } cases[] = {
      {FlatHandle(16, 0, ""), ""},
      {FlatHandle(2, 0, ""), "old version"},
      {FlatHandle(17, 0, ""), "newer version"},
      {FlatHandle(16, 4, "????"), "damaged"},
      {FlatHandle(16, std::uint64_t{1} << 40, ""), "damaged"},
      {std::string(10, '\1'), "damaged"},
  };
  for (const auto& c : cases) {
    StabilizerHost test;
    Restore(test, c.bytes);
    ASSERT_NE(test.state(), nullptr);
    EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::PressAnalyze);
    EXPECT_EQ(test.host.ShowsMessage(), !c.message.empty());
    EXPECT_NE(std::string(test.host.out.return_msg).find(c.message), std::string::npos);
  }
  StabilizerHost one_by_one;
  one_by_one.host.in.width = one_by_one.host.in.height = 1;
  Restore(one_by_one, FlatHandle(16, 0, ""));
  EXPECT_EQ(one_by_one.state(), nullptr);
  EXPECT_EQ(one_by_one.Tick(), HX_ERR_NONE);
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
