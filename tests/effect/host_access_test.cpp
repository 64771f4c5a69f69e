#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "effect/host_text.h"
#include "effect/param_checkout.h"
#include "effect/suite.h"
#include "effect/world.h"
#include "tests/support/host_records.h"

namespace kelp::effect {
namespace {

using calmframe::host::kFaultCode;
using calmframe::host::Operations;

constexpr char kNoSuite[] = "Not able to acquire OVK Suite.";

using HostAccessTest = calmframe::host::HostRecords;

std::string asked;
HX_Err Refuse(const char* name, std::int32_t version, const void**) {
  asked = std::string(name) + " " + std::to_string(version);
  return 1;
}

template <class Table, std::int32_t... version>
void Ask(const HostContext& context) {
  ScopedSuite<Table> suite(context, version...);
}

// Those of the media are named by the tests of tests/host/timeline.
TEST_F(HostAccessTest, EverySuiteIsThereAndMayBeRefused) {
  const std::pair<void (*)(const HostContext&), const char*> suites[] = {
      {Ask<HX_ParamUtilsSuite3>, "HX Param Utils Suite 3"},
      {Ask<HX_UtilitySuite, 3>, "HX Utility Suite 3"},
      {Ask<HX_UtilitySuite, 4>, "HX Utility Suite 4"},
      {Ask<HX_UtilitySuite, 5>, "HX Utility Suite 5"},
      {Ask<HX_PrivateEffectSuite3>, "HX OV Private Effect Suite 3"},
      {Ask<HX_AppSuite6>, "HX OV App Suite 6"},
      {Ask<HX_AdvAppSuite1>, "HX OV Adv App Suite 1"},
      {Ask<HX_WorldSuite2>, "HX World Suite 2"},
      {Ask<HX_AnalysisHostSuite1>, "Analysis Host Suite 1"},
      {Ask<HX_AnalysisSpanSuite1>, "Analysis Span Suite 1"},
      {Ask<HX_StabilizerHostSuite7>, "Stabilizer Host Suite 7"},
      {Ask<HX_OpaqueEffectDataSuite1>, "Opaque Effect Data Suite 1"},
      {Ask<HX_BlurSuite1>, "FLT Blur Suite 1"}};
  const HX_BasicSuite* const host = in_.basic;
  const HX_BasicSuite refusing = {Refuse, host->release};
  for (const auto& [acquire, name] : suites) {
    in_.basic = host;
    EXPECT_EQ(Thrown([&, acquire = acquire] { acquire(context_); }), 0) << name;
    EXPECT_EQ(TakeMessage(), "");
    in_.basic = &refusing;
    EXPECT_EQ(Thrown([&, acquire = acquire] { acquire(context_); }), 13) << name;
    EXPECT_EQ(asked, name);
    EXPECT_EQ(TakeMessage(), kNoSuite);
  }
  EXPECT_EQ(Thrown([&] { ScopedSuite<HX_WorldSuite2> suite(context_, "No worlds."); }), 13);
  EXPECT_EQ(TakeMessage(), "No worlds.");
}

// Those of a planned frame are asked of whole renders, those of handles of the deleted tracks.
TEST_F(HostAccessTest, RefusalsAreTheHostsCodes) {
  EXPECT_EQ(Thrown([&] { ParamCheckout param(context_, 1000); }), HX_ERR_UNKNOWN);
  char text[8];
  const std::pair<const char*, std::function<void()>> refusals[] = {
      {"checkout_param", [&] { ParamCheckout param(context_, 1); }},
      {"World.NewWorld", [&] { ScopedWorld w(context_, 4, 3, true, HX_FORMAT_ARGBF); }},
      {"Private Effect.ConvertText", [&] { ConvertToHostText(context_, "x", text, sizeof text); }}};
  for (const auto& [operation, body] : refusals) {
    Operations::Get().FailNth(1, operation);
    EXPECT_EQ(Thrown(body), kFaultCode) << operation;
    EXPECT_EQ(Thrown(body), 0) << operation;
  }
}

TEST_F(HostAccessTest, ReportsNameTheFrameAndFailQuietly) {
  ReportOutOfMemoryOnFrame(context_, 12);
  EXPECT_EQ(TakeMessage(), "Calmframe out of memory on frame 12.");
  ReportUnknownExceptionOnFrame(context_, 1234567890123);
  EXPECT_EQ(TakeMessage(), "unknown exception on frame 1234567890123 in Calmframe.");
  Operations::Get().FailNth(1, "acquire HX OV Private Effect Suite");
  ReportOutOfMemoryOnFrame(context_, 12);
  EXPECT_EQ(TakeMessage(), kNoSuite);
  Operations::Get().FailNth(1, "Private Effect.ConvertText");
  ReportUnknownExceptionOnFrame(context_, 12);
  EXPECT_EQ(TakeMessage(), "");
}

TEST_F(HostAccessTest, TextsEndBetweenCharactersWithinTheirRoom) {
  std::string long_text = "a", expected = "a";
  for (int i = 0; i < 200; ++i) long_text += "\xE2\x82\xAC";  // three bytes each
  for (int i = 0; i < 84; ++i) expected += "\xE2\x82\xAC";    // 253 of 255 bytes
  out_.num_params = 77;
  ShowMessage(context_, long_text.c_str());
  EXPECT_EQ(TakeMessage(), expected);
  EXPECT_EQ(out_.num_params, 77);
  ShowMessage(context_, "taken back");
  ClearMessage(context_);
  EXPECT_STREQ(out_.return_msg, "");
  EXPECT_EQ(TakeMessage(), "");

  char name[HX_PARAM_NAME_SIZE + 1];
  name[HX_PARAM_NAME_SIZE] = 'x';
  ConvertToHostText(context_, long_text, name, HX_PARAM_NAME_SIZE);
  EXPECT_EQ(name, expected.substr(0, 31));
  EXPECT_EQ(name[HX_PARAM_NAME_SIZE], 'x');
  ConvertToHostText(context_, "", name, HX_PARAM_NAME_SIZE);
  EXPECT_STREQ(name, "");
}

}  // namespace
}  // namespace kelp::effect
