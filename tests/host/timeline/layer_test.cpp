#include "host/timeline/layer.h"

#include <stdexcept>
#include <thread>

#include "tests/host/timeline/timeline_fixture.h"

namespace calmframe::host {
namespace {

TEST(Layer, ReadersKeepTheStateThatTheyTook) {
  SourceInfo info = DrawnInfo(6, 4, 20);
  info.field_type = HX_FIELD_SECOND_ORDER;
  info.ticks_per_frame = 23543520;
  Layer layer(MakeDrawnSource(info, DrawFrame));
  const auto before = layer.state();
  EXPECT_EQ(before->length, 20);
  EXPECT_EQ(before->field_type, HX_FIELD_SECOND_ORDER);

  layer.InsertEffect(9, {1, "A", "", {}});
  layer.InsertEffect(0, {2, "B", "", {}});
  layer.InsertEffect(1, {3, "C", "", {}});
  layer.SetParameters(3, "x");
  layer.RemoveEffect(2);
  layer.ReplaceMedia(MakeDrawnSource(DrawnInfo(8, 4, 5), DrawFrame));
  EXPECT_TRUE(before->effects.empty());
  const auto after = layer.state();
  ASSERT_EQ(after->effects.size(), 2u);
  EXPECT_EQ(after->effects[0].match_name, "C");
  EXPECT_EQ(after->effects[0].parameters, "x");
  EXPECT_EQ(after->effects[1].match_name, "A");
  EXPECT_EQ(after->length, 20) << "the layer's span is the user's";
  EXPECT_EQ(after->field_type, HX_FIELD_PROGRESSIVE);
  EXPECT_EQ(after->ticks_per_frame, 28224000);
  EXPECT_EQ(before->source->info().width, 6);

  EXPECT_THROW(layer.Change([](LayerState& state) { state.ticks_per_frame = 0; }),
               std::invalid_argument);
  EXPECT_EQ(layer.state()->ticks_per_frame, 28224000);
}

TEST(Layer, NoChangeIsLostBetweenThreads) {
  Layer layer(MakeDrawnSource(DrawnInfo(6, 4, 20), DrawFrame));
  const auto grow = [&] {
    for (int i = 0; i < 500; ++i) layer.Change([](LayerState& state) { ++state.start_frame; });
  };
  std::jthread other(grow);
  std::int32_t seen = 0;
  while (seen < 200) {
    const std::int32_t now = layer.state()->start_frame;
    EXPECT_GE(now, seen);
    seen = now;
  }
  grow();
  other.join();
  EXPECT_EQ(layer.state()->start_frame, 1000);
}

}  // namespace
}  // namespace calmframe::host
