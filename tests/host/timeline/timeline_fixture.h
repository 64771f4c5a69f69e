#pragma once

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <string>

#include "host/base/operations.h"
#include "host/timeline/media_services.h"
#include "tests/host/timeline/drawn_media.h"

namespace calmframe::host {

constexpr std::int64_t kFrame = 28224000;  // ticks at 25 frames a second

// A reference to a node, or none, for as long as this stands.
class Node {
 public:
  Node(const HX_VideoSegmentSuite5& graph, HX_Node node) : graph_(graph), node_(node) {}
  ~Node() {
    if (node_ != 0) graph_.ReleaseNode(node_);
  }
  Node(const Node&) = delete;
  Node& operator=(const Node&) = delete;
  operator HX_Node() const { return node_; }

 private:
  const HX_VideoSegmentSuite5& graph_;
  const HX_Node node_;
};

// A plug-in's view of the services: an effect on a layer of drawn media of 6 by 4 pixels, and the
// tables. At the end nothing that was lent may be missing.
class TimelineTest : public testing::Test {
 protected:
  TimelineTest()
      : layer(boost::make_shared<Layer>(MakeDrawnSource(DrawnInfo(6, 4, 20), DrawFrame))) {
    Ledger::Get().Reset();
    layer->InsertEffect(0, {kOwnId, "Own", "", {}});
    services.AttachEffect(effect, layer, kOwnId);
  }
  ~TimelineTest() override {
    services.Shutdown();
    const MediaCounts counts = services.counts();
    EXPECT_EQ(counts.nodes + counts.segments + counts.strings + counts.frames, 0u);
    EXPECT_EQ(counts.references + counts.requests, 0u);
    EXPECT_EQ(Ledger::Get().Report(), mistakes);
  }

  template <class Table>
  const Table& Suite(const char* name, std::int32_t version) {
    const void* const table = services.FindSuite(name, version);
    if (!table) throw std::runtime_error(name);
    return *static_cast<const Table*>(table);
  }

  std::string Take(HX_String string) {
    const char* text = "";
    EXPECT_EQ(strings.GetUTF8(string, &text), HX_ERR_NONE);
    const std::string taken = text;
    EXPECT_EQ(strings.Dispose(string), HX_ERR_NONE);
    return taken;
  }

  // The top node that stands at a time, or 0.
  HX_Node TopAt(std::int64_t ticks) {
    HX_Segments segments = 0;
    HX_Node node = 0;
    EXPECT_EQ(sequence.AcquireSegments(effect, &segments), HX_ERR_NONE);
    graph.GetSegmentNodeAt(segments, ticks, &node);
    EXPECT_EQ(sequence.ReleaseSegments(segments), HX_ERR_NONE);
    return node;
  }
  // The node so many levels beneath the top one; 1 enters the effect if none is downstream.
  Node NodeBelow(int levels) {
    HX_Node node = TopAt(0);
    while (levels-- > 0) {
      HX_Node input = 0;
      EXPECT_EQ(graph.GetInput(node, 0, &input), HX_ERR_NONE);
      EXPECT_EQ(graph.ReleaseNode(node), HX_ERR_NONE);
      node = input;
    }
    return {graph, node};
  }
  Node InputNode() { return NodeBelow(1); }

  static constexpr std::uint32_t kOwnId = 41;
  MediaServices services;
  boost::shared_ptr<Layer> layer;
  const HX_EffectRef effect = reinterpret_cast<HX_EffectRef>(this);
  std::string mistakes;  // that the Ledger is to have at the end

  const HX_SequenceInfoSuite& sequence =
      Suite<HX_SequenceInfoSuite>("Rushbase Sequence Info Suite", 2);
  const HX_VideoSegmentSuite5& graph =
      Suite<HX_VideoSegmentSuite5>("Rushbase Video Segment Suite", 5);
  const HX_VideoSegmentRenderSuite3& renders =
      Suite<HX_VideoSegmentRenderSuite3>("Rushbase Video Segment Render Suite", 3);
  const HX_CutPixSuite1& frames = Suite<HX_CutPixSuite1>("Cutline CutPix Suite", 1);
  const HX_CutPixCacheSuite5& cache = Suite<HX_CutPixCacheSuite5>("Cutline CutPix Cache Suite", 5);
  const HX_StringSuite1& strings = Suite<HX_StringSuite1>("Rushbase StringSuite", 1);
};

}  // namespace calmframe::host
