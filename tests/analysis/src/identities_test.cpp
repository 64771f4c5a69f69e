#include "analysis/src/identities.h"

#include <gmock/gmock.h>

#include <set>
#include <string>
#include <vector>

#include "platform/tessel/debug.h"
#include "tests/analysis/src/fake_host.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::SelectorParams;
using marrow::tracking::TrackerParams;
using tessel::utility::Guid;

JobInput FilledInput() {
  JobInput input;
  input.ProjectPath = u"C:/\u00e4";
  input.SourceID = Guid::FromText("00112233-4455-6677-8899-aabbccddeeff");
  input.FieldType = 1;
  input.StartTime = {1001, 3000};
  input.Duration = {1001, 100};
  input.StepTime = {1001, 30000};
  return input;
}

// Values from a second implementation, over the pieces in the order and width that projects rely
// on.
TEST(Identities, StayWhatStoredProjectsHold) {
  EXPECT_EQ(GetIdentifierForJobInput({}).ToText(), "ca840c8a-c49f-3b78-c14d-b6654309fd59");
  EXPECT_EQ(GetIdentifierForJobInput(FilledInput()).ToText(),
            "4141e4ec-be25-9d3a-3e2c-d22b665f0fbc");
  EXPECT_EQ(GetIdentifierForTracker({}, {}).ToText(), "ac7481f8-0dae-57cf-c70e-e3b47f932cf8");
}

TEST(Identities, EveryFieldCounts) {
  std::set<Guid> seen = {GetIdentifierForJobInput(FilledInput())};
  std::size_t changes = 1;
  const auto with = [&](auto change) {
    JobInput input = FilledInput();
    change(input);
    seen.insert(GetIdentifierForJobInput(input));
    EXPECT_EQ(seen.size(), ++changes);
  };
  with([](JobInput& i) { i.ProjectPath += u"b"; });
  with([](JobInput& i) { i.SourceID = {}; });
  with([](JobInput& i) { i.FieldType = 2; });
  with([](JobInput& i) { i.StartTime = {2002, 6000}; });  // as stored, not by value
  with([](JobInput& i) { i.Duration.numerator = 1; });
  with([](JobInput& i) { i.StepTime.denominator = 25; });

  const auto with_records = [&](auto change) {
    SelectorParams selector;
    TrackerParams tracker;
    change(selector, tracker);
    seen.insert(GetIdentifierForTracker(selector, tracker));
    EXPECT_EQ(seen.size(), ++changes);
  };
  with_records([](auto&, auto&) {});
  with_records([](auto& s, auto&) { s.max_count = 501; });
  with_records([](auto& s, auto&) { s.half_winy = 6; });
  with_records([](auto& s, auto&) { s.presmoothing = false; });
  with_records([](auto& s, auto&) { s.eig_ratio_threshold = 14; });
  with_records([](auto&, auto& t) { t.half_win_y = 8; });
  with_records([](auto&, auto& t) { t.color_correction_affine = 3; });
  with_records([](auto&, auto& t) { t.tolerance_affine = 0.05f; });  // not the 0.05 of 64 bits
  with_records([](auto&, auto& t) { t.affine_verification = false; });
  with_records([](auto&, auto& t) { t.kill_tracks_shorter_than = 1; });
}

TEST(Identities, TheirMakingIsTracedWhileTheChannelIsOn) {
  std::vector<std::string> lines;
  tessel::debug::SetSink(
      [&](const std::string& line) { lines.push_back(line.substr(line.find("> <") + 2)); });
  const auto made = [&] {
    lines.clear();
    GetIdentifierForJobInput(FilledInput());
    return lines.size();
  };
  EXPECT_EQ(made(), 0u);
  tessel::debug::DebugDatabase::Set("Trace.MixHashGuid", 6);
  EXPECT_EQ(made(), 8u);
  EXPECT_EQ(lines.front(), "<MixHashGuid> <6> Start Level 'Analyzer::GetIdentifierForJobInput\n");
  EXPECT_THAT(lines[1], ::testing::StartsWith("<MixHashGuid> <6> Added 8 bytes, now: "));
  EXPECT_EQ(lines[6],
            "<MixHashGuid> <6> Added 76 bytes, now: 4141e4ec-be25-9d3a-3e2c-d22b665f0fbc\n");
  EXPECT_EQ(lines.back(), "<MixHashGuid> <6> End level\n");
  tessel::debug::DebugDatabase::Set("Trace.MixHashGuid", 5);
  EXPECT_EQ(made(), 0u);
  tessel::debug::SetSink({});
}

