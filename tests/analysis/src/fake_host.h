#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/hx/hx.h"

namespace kelp::analysis {

// As much of a host as an analysis asks for: one effect on one layer, over a graph of nodes. One at
// a time. At its end nothing that it lent may be missing. What it offers may be called on any
// thread, while the test changes nothing.
class FakeHost {
 public:
  struct Node {
    std::string guid;  // text form
    std::string text;  // of an operator
    std::map<std::string, std::string> properties;
    std::vector<int> operators;  // indices into nodes, the first acts first
    std::vector<int> inputs;
  };

  FakeHost();
  ~FakeHost();
  FakeHost(const FakeHost&) = delete;
  FakeHost& operator=(const FakeHost&) = delete;

  int AddNode(Node node);  // its index
  // Media, this effect on it, and nothing else; the top node.
  int AddPlainClip(const std::string& media_guid);

  struct SuiteTable {
    std::string name;
    std::int32_t version;
    const void* table;
  };
  // For a host that offers more.
  static const std::vector<SuiteTable>& SuiteTables();

  HX_InData in{};
  HX_OutData out{};

  std::u16string refusal;
  std::u16string layer_name = u"Clip 1";
  std::int32_t start = 0, count = 0, field = HX_FIELD_PROGRESSIVE;
  std::int64_t ticks = 28224000;  // 25 frames a second
  std::uint32_t runtime_id = 77;
  std::vector<Node> nodes;
  int top = -1;  // node under the layer; -1 for none
  std::int64_t asked_ticks = -1;
  std::set<std::string> missing;          // suites
  std::map<std::string, HX_Err> failing;  // operations, by name
  std::atomic<int> calls = 0;             // of operations of suites

  // Lent and not given back.
  std::atomic<int> suites = 0, segments = 0, strings = 0, node_references = 0;
};

}  // namespace kelp::analysis
