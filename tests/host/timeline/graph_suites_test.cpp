#include <gmock/gmock.h>

#include <cstring>

#include "tests/host/timeline/timeline_fixture.h"

namespace calmframe::host {
namespace {

using tessel::utility::Guid;

class GraphSuitesTest : public TimelineTest {
 protected:
  std::int64_t Property(HX_Node node, const char* key) {
    HX_String text = nullptr;
    if (graph.GetProperty(node, key, &text) != HX_ERR_NONE) return -1;
    return std::stoll(Take(text));
  }
  std::string GuidOf(HX_Node node) {
    HX_Guid guid{};
    EXPECT_EQ(graph.GetNodeGuid(node, &guid), HX_ERR_NONE);
    Guid::Bytes bytes;
    std::memcpy(bytes.data(), guid.bytes, sizeof guid.bytes);
    return Guid(bytes).ToText();
  }
  // From the output inwards: each node's Guid, and its operator's id and text.
  struct Chain {
    std::vector<std::string> guids, texts;
    std::vector<std::int64_t> ids;
  };
  Chain Walk() {
    Chain chain;
    for (int level = 0, inputs = 1; inputs == 1; ++level) {
      const Node node = NodeBelow(level);
      chain.guids.push_back(GuidOf(node));
      EXPECT_EQ(Property(node, HX_PROPERTY_STREAM_WIDTH), 6) << "passed down by every node";
      std::int32_t operators = -1;
      HX_Node child = 0;
      EXPECT_EQ(graph.GetOperatorCount(node, &operators), HX_ERR_NONE);
      EXPECT_EQ(graph.GetInputCount(node, &inputs), HX_ERR_NONE);
      EXPECT_EQ(operators, inputs) << "an effect a node, and none on the media";
      EXPECT_NE(graph.GetInput(node, inputs, &child), HX_ERR_NONE);
      if (operators == 0) break;
      EXPECT_EQ(graph.GetOperator(node, 0, &child), HX_ERR_NONE);
      const Node effect_operator(graph, child);
      HX_String text = nullptr;
      EXPECT_EQ(graph.GetOperatorText(effect_operator, &text), HX_ERR_NONE);
      chain.texts.push_back(Take(text));
      chain.ids.push_back(Property(effect_operator, HX_PROPERTY_RUNTIME_INSTANCE_ID));
    }
    return chain;
  }
};

TEST_F(GraphSuitesTest, EffectsStandAboveTheMediaAndTellAllThatIsBeneath) {
  // Stored by projects: they may never change.
  EXPECT_THAT(Walk().guids, testing::ElementsAre("e5c96a89-a797-6c3e-32c9-a1b7786fd426",
                                                 "8ba10cfc-4f53-1d12-d9a8-7116fc5c5072"));
  layer->InsertEffect(0, {50, "Upstream", "a=1", {}});
  layer->InsertEffect(2, {60, "Downstream", "", {}});
  const Chain chain = Walk();
  EXPECT_THAT(chain.ids, testing::ElementsAre(60, kOwnId, 50));
  ASSERT_EQ(chain.guids.size(), 4u);
  EXPECT_EQ(chain.guids[3], Guid::FromText("drawn frames").ToText());

  // In another process ids and names differ, the identities don't.
  layer->Change([](LayerState& state) {
    state.name = "renamed";
    for (EffectOperator& one : state.effects) one.runtime_id += 1000;
  });
  const Chain again = Walk();
  EXPECT_EQ(again.guids, chain.guids);
  EXPECT_EQ(again.texts, chain.texts);
  for (const std::string& text : chain.texts) {
    Guid guid;
    EXPECT_TRUE(Guid::Parse(text, &guid));
  }

  // A change shows in all that stands above it.
  layer->SetParameters(1060, "b=1");
  const Chain downstream = Walk();
  EXPECT_NE(downstream.guids[0], chain.guids[0]);
  EXPECT_NE(downstream.texts[0], chain.texts[0]);
  for (int i = 1; i < 4; ++i) EXPECT_EQ(downstream.guids[i], chain.guids[i]);
  layer->SetParameters(1050, "a=2");
  const Chain upstream = Walk();
  for (int i = 0; i < 3; ++i) EXPECT_NE(upstream.guids[i], downstream.guids[i]);
  EXPECT_EQ(upstream.guids[3], chain.guids[3]);
}

TEST_F(GraphSuitesTest, ALayerStandsFromItsInPointForItsLength) {
  layer->Change([](LayerState& state) {
    state.start_frame = -2;
    state.length = 5;
  });
  const auto stands = [&](std::int64_t ticks) { return Node(graph, TopAt(ticks)) != 0; };
  EXPECT_FALSE(stands(-2 * kFrame - 1));
  EXPECT_TRUE(stands(-2 * kFrame));
  EXPECT_TRUE(stands(3 * kFrame - 1));
  EXPECT_FALSE(stands(3 * kFrame));
  layer->Change([](LayerState& state) { state.length = 0; });
  EXPECT_FALSE(stands(-2 * kFrame));
  std::int64_t ticks = 0;
  EXPECT_EQ(sequence.GetTicksPerFrame(effect, &ticks), HX_ERR_NONE);
  EXPECT_EQ(ticks, kFrame);
}

TEST_F(GraphSuitesTest, PropertiesAreThoseOfTheMediaAsItIsShown) {
  const Node node = InputNode();
  const struct {
    const char* key;
    std::int64_t value;
  } cases[] = {{"MediaNode::StreamFrameWidth", 6},
               {"MediaNode::StreamFrameHeight", 4},
               {"MediaNode::StreamPixelAspectRatioNum", 16},
               {"MediaNode::StreamPixelAspectRatioDen", 15},
               {"MediaNode::Unknown", -1},
               {"EffectNode::RuntimeInstanceID", -1}};
  for (const auto& c : cases) EXPECT_EQ(Property(node, c.key), c.value) << c.key;
  layer->Resize(1, 1);
  EXPECT_EQ(Property(node, "MediaNode::StreamFrameWidth"), 6) << "a reference shows what it was";
  const Node resized = InputNode();
  EXPECT_EQ(Property(resized, "MediaNode::StreamFrameWidth"), 1);
  EXPECT_NE(GuidOf(resized), GuidOf(node));
  services.faults.property_missing = true;
  EXPECT_EQ(Property(node, "MediaNode::StreamFrameWidth"), -1);
}

TEST_F(GraphSuitesTest, ADetachedEffectIsRefusedAndItsNodesGoOn) {
  HX_Node node = 0;
  EXPECT_EQ(graph.GetInput(NodeBelow(0), 0, &node), HX_ERR_NONE);
  services.DetachEffect(effect);
  services.DetachEffect(effect);
  HX_Segments segments = 0;
  EXPECT_NE(sequence.AcquireSegments(effect, &segments), HX_ERR_NONE);
  EXPECT_EQ(services.FindSuite("Rushbase Sequence Info Suite", 4), nullptr);
  layer.reset();
  EXPECT_EQ(Property(node, "MediaNode::StreamFrameWidth"), 6);
  EXPECT_EQ(graph.ReleaseNode(node), HX_ERR_NONE);
  EXPECT_NE(graph.ReleaseNode(node), HX_ERR_NONE);
  EXPECT_EQ(Property(node, "MediaNode::StreamFrameWidth"), -1);
  EXPECT_NE(graph.GetInput(node, 0, nullptr), HX_ERR_NONE);
  mistakes = "Video Segment.ReleaseNode of what is not lent\n";
}

}  // namespace
}  // namespace calmframe::host
