#include "analysis/src/identities.h"

#include <gmock/gmock.h>

#include <set>
#include <string>
#include <vector>

#include "analysis/src/param_fields.h"
#include "platform/tessel/debug.h"
#include "tests/effect/host_records.h"

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
  EXPECT_THAT(lines[1], ::testing::StartsWith("<MixHashGuid> <6> Added 8 bytes, now: "));
  EXPECT_EQ(lines[6],
            "<MixHashGuid> <6> Added 76 bytes, now: 4141e4ec-be25-9d3a-3e2c-d22b665f0fbc\n");
  EXPECT_EQ(lines.back(), "<MixHashGuid> <6> End level\n");
}

constexpr char kMedia[] = "0a000000-0000-0000-0000-000000000001";
constexpr char kBlur[] = "0b000000-0000-0000-0000-000000000002";
constexpr char kOfMedia[] = "eab1ec96-ef49-2469-ab82-2a50d59cb93e";
constexpr char kOfBlurredMedia[] = "9b4a9cf3-c8b7-513d-59b5-a8658893399b";

// A graph of the test's own in place of the host's, which has one operator on each node.
class UpstreamIdentifierTest : public calmframe::host::HostRecords {
 protected:
  struct Node {
    std::string identity;                // a node's Guid, an operator's text
    std::string runtime_id;              // of an operator
    std::vector<int> operators, inputs;  // indices into nodes_, the first acts first
  };

  UpstreamIdentifierTest() {
    nodes_.clear();
    lent_ = 0;
    Replace(HX_VIDEO_SEGMENT_SUITE, &kGraph);
    strings_ = TableOf<HX_StringSuite1>(HX_STRING_SUITE, HX_STRING_SUITE_VERSION);
  }
  ~UpstreamIdentifierTest() override { EXPECT_EQ(lent_, 0); }

  static int Add(const Node& node) {
    nodes_.push_back(node);
    return top_ = static_cast<int>(nodes_.size()) - 1;
  }
  int AddSelf() { return Add({"x", std::to_string(effect_->shared()->runtime_id()), {}, {}}); }
  std::string Identifier() { return GetUpstreamIdentifier(&in_, &out_).ToText(); }

  static inline std::vector<Node> nodes_;
  static inline int top_ = -1, lent_ = 0;
  static inline std::int64_t asked_ticks_ = 0;
  static inline HX_StringSuite1 strings_{};

  static HX_Err Lend(int index, HX_Node* node) {
    ++lent_;
    *node = index + 1;
    return HX_ERR_NONE;
  }
  static HX_Err Count(const std::vector<int>& children, std::int32_t* count) {
    *count = static_cast<std::int32_t>(children.size());
    return HX_ERR_NONE;
  }
  static const Node& Of(HX_Node node) { return nodes_.at(node - 1); }
  static constexpr HX_VideoSegmentSuite5 kGraph = {
      [](HX_Segments, std::int64_t ticks, HX_Node* node) -> HX_Err {
        asked_ticks_ = ticks;
        return top_ < 0 ? 1 : Lend(top_, node);
      },
      [](HX_Node node, std::int32_t* count) { return Count(Of(node).operators, count); },
      [](HX_Node node, std::int32_t i, HX_Node* to) { return Lend(Of(node).operators.at(i), to); },
      [](HX_Node node, std::int32_t* count) { return Count(Of(node).inputs, count); },
      [](HX_Node node, std::int32_t i, HX_Node* to) { return Lend(Of(node).inputs.at(i), to); },
      [](HX_Node node, const char* key, HX_String* text) -> HX_Err {
        EXPECT_STREQ(key, "EffectNode::RuntimeInstanceID");
        if (Of(node).runtime_id.empty()) return 1;
        return strings_.MakeFromUTF8(Of(node).runtime_id.c_str(), text);
      },
      [](HX_Node node, HX_Guid* guid) -> HX_Err {
        const auto bytes = Guid::FromText(Of(node).identity).bytes();
        std::copy(bytes.begin(), bytes.end(), guid->bytes);
        return HX_ERR_NONE;
      },
      [](HX_Node node, HX_String* text) {
        return strings_.MakeFromUTF8(Of(node).identity.c_str(), text);
      },
      [](HX_Node) -> HX_Err { return --lent_, HX_ERR_NONE; }};
};

TEST_F(UpstreamIdentifierTest, ReadsTheNodeUnderTheLayersMiddle) {
  Place(10, 25);
  const int media = Add({kMedia, "", {}, {}}), self = AddSelf();
  Add({"", "", {self}, {media}});
  EXPECT_EQ(Identifier(), kOfMedia);
  EXPECT_EQ(asked_ticks_, 22 * 28224000 + 28224000 / 2);
  top_ = -1;
  EXPECT_EQ(Identifier(), Guid().ToText());
}

TEST_F(UpstreamIdentifierTest, TakesWhatIsBeneathTheEffectAndNothingAbove) {
  const int media = Add({kMedia, "", {}, {}}), blur = Add({kBlur, "1000001", {}, {}});
  const int self = AddSelf(), above = Add({"anything", "1000002", {}, {}});
  // On one node: blur acts first, then this effect, then the other.
  Add({"", "", {blur, self, above}, {media}});
  EXPECT_EQ(Identifier(), kOfBlurredMedia);
  nodes_[above].identity = "something else";
  EXPECT_EQ(Identifier(), kOfBlurredMedia);
  nodes_[blur].identity = "0b000000-0000-0000-0000-000000000003";
  EXPECT_NE(Identifier(), kOfBlurredMedia);

  // On nodes of their own: the input's identity stands for all beneath.
  const int blurred = Add({kMedia, "", {blur}, {media}});
  const int own = Add({"", "", {self}, {blurred}});
  const int top = Add({"", "", {above}, {own}});
  EXPECT_EQ(Identifier(), kOfMedia);
  nodes_[blurred].identity = kBlur;
  EXPECT_NE(Identifier(), kOfMedia);
  // Another effect with an id that is no number is not this one.
  nodes_[above].runtime_id = nodes_[self].runtime_id + " or so";
  EXPECT_NE(Identifier(), Guid().ToText());
  nodes_[self].runtime_id.clear();
  EXPECT_EQ(Identifier(), Guid().ToText());
  nodes_[top].inputs = {top};  // a circle
  EXPECT_THROW(Identifier(), std::int32_t);
}

using HostsFailures = calmframe::host::HostRecords;

TEST_F(HostsFailures, AreHandedOnByTheUpstreamIdentifier) {
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
