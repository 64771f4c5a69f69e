#include "effect/effect_globals.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <boost/weak_ptr.hpp>
#include <string>

#include "analysis/effect/banner_cache.h"
#include "effect/host_text.h"
#include "tests/support/host_records.h"

namespace kelp::effect {
namespace {

using analysis::effect::BannerCache;
using calmframe::host::kFaultCode;
using calmframe::host::Operations;

class EffectGlobalsTest : public calmframe::host::HostRecords {
 protected:
  EffectGlobalsTest() { in_.global_data = nullptr; }

  // The code that opening with these texts ends in.
  HX_Err Open(std::vector<const char*> literals) {
    literals_ = std::move(literals);
    literals_.push_back(nullptr);
    strings_ = {static_cast<std::uint32_t>(literals_.size()), 4700, literals_.data()};
    return Thrown([this] { OpenPlugin(context_, strings_); });
  }
  calmframe::host::HandleStore& handles() { return hosted_.host().handles(); }

  std::vector<const char*> literals_;
  HX_StringTable strings_{};
};

TEST_F(EffectGlobalsTest, WhatWasOpenedIsToldInBothRecordsAndGoesFromBoth) {
  out_.out_flags = 0x20000000;  // the words are added to what is there
  ASSERT_EQ(Open({"$$$/Test/0=Zero", "", "$$$/Test/2=Two{{*COMMENT*}}note"}), 0);
  EXPECT_EQ(out_.out_flags, 0x20001216u);
  EXPECT_EQ(out_.out_flags2, 0x20048u);
  EXPECT_EQ(out_.version, 0x80600u);
  ASSERT_TRUE(in_.global_data);
  EXPECT_EQ(out_.global_data, in_.global_data);
  EXPECT_EQ(handles().Size(in_.global_data), 40u);
  const char* const texts[] = {"", "Zero", "", "Two", "", ""};  // from -1 on; the end mark's
  for (int i = 0; i < 6; ++i) EXPECT_STREQ(GetString(context_, i - 1), texts[i]) << i;
  ClosePlugin(context_);
  EXPECT_FALSE(in_.global_data);
  EXPECT_FALSE(out_.global_data);
  ClosePlugin(context_);
  EXPECT_THROW(ShowAboutText(context_), std::int32_t);
}

TEST_F(EffectGlobalsTest, AnOpeningThatFailsLeavesNothing) {
  const std::size_t handles_before = handles().count();
  const std::pair<const char*, HX_Err> steps[] = {
      {"open_strings", kFaultCode}, {"new_handle", 4}, {"lock_handle", 4}};
  for (const auto& [operation, code] : steps) {
    Operations::Get().FailNth(1, operation);
    EXPECT_EQ(Open({"text"}), code);
    EXPECT_EQ(TakeMessage(), "Calmframe could not be initialized.");
    EXPECT_FALSE(in_.global_data);
    EXPECT_FALSE(out_.global_data);
    EXPECT_EQ(handles().count(), handles_before) << operation;
  }
}

TEST_F(EffectGlobalsTest, TheCacheLivesUntilTheCloseAndBearsMoves) {
  ASSERT_EQ(Open({"text"}), 0);
  boost::weak_ptr<BannerCache> cache;
  boost::weak_ptr<std::mutex> lock;
  {
    const GlobalsLock globals(context_);
    ASSERT_TRUE(globals->banner_cache_lock);
    EXPECT_FALSE(globals->banner_cache);
    globals->banner_cache = boost::make_shared<BannerCache>();
    cache = globals->banner_cache;
    lock = globals->banner_cache_lock;
  }
  for (int i = 0; i < 3; ++i) EXPECT_EQ(GlobalsLock(context_)->banner_cache, cache.lock());
  EXPECT_EQ(cache.use_count(), 1);

  Operations::Get().FailNth(1);
  EXPECT_THROW(ClosePlugin(context_), std::int32_t);  // can't be reached: all stands
  EXPECT_FALSE(cache.expired());
  EXPECT_TRUE(in_.global_data);
  ClosePlugin(context_);
  EXPECT_TRUE(cache.expired());
  EXPECT_TRUE(lock.expired());
}

// How it is filled in is asked of the plug-in in tests/contract.
TEST_F(EffectGlobalsTest, ALongAboutTextIsCutBetweenCharacters) {
  // 255 bytes hold "1.0", one letter and 62 characters of four bytes, with three bytes to spare;
  // the text is longer than the host's own bound of 512, too.
  std::string text = "%d.%da", expected = "1.0a";
  for (int i = 0; i < 200; ++i) text += "\xF0\x9F\x8E\xA5";
  for (int i = 0; i < 62; ++i) expected += "\xF0\x9F\x8E\xA5";
  ASSERT_EQ(Open({text.c_str()}), 0);
  ShowAboutText(context_);
  EXPECT_EQ(out_.return_msg, expected);
  ClosePlugin(context_);
}

}  // namespace
}  // namespace kelp::effect
