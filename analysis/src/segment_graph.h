#pragma once

#include <cstdint>
#include <string>

#include "effect/suite.h"

namespace kelp::analysis {

// A reference to a node or operator of the host's graph; 0 is none.
class NodeReference {
 public:
  NodeReference() = default;
  NodeReference(const HX_VideoSegmentSuite5& suite, HX_Node node) : suite_(&suite), node_(node) {}
  NodeReference(NodeReference&& other) noexcept : suite_(other.suite_), node_(other.Detach()) {}
  NodeReference& operator=(NodeReference&& other) noexcept;
  ~NodeReference() { Reset(); }

  HX_Node get() const { return node_; }
  explicit operator bool() const { return node_ != 0; }
  // The caller releases it.
  HX_Node Detach();
  void Reset();

 private:
  const HX_VideoSegmentSuite5* suite_ = nullptr;
  HX_Node node_ = 0;
};

// The suites' part of the graph's walks. The suites are borrowed; functions throw the host's code.
class SegmentGraph {
 public:
  SegmentGraph(const HX_VideoSegmentSuite5& segments, const HX_StringSuite1& strings)
      : segments_(segments), strings_(strings) {}

  // The node under the middle of the effect's layer; none if nothing stands there.
  NodeReference ClipNode(HX_EffectRef effect, const HX_SequenceInfoSuite& sequence,
                         const HX_UtilitySuite& utility) const;

  std::int32_t OperatorCount(HX_Node node) const;
  NodeReference Operator(HX_Node node, std::int32_t index) const;
  std::int32_t InputCount(HX_Node node) const;
  NodeReference Input(HX_Node node, std::int32_t index) const;

  HX_Guid NodeGuid(HX_Node node) const;
  std::string OperatorText(HX_Node effect_operator) const;
  // The decimal number of a property; 0 where it is absent or no number. `absent` may be null.
  std::int64_t NumberProperty(HX_Node node, const char* key, bool* absent = nullptr) const;

 private:
  const HX_VideoSegmentSuite5& segments_;
  const HX_StringSuite1& strings_;
};

// A chain of nodes is never this long; a host's graph that is has a cycle.
inline constexpr int kMaxGraphDepth = 1000;

}  // namespace kelp::analysis
