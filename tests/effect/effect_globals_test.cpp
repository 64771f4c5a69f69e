#include "effect/effect_globals.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <boost/weak_ptr.hpp>
#include <string>

#include "effect/entry.h"
#include "effect/host_text.h"
#include "tests/effect/fake_host.h"

namespace kelp::analysis::effect {
class BannerCache {
 public:
  std::string text = "a banner";
};
}  // namespace kelp::analysis::effect

namespace kelp::effect {
namespace {

using analysis::effect::BannerCache;

const char* const kLiterals[] = {
    "$$$/Test/0=Calmframe, v%d.%d#{cr}#{cr}Stabilizes footage without manual tracking.", "",
    "$$$/Test/2=Two{{*COMMENT*}}note", nullptr};
HX_StringTable strings;

class PluginEffect final : public GenericEffect {
 public:
  explicit PluginEffect(const HostContext& context) noexcept : GenericEffect(context) {}
  void ShowAbout() override { ShowAboutText(context()); }
  void StartPlugin() override { OpenPlugin(context(), strings); }
  void StopPlugin() override { ClosePlugin(context()); }
  void ReportOutOfMemory() override {}
  void ReportUnknownException() override {}
  HX_Err AddParam(std::int32_t) override { return HX_ERR_NONE; }
};

class EffectGlobalsTest : public testing::Test {
 protected:
  EffectGlobalsTest() { strings = {4, 4700, kLiterals}; }
  ~EffectGlobalsTest() override { EXPECT_EQ(host_.Leaks(), ""); }

  HX_Err About() { return host_.Call(EffectMain<PluginEffect>, 0); }
  HX_Err Start() { return host_.Call(EffectMain<PluginEffect>, 1); }
  HX_Err Stop() { return host_.Call(EffectMain<PluginEffect>, 3); }
  HostContext Context() { return {27, &host_.in, &host_.out, nullptr, nullptr, nullptr}; }

  FakeHost host_;
};

TEST_F(EffectGlobalsTest, StartTellsTheHostWhatTheEffectIs) {
  ASSERT_EQ(Start(), 0);
  EXPECT_EQ(host_.out.out_flags, 0x1216u);
  EXPECT_EQ(host_.out.out_flags2, 0x20048u);
  EXPECT_EQ(host_.out.version, 0x80600u);
  ASSERT_TRUE(host_.in.global_data);
  EXPECT_EQ(host_.handle_bytes(host_.in.global_data).size(), 40u);
  EXPECT_STREQ(GetString(Context(), 1), "");
  EXPECT_STREQ(GetString(Context(), 2), "Two");
  EXPECT_STREQ(GetString(Context(), 3), "");  // the end mark
  EXPECT_STREQ(GetString(Context(), -1), "");
  EXPECT_EQ(Stop(), 0);
  EXPECT_EQ(Stop(), 0);
}

TEST_F(EffectGlobalsTest, TheHandleStandsInBothRecordsAndGoesFromBoth) {
  host_.out.out_flags = 0x20000000;  // the words are added to what is there
  OpenPlugin(Context(), strings);
  EXPECT_TRUE(host_.in.global_data);
  EXPECT_EQ(host_.out.global_data, host_.in.global_data);
  EXPECT_EQ(host_.out.out_flags, 0x20001216u);
  ClosePlugin(Context());
  EXPECT_FALSE(host_.in.global_data);
  EXPECT_FALSE(host_.out.global_data);
}

TEST_F(EffectGlobalsTest, AStartThatFailsLeavesNothing) {
  const std::pair<const char*, HX_Err> steps[] = {
      {"open_strings", FakeHost::kFault}, {"new_handle", 4}, {"lock_handle", 4}};
  int n = 1;
  for (const auto& [operation, code] : steps) {
    host_.FailOperation(n++);
    host_.ForgetOperations();
    EXPECT_EQ(Start(), code);
    EXPECT_EQ(host_.operations().back().name, operation);
    EXPECT_STREQ(host_.out.return_msg, "Calmframe could not be initialized.");
    EXPECT_TRUE(host_.ShowsMessage());
    EXPECT_FALSE(host_.in.global_data);
    EXPECT_FALSE(host_.out.global_data);
    EXPECT_EQ(host_.Leaks(), "");
  }
  EXPECT_EQ(Start(), 0);  // nothing after these steps can fail
  EXPECT_EQ(Stop(), 0);
}

TEST_F(EffectGlobalsTest, TheCacheLivesUntilTheStopAndBearsMoves) {
  ASSERT_EQ(Start(), 0);
  boost::weak_ptr<BannerCache> cache;
  boost::weak_ptr<std::mutex> lock;
  {
    const GlobalsLock globals(Context());
    ASSERT_TRUE(globals->banner_cache_lock);
    EXPECT_FALSE(globals->banner_cache);
    globals->banner_cache = boost::make_shared<BannerCache>();
    cache = globals->banner_cache;
    lock = globals->banner_cache_lock;
  }
  for (int i = 0; i < 3; ++i) EXPECT_EQ(GlobalsLock(Context())->banner_cache->text, "a banner");
  EXPECT_EQ(cache.use_count(), 1);

  host_.FailOperation(1);
  EXPECT_EQ(Stop(), 3);  // the block can't be reached: all stands
  EXPECT_FALSE(cache.expired());
  EXPECT_TRUE(host_.in.global_data);
  EXPECT_EQ(Stop(), 0);
  EXPECT_TRUE(cache.expired());
  EXPECT_TRUE(lock.expired());
}

TEST_F(EffectGlobalsTest, AboutTextIsFilledInAndCutBetweenCharacters) {
  EXPECT_EQ(About(), 3);  // before the start
  ASSERT_EQ(Start(), 0);
  EXPECT_EQ(About(), 0);
  EXPECT_STREQ(host_.out.return_msg,
               "Calmframe, v1.0\n\nStabilizes footage without manual tracking.");
  EXPECT_FALSE(host_.ShowsMessage());
  EXPECT_EQ(Stop(), 0);

  // 255 bytes hold "1.0", one letter and 62 characters of four bytes, with three bytes to spare;
  // the text is longer than the host's own bound of 512, too.
  std::string text = "%d.%da";
  std::string expected = "1.0a";
  for (int i = 0; i < 200; ++i) text += "\xF0\x9F\x8E\xA5";
  for (int i = 0; i < 62; ++i) expected += "\xF0\x9F\x8E\xA5";
  const char* const literals[] = {text.c_str(), nullptr};
  strings = {2, 4700, literals};
  ASSERT_EQ(Start(), 0);
  EXPECT_EQ(About(), 0);
  EXPECT_EQ(host_.out.return_msg, expected);
  EXPECT_EQ(Stop(), 0);
}

}  // namespace
}  // namespace kelp::effect
