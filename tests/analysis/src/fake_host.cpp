#include "tests/analysis/src/fake_host.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>

#include "host/timeline/string_table.h"
#include "platform/tessel/guid.h"
#include "platform/tessel/utility.h"

namespace kelp::analysis {
namespace {

FakeHost* host = nullptr;

HX_Err Called(const char* operation) {
  ++host->calls;
  const auto found = host->failing.find(operation);
  return found == host->failing.end() ? HX_ERR_NONE : found->second;
}

template <class T, class U>
HX_Err Answer(const char* operation, T* to, const U& value) {
  const HX_Err code = Called(operation);
  if (code == HX_ERR_NONE) *to = value;
  return code;
}

HX_Err AnswerText(const char* operation, const std::u16string& text, std::uint16_t* to,
                  std::uint32_t max) {
  if (const HX_Err code = Called(operation)) return code;
  const std::size_t size = std::min<std::size_t>(text.size(), max - 1);
  std::copy_n(text.begin(), size, to);
  to[size] = 0;
  return HX_ERR_NONE;
}

HX_Err AnswerString(const char* operation, const std::string& text, HX_String* string) {
  if (const HX_Err code = Called(operation)) return code;
  *string = new HX_StringRecord{text, {}};
  ++host->strings;
  return HX_ERR_NONE;
}

// Ids are indices plus 1.
FakeHost::Node& NodeOf(HX_Node node) {
  return host->nodes.at(node - 1);
}

HX_Err Lend(const char* operation, const std::vector<int>& from, int index, HX_Node* node) {
  if (const HX_Err code = Called(operation)) return code;
  *node = from.at(index) + 1;
  ++host->node_references;
  return HX_ERR_NONE;
}

const HX_AnalysisHostSuite1& AnalysisSuite() {
  static const HX_AnalysisHostSuite1 suite = [] {
    HX_AnalysisHostSuite1 table{};
    table.MayStart = [](HX_EffectRef, uint8_t* may) { return Answer("MayStart", may, 1); };
    table.ScheduleAnalysis = [](HX_EffectRef) { return Called("ScheduleAnalysis"); };
    table.GetRefusal = [](HX_EffectRef, uint16_t* text, uint32_t max) {
      return AnswerText("GetRefusal", host->refusal, text, max);
    };
    return table;
  }();
  return suite;
}

const HX_UtilitySuite& UtilitySuite() {
  static const HX_UtilitySuite suite = [] {
    HX_UtilitySuite table{};
    table.GetRuntimeInstanceID = [](HX_EffectRef, uint32_t* id) {
      return Answer("GetRuntimeInstanceID", id, host->runtime_id);
    };
    table.GetTicksPerFrame = [](HX_EffectRef, int64_t* ticks) {
      return Answer("GetTicksPerFrame", ticks, host->ticks);
    };
    table.GetStartFrame = [](HX_EffectRef, int32_t* frame) {
      return Answer("GetStartFrame", frame, host->start);
    };
    table.GetFrameCount = [](HX_EffectRef, int32_t* count) {
      return Answer("GetFrameCount", count, host->count);
    };
    table.GetFieldType = [](HX_EffectRef, int32_t* field) {
      return Answer("GetFieldType", field, host->field);
    };
    table.GetLayerName = [](HX_EffectRef, uint16_t* text, uint32_t max) {
      return AnswerText("GetLayerName", host->layer_name, text, max);
    };
    return table;
  }();
  return suite;
}

const HX_PrivateEffectSuite3& PrivateSuite() {
  static const HX_PrivateEffectSuite3 suite = [] {
    HX_PrivateEffectSuite3 table{};
    table.ConvertText = [](const uint16_t* from, char* to, uint32_t max) {
      if (const HX_Err code = Called("ConvertText")) return code;
      std::u16string text;
      while (*from != 0) text += static_cast<char16_t>(*from++);
      std::snprintf(to, max, "%s", tessel::utility::ToUTF8(text).c_str());
      return HX_Err{HX_ERR_NONE};
    };
    return table;
  }();
  return suite;
}

const HX_StringSuite1& StringSuite() {
  static const HX_StringSuite1 suite = [] {
    HX_StringSuite1 table{};
    table.MakeFromUTF8 = [](const char* text, HX_String* string) {
      return AnswerString("MakeFromUTF8", text, string);
    };
    table.GetUTF8 = [](HX_String string, const char** text) {
      return Answer("GetUTF8", text, string->utf8.c_str());
    };
    table.Dispose = [](HX_String string) {
      delete string;
      --host->strings;
      return HX_Err{HX_ERR_NONE};
    };
    return table;
  }();
  return suite;
}

const HX_SequenceInfoSuite& SequenceSuite() {
  static const HX_SequenceInfoSuite suite = [] {
    HX_SequenceInfoSuite table{};
    table.AcquireSegments = [](HX_EffectRef, HX_Segments* segments) {
      const HX_Err code = Answer("AcquireSegments", segments, 9);
      if (code == HX_ERR_NONE) ++host->segments;
      return code;
    };
    table.ReleaseSegments = [](HX_Segments segments) {
      EXPECT_EQ(segments, 9);
      --host->segments;
      return HX_Err{HX_ERR_NONE};
    };
    return table;
  }();
  return suite;
}

const HX_VideoSegmentSuite5& SegmentSuite() {
  static const HX_VideoSegmentSuite5 suite = [] {
    HX_VideoSegmentSuite5 table{};
    table.GetSegmentNodeAt = [](HX_Segments, int64_t ticks, HX_Node* node) {
      host->asked_ticks = ticks;
      if (host->top < 0) return HX_Err{HX_ERR_UNKNOWN};
      return Lend("GetSegmentNodeAt", {host->top}, 0, node);
    };
    table.GetOperatorCount = [](HX_Node node, int32_t* count) {
      return Answer("GetOperatorCount", count, static_cast<int>(NodeOf(node).operators.size()));
    };
    table.GetOperator = [](HX_Node node, int32_t index, HX_Node* found) {
      return Lend("GetOperator", NodeOf(node).operators, index, found);
    };
    table.GetInputCount = [](HX_Node node, int32_t* count) {
      return Answer("GetInputCount", count, static_cast<int>(NodeOf(node).inputs.size()));
    };
    table.GetInput = [](HX_Node node, int32_t index, HX_Node* found) {
      return Lend("GetInput", NodeOf(node).inputs, index, found);
    };
    table.GetProperty = [](HX_Node node, const char* key, HX_String* text) {
      const auto found = NodeOf(node).properties.find(key);
      if (found == NodeOf(node).properties.end()) return HX_Err{HX_ERR_UNKNOWN};
      return AnswerString("GetProperty", found->second, text);
    };
    table.GetNodeGuid = [](HX_Node node, HX_Guid* guid) {
      if (const HX_Err code = Called("GetNodeGuid")) return code;
      const auto bytes = tessel::utility::Guid::FromText(NodeOf(node).guid).bytes();
      std::copy(bytes.begin(), bytes.end(), guid->bytes);
      return HX_Err{HX_ERR_NONE};
    };
    table.GetOperatorText = [](HX_Node node, HX_String* text) {
      return AnswerString("GetOperatorText", NodeOf(node).text, text);
    };
    table.ReleaseNode = [](HX_Node node) {
      EXPECT_NE(node, 0);
      --host->node_references;
      return HX_Err{HX_ERR_NONE};
    };
    return table;
  }();
  return suite;
}

HX_Err Acquire(const char* name, int32_t version, const void** table) {
  for (const FakeHost::SuiteTable& suite : FakeHost::SuiteTables()) {
    if (suite.name != name || suite.version != version || host->missing.count(name)) continue;
    *table = suite.table;
    ++host->suites;
    return HX_ERR_NONE;
  }
  return HX_ERR_MISSING_SUITE;
}

HX_Err Release(const char*, int32_t) {
  --host->suites;
  return HX_ERR_NONE;
}

int32_t Format(char* buffer, const char* text, ...) {
  va_list arguments;
  va_start(arguments, text);
  const int size = std::vsnprintf(buffer, 512, text, arguments);
  va_end(arguments);
  return size;
}

}  // namespace

FakeHost::FakeHost() {
  static const HX_BasicSuite basic = {Acquire, Release};
  static const HX_Callbacks callbacks = [] {
    HX_Callbacks table{};
    table.format = Format;
    table.copy_text = [](char* to, uint32_t size, const char* from) {
      std::snprintf(to, size, "%s", from);
    };
    return table;
  }();
  in.basic = &basic;
  in.cb = &callbacks;
  host = this;
}

FakeHost::~FakeHost() {
  EXPECT_EQ(suites, 0);
  EXPECT_EQ(segments, 0);
  EXPECT_EQ(strings, 0);
  EXPECT_EQ(node_references, 0);
  host = nullptr;
}

const std::vector<FakeHost::SuiteTable>& FakeHost::SuiteTables() {
  static const std::vector<SuiteTable> tables = {
      {"Analysis Host Suite", 1, &AnalysisSuite()},
      {"HX Utility Suite", 3, &UtilitySuite()},
      {"HX OV Private Effect Suite", 3, &PrivateSuite()},
      {"Rushbase StringSuite", 1, &StringSuite()},
      {"Rushbase Sequence Info Suite", 2, &SequenceSuite()},
      {"Rushbase Video Segment Suite", 5, &SegmentSuite()}};
  return tables;
}

int FakeHost::AddNode(Node node) {
  nodes.push_back(std::move(node));
  return static_cast<int>(nodes.size()) - 1;
}

int FakeHost::AddPlainClip(const std::string& media_guid) {
  const int media = AddNode({media_guid, "", {}, {}, {}});
  const int effect =
      AddNode({"", "", {{"EffectNode::RuntimeInstanceID", std::to_string(runtime_id)}}, {}, {}});
  return AddNode({"", "", {}, {effect}, {media}});
}

}  // namespace kelp::analysis