constexpr char kMedia[] = "0a000000-0000-0000-0000-000000000001";
constexpr char kBlur[] = "0b000000-0000-0000-0000-000000000002";
constexpr char kKey[] = "EffectNode::RuntimeInstanceID";

class UpstreamIdentifierTest : public ::testing::Test {
 protected:
  int Effect(const std::string& id, const std::string& text) {
    return host_.AddNode({"", text, {{kKey, id}}, {}, {}});
  }
  std::string Identifier() { return GetUpstreamIdentifier(&host_.in, &host_.out).ToText(); }
  FakeHost host_;
};

TEST_F(UpstreamIdentifierTest, ReadsTheNodeUnderTheLayersMiddle) {
  host_.start = 10;
  host_.count = 25;
  host_.top = host_.AddPlainClip(kMedia);
  EXPECT_EQ(Identifier(), "eab1ec96-ef49-2469-ab82-2a50d59cb93e");
  EXPECT_EQ(host_.asked_ticks, 22 * 28224000 + 28224000 / 2);
  host_.top = -1;
  EXPECT_EQ(Identifier(), Guid().ToText());
}

TEST_F(UpstreamIdentifierTest, TakesWhatIsBeneathTheEffectAndNothingAbove) {
  const int media = host_.AddNode({kMedia, "", {}, {}, {}});
  const int blur = Effect("5", kBlur), self = Effect("77", "x"), above = Effect("6", "anything");
  // On one node: blur acts first, then this effect, then the other.
  host_.top = host_.AddNode({"", "", {}, {blur, self, above}, {media}});
  EXPECT_EQ(Identifier(), "9b4a9cf3-c8b7-513d-59b5-a8658893399b");
  host_.nodes[above].text = "something else";
  EXPECT_EQ(Identifier(), "9b4a9cf3-c8b7-513d-59b5-a8658893399b");
  host_.nodes[blur].text = "0b000000-0000-0000-0000-000000000003";
  EXPECT_NE(Identifier(), "9b4a9cf3-c8b7-513d-59b5-a8658893399b");

  // On nodes of their own: the input's identity stands for all beneath.
  const int blurred = host_.AddNode({kMedia, "", {}, {blur}, {media}});
  const int own = host_.AddNode({"", "", {}, {self}, {blurred}});
  host_.top = host_.AddNode({"", "", {}, {above}, {own}});
  EXPECT_EQ(Identifier(), "eab1ec96-ef49-2469-ab82-2a50d59cb93e");
  host_.nodes[blurred].guid = kBlur;
  EXPECT_NE(Identifier(), "eab1ec96-ef49-2469-ab82-2a50d59cb93e");
  // Another effect with an id that is no number is not this one.
  host_.nodes[above].properties[kKey] = "77 or so";
  EXPECT_NE(Identifier(), Guid().ToText());
  host_.nodes[self].properties.clear();
  EXPECT_EQ(Identifier(), Guid().ToText());
}

TEST_F(UpstreamIdentifierTest, HandsOnTheHostsFailuresAndBearsAGraphInACircle) {
  host_.top = host_.AddPlainClip(kMedia);
  for (const char* operation : {"AcquireSegments", "GetStartFrame", "GetRuntimeInstanceID",
                                "GetOperatorCount", "GetOperator", "GetInput", "GetNodeGuid"}) {
    host_.failing = {{operation, 1234}};
    EXPECT_THROW(Identifier(), std::int32_t) << operation;
  }
  host_.failing.clear();
  host_.missing = {"Rushbase Video Segment Suite"};
  EXPECT_THROW(Identifier(), std::int32_t);
  EXPECT_STREQ(host_.out.return_msg, "Not able to acquire OVK Suite.");
  EXPECT_EQ(host_.out.out_flags, 0x100u);
  host_.missing.clear();
  host_.runtime_id = 1;
  host_.nodes[host_.top].inputs = {host_.top};
  EXPECT_THROW(Identifier(), std::int32_t);
}

}  // namespace
}  // namespace kelp::analysis
