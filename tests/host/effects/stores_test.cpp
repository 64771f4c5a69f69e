#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/handle_store.h"
#include "host/effects/opaque_store.h"
#include "host/effects/world_store.h"

namespace calmframe::host {
namespace {

class StoresTest : public testing::Test {
 protected:
  StoresTest() { Ledger::Get().Reset(); }
};

TEST_F(StoresTest, BlocksMoveWhenTheLastLockGoes) {
  HandleStore handles;
  handles.MoveOnUnlock(true);
  const HX_Handle handle = handles.NewFrom({1, 2, 3});
  void* first = handles.Lock(handle);
  EXPECT_EQ(handles.Lock(handle), first);
  handles.Unlock(handle);
  EXPECT_EQ(std::memcmp(first, "\1\2\3", 3), 0);  // still locked once
  handles.Unlock(handle);
  EXPECT_NE(handles.Lock(handle), first);
  handles.Unlock(handle);
  EXPECT_EQ(handles.BytesOf(handle), (std::vector<std::uint8_t>{1, 2, 3}));
  EXPECT_EQ(handles.Resize(handle, 5), 0);
  EXPECT_EQ(handles.BytesOf(handle), (std::vector<std::uint8_t>{1, 2, 3, 0, 0}));
}

TEST_F(StoresTest, MisuseOfHandlesIsNotedAndHarmless) {
  HandleStore handles;
  const HX_Handle gone = handles.New(8);
  handles.Dispose(gone);
  const HX_Handle other = handles.New(8);
  EXPECT_NE(other, gone);  // never given twice
  EXPECT_EQ(handles.Lock(gone), nullptr);
  handles.Unlock(other);
  handles.Dispose(gone);
  handles.Lock(other);
  EXPECT_NE(handles.Resize(other, 9), 0);
  EXPECT_EQ(handles.locks(), 1u);
  EXPECT_EQ(Ledger::Get().mistakes(),
            (std::vector<std::string>{"lock_handle: unknown handle", "unlock_handle: not locked",
                                      "dispose_handle: unknown handle", "resize_handle: locked"}));
  EXPECT_EQ(handles.New(~std::uint64_t{0}), nullptr);
}

TEST_F(StoresTest, WritingBehindARowIsFoundWhenTheWorldGoes) {
  WorldStore worlds;
  worlds.SetRowPadding(4);
  HX_World world{};
  ASSERT_EQ(worlds.New(3, 2, true, HX_FORMAT_BGRA8, &world), 0);
  EXPECT_EQ(world.row_bytes, 16);
  static_cast<std::uint8_t*>(world.data)[12] = 0;
  HX_World copy = world;
  EXPECT_EQ(worlds.Dispose(&world), 0);
  EXPECT_NE(worlds.Dispose(&copy), 0);
  EXPECT_EQ(Ledger::Get().mistakes().size(), 2u);
  EXPECT_EQ(worlds.New(1, 1, true, 0x12345678, &world), HX_ERR_UNKNOWN);
  EXPECT_EQ(worlds.New(1 << 30, 1 << 30, true, HX_FORMAT_ARGB8, &world), HX_ERR_MEMORY);
  EXPECT_EQ(worlds.count(), 0u);
}

TEST_F(StoresTest, OpaqueDataIsTheFirstOnesUntilNobodyUsesIt) {
  OpaqueStore store;
  int first = 0, second = 0;
  EXPECT_EQ(store.Find(7), nullptr);
  EXPECT_EQ(store.Set(7, &first), &first);
  EXPECT_EQ(store.Set(7, &second), &first);
  EXPECT_EQ(store.Find(7), &first);
  EXPECT_EQ(store.uses(), 3u);
  for (const bool last : {false, false, true}) {
    EXPECT_EQ(store.Peek(7), &first);
    EXPECT_EQ(store.Release(7), last);
  }
  EXPECT_EQ(store.Peek(7), nullptr);
  EXPECT_EQ(Ledger::Get().Report(), "");
  EXPECT_FALSE(store.Release(7));
  EXPECT_EQ(Ledger::Get().mistakes().size(), 1u);
}

}  // namespace
}  // namespace calmframe::host
