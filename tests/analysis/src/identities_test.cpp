#include "analysis/src/identities.h"

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "analysis/src/param_fields.h"
#include "platform/tessel/debug.h"
#include "tests/support/host_records.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::SelectorParams;
using marrow::tracking::TrackerParams;
using tessel::utility::Guid;

JobInput FilledInput() {
  return {.ProjectPath = u"C:/\u00e4",
          .SourceID = Guid::FromText("00112233-4455-6677-8899-aabbccddeeff"),
          .FieldType = 1,
          .StartTime = {1001, 3000},
          .Duration = {1001, 100},
          .StepTime = {1001, 30000}};
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
  JobInput input = FilledInput();
  input.StartTime = {2002, 6000};  // as stored, not by value
  EXPECT_NE(GetIdentifierForJobInput(input), GetIdentifierForJobInput(FilledInput()));
  SelectorParams selector;
  TrackerParams tracker;
  std::set<Guid> seen = {GetIdentifierForTracker(selector, tracker)};
  const auto change = [&](const char*, auto& value) {
    const auto before = value;
    value = static_cast<std::decay_t<decltype(value)>>(value == 0 ? 1 : value / 2);
    seen.insert(GetIdentifierForTracker(selector, tracker));
    value = before;
  };
  ForEachField(selector, change);
  ForEachField(tracker, change);
  EXPECT_EQ(seen.size(), 1u + 11 + 14);
}

TEST(Identities, TheirMakingIsTracedWhileTheChannelIsOn) {
  std::vector<std::string> lines;
  tessel::debug::SetSink(
      [&](const std::string& line) { lines.push_back(line.substr(line.find("> <") + 2)); });
  for (const auto& [level, count] : {std::pair(0, 0u), {6, 8u}, {5, 8u}}) {
    tessel::debug::DebugDatabase::Set("Trace.MixHashGuid", level);
    GetIdentifierForJobInput(FilledInput());
    EXPECT_EQ(lines.size(), count) << level;
  }
  tessel::debug::SetSink({});
  ASSERT_EQ(lines.size(), 8u);
  EXPECT_EQ(lines.front(), "<MixHashGuid> <6> Start Level 'Analyzer::GetIdentifierForJobInput\n");
  EXPECT_EQ(lines[6],
            "<MixHashGuid> <6> Added 76 bytes, now: 4141e4ec-be25-9d3a-3e2c-d22b665f0fbc\n");
  EXPECT_EQ(lines.back(), "<MixHashGuid> <6> End level\n");
}

// Over media of a known identity.
class UpstreamIdentifierTest : public calmframe::host::HostRecords {
 protected:
  using Graph = HX_VideoSegmentSuite5;

  UpstreamIdentifierTest() {
    layer().ReplaceMedia(calmframe::host::MakeShakyClip(
        {kWidth, kHeight, kFrames, "0a000000-0000-0000-0000-000000000001"}));
  }
  std::string Identifier() { return GetUpstreamIdentifier(&in_, &out_).ToText(); }

  // The host has each effect on a node of its own; in this graph all four are on the topmost one.
  void PutOnOneNode() {
    Graph& graph = Changed<Graph>();
    graph.GetOperatorCount = [](HX_Node, std::int32_t* count) -> HX_Err {
      *count = 4;
      return HX_ERR_NONE;
    };
    graph.GetOperator = [](HX_Node node, std::int32_t index, HX_Node* effect_operator) {
      const HX_Node owner = Below(node, 3 - index);
      const HX_Err code = kHosts<Graph>.GetOperator(owner, 0, effect_operator);
      if (owner != node) kHosts<Graph>.ReleaseNode(owner);
      return code;
    };
    graph.GetInput = [](HX_Node node, std::int32_t, HX_Node* input) -> HX_Err {
      *input = Below(node, 4);
      return HX_ERR_NONE;
    };
  }
  static HX_Node Below(HX_Node node, int levels) {
    if (levels == 0) return node;
    HX_Node input = 0;
    EXPECT_EQ(kHosts<Graph>.GetInput(node, 0, &input), HX_ERR_NONE);
    const HX_Node found = Below(input, levels - 1);
    if (found != input) kHosts<Graph>.ReleaseNode(input);
    return found;
  }
};

TEST_F(UpstreamIdentifierTest, ReadsTheNodeUnderTheLayersMiddle) {
  hosted_.Place(10, 25);
  static std::int64_t asked;
  Changed<Graph>().GetSegmentNodeAt = [](HX_Segments segments, std::int64_t ticks, HX_Node* node) {
    asked = ticks;
    return kHosts<Graph>.GetSegmentNodeAt(segments, ticks, node);
  };
  EXPECT_EQ(Identifier(), "eab1ec96-ef49-2469-ab82-2a50d59cb93e");
  EXPECT_EQ(asked, 22 * 28224000 + 28224000 / 2);
  media().faults.node_missing = true;
  EXPECT_EQ(Identifier(), Guid().ToText());
}

// Values from a second implementation, too.
TEST_F(UpstreamIdentifierTest, TakesWhatIsBeneathTheEffectAndNothingAbove) {
  const auto above = calmframe::host::NewRuntimeId();
  layer().InsertEffect(0, {calmframe::host::NewRuntimeId(), "blur", "", {}});
  layer().InsertEffect(2, {above, "above", "", {}});
  EXPECT_EQ(Identifier(), "e20f5bd4-de1b-a2c1-70fb-c8cd176a79fb");  // its input's, for all beneath
  layer().InsertEffect(1, {calmframe::host::NewRuntimeId(), "grain", "", {}});
  PutOnOneNode();
  for (const char* parameters : {"", "changed"}) {
    layer().SetParameters(above, parameters);
    EXPECT_EQ(Identifier(), "e5afa636-be86-ac23-9a83-d5bffbb992f7");  // grain, blur and the media
  }
}

TEST_F(UpstreamIdentifierTest, OfAGraphWithoutTheEffectIsNilAndWithoutAnEndThrows) {
  layer().RemoveEffect(hosted_.effect().shared()->runtime_id());
  EXPECT_EQ(Identifier(), Guid().ToText());
  layer().Change([](auto& state) { state.effects.resize(1100, {1000000, "too deep", "", {}}); });
  EXPECT_THROW(Identifier(), std::int32_t);
}

TEST_F(UpstreamIdentifierTest, HandsOnTheHostsFailures) {
  for (const char* operation :
       {"Sequence Info.AcquireSegments", "Utility.GetStartFrame", "Utility.GetFrameCount",
        "Utility.GetTicksPerFrame", "Utility.GetRuntimeInstanceID",
        "Video Segment.GetOperatorCount", "Video Segment.GetOperator",
        "Video Segment.GetInputCount", "Video Segment.GetInput", "Video Segment.GetNodeGuid",
        "acquire Rushbase Video Segment Suite"}) {
    calmframe::host::Operations::Get().FailNth(1, operation);
    EXPECT_THROW(GetUpstreamIdentifier(&in_, &out_), std::int32_t) << operation;
  }
  EXPECT_EQ(TakeMessage(), "Not able to acquire OVK Suite.");
  EXPECT_FALSE(GetUpstreamIdentifier(&in_, &out_).IsNil());
}

}  // namespace
}  // namespace kelp::analysis
