#include "effect/entry.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <map>
#include <new>
#include <string>
#include <vector>

#include "platform/tessel/config.h"

namespace kelp::effect {
namespace {

using testing::ElementsAre;

// What the effects of a case did and shall do.
struct Script {
  std::vector<std::string> calls;
  HostContext seen{};
  std::function<void()> operation = [] {}, report = [] {};
  HX_Err add_param_code = HX_ERR_NONE;  // answered for index 3
};
Script script;

class ProbeEffect final : public GenericEffect {
 public:
  explicit ProbeEffect(const HostContext& context) noexcept : GenericEffect(context) {}

  void ShowAbout() override { Run("ShowAbout"); }
  void PrepareFrame() override { Run("PrepareFrame"); }
  void StartPlugin() override { Run("StartPlugin"); }
  void DeclareParams() override {
    Run("DeclareParams");
    DeclareParamCount(5);
  }
  void StopPlugin() override { Run("StopPlugin"); }
  void CreateInstance() override { Run("CreateInstance"); }
  void RestoreInstance() override { Run("RestoreInstance"); }
  void FlattenInstance() override { Run("FlattenInstance"); }
  void OpenOptions() override { Run("OpenOptions"); }
  void ParamChanged() override { Run("ParamChanged"); }
  void RefreshParams() override { Run("RefreshParams"); }
  void DestroyInstance() override { Run("DestroyInstance"); }
  void IdleTick() override { Run("IdleTick"); }
  void RenderFrame() override { Run("RenderFrame"); }
  void PlanFrame() override { Run("PlanFrame"); }
  void RenderPlannedFrame() override { Run("RenderPlannedFrame"); }
  void CustomDataOp() override { Run("CustomDataOp"); }
  void Event0() override { Run("0"); }
  void Event1() override { Run("1"); }
  void Event2() override { Run("2"); }
  void Event3() override { Run("3"); }
  void Event4() override { Run("4"); }
  void Event5() override { Run("5"); }
  void Event6() override { Run("6"); }
  void Event7() override { Run("7"); }
  void Event9() override { Run("9"); }
  void Event10() override { Run("10"); }
  void Event11() override { Run("11"); }
  void ReportOutOfMemory() override { Run("OutOfMemory", script.report); }
  void ReportUnknownException() override { Run("UnknownException", script.report); }
  HX_Err AddParam(std::int32_t index) override {
    script.calls.push_back(std::to_string(index));
    return index == 3 ? script.add_param_code : HX_ERR_NONE;
  }

 private:
  void Run(const char* name, const std::function<void()>& deed = script.operation) {
    script.calls.push_back(name);
    script.seen = context();
    deed();
  }
};

const std::map<std::uint32_t, std::string> kOperations = {
    {0, "ShowAbout"},           {1, "StartPlugin"},
    {3, "StopPlugin"},          {4, "DeclareParams"},
    {5, "CreateInstance"},      {6, "RestoreInstance"},
    {7, "FlattenInstance"},     {8, "DestroyInstance"},
    {9, "OpenOptions"},         {10, "PrepareFrame"},
    {11, "RenderFrame"},        {13, "ParamChanged"},
    {14, "RefreshParams"},      {15, "0"},  // of the event below
    {22, "CustomDataOp"},       {23, "PlanFrame"},
    {24, "RenderPlannedFrame"}, {27, "IdleTick"}};

class EntryTest : public testing::Test {
 protected:
  EntryTest() { script = {}; }

  HX_Err Run(std::uint32_t command) {
    script.calls.clear();
    return EffectMain<ProbeEffect>(command, &in_, &out_, params_, &output_, &event_);
  }

  HX_InData in_{};
  HX_OutData out_{};
  HX_ParamDef* params_[1] = {};
  HX_World output_{};
  HX_EventExtra event_{};
};

TEST_F(EntryTest, EachCommandReachesItsOperationWithTheSixArgumentsAndOthersTouchNothing) {
  std::vector<std::uint32_t> commands = {1000, 0x10000, 0x80000000U, 0xffffffffU};
  for (std::uint32_t command = 0; command <= 200; ++command) commands.push_back(command);
  std::memset(&out_, 0x5a, sizeof(out_));
  for (const std::uint32_t command : commands) {
    const HX_OutData before = out_;
    EXPECT_EQ(Run(command), 0) << command;
    const auto operation = kOperations.find(command);
    if (operation == kOperations.end()) {
      EXPECT_TRUE(script.calls.empty()) << command;
      EXPECT_EQ(std::memcmp(&out_, &before, sizeof(out_)), 0) << command;
      EXPECT_EQ(EffectMain<ProbeEffect>(command, nullptr, nullptr, nullptr, nullptr, nullptr), 0);
      continue;
    }
    ASSERT_FALSE(script.calls.empty()) << command;
    EXPECT_EQ(script.calls.front(), operation->second);
    EXPECT_EQ(script.seen.command, command);
    EXPECT_EQ(script.seen.in, &in_);
    EXPECT_EQ(script.seen.out, &out_);
    EXPECT_EQ(script.seen.params, params_);
    EXPECT_EQ(script.seen.output, &output_);
    EXPECT_EQ(script.seen.extra, &event_);
  }
}

TEST_F(EntryTest, EventsReachTheOperationOfTheirType) {
  for (const int type : {-1, 0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 1000}) {
    event_.event_type = type;
    EXPECT_EQ(Run(15), 0);
    const bool known = type >= 0 && type <= 11 && type != 8;
    EXPECT_EQ(script.calls, std::vector<std::string>(known ? 1 : 0, std::to_string(type)));
  }
  EXPECT_EQ(EffectMain<ProbeEffect>(15, nullptr, nullptr, nullptr, nullptr, nullptr), 0);
}

TEST_F(EntryTest, WhatAnyOperationThrowsBecomesTheHostsCodeWhateverItsReportThrows) {
  const struct {
    std::function<void()> thrown;
    HX_Err code;
    const char* report;
  } failures[] = {
      {[] { throw std::int32_t{514}; }, 514, nullptr},
      {[] { throw std::bad_alloc(); }, 4, "OutOfMemory"},
      {[] { throw std::bad_array_new_length(); }, 4, "OutOfMemory"},
      {[] { tessel::config::ThrowError("a text", 514); }, 1, "UnknownException"},
      {[] { throw "a literal"; }, 1, "UnknownException"},
      {[] { throw std::int64_t{514}; }, 1, "UnknownException"},
  };
  for (const auto& failure : failures) {
    script.operation = failure.thrown;
    for (const auto& [command, operation] : kOperations) {
      for (const bool throws : {false, true}) {
        script.report = [throws] {
          if (throws) throw "another literal";
        };
        EXPECT_EQ(Run(command), failure.code) << operation;
        std::vector<std::string> expected = {operation};
        if (failure.report) expected.push_back(failure.report);
        EXPECT_EQ(script.calls, expected);
      }
    }
  }
}

TEST_F(EntryTest, ParametersAreAddedInOrderUntilOneFails) {
  EXPECT_EQ(Run(4), 0);
  EXPECT_THAT(script.calls, ElementsAre("DeclareParams", "0", "1", "2", "3", "4"));
  EXPECT_EQ(out_.num_params, 5);
  out_.num_params = 0;
  script.add_param_code = 77;
  EXPECT_EQ(Run(4), 77);
  EXPECT_EQ(script.calls.back(), "3");
  EXPECT_EQ(out_.num_params, 0);
}

#if defined(__x86_64__) && defined(__linux__)
// There an object begins with the address of its table, and operations take it as first argument.
TEST_F(EntryTest, OperationsStandInTheOrderThatOtherCallersKnow) {
  using Operation = void (*)(GenericEffect*, std::int32_t);
  const Operation* table = nullptr;
  ProbeEffect effect({15, &in_, &out_, params_, &output_, &event_});
  event_.event_type = 9;
  std::memcpy(&table, static_cast<const void*>(&effect), sizeof table);
  for (int place = 0; place < 32; ++place) table[place](&effect, 1000);
  std::string order;
  for (const std::string& call : script.calls) order += call + " ";
  EXPECT_EQ(order,
            "ShowAbout PrepareFrame StartPlugin DeclareParams 0 1 2 3 4 StopPlugin CreateInstance "
            "RestoreInstance FlattenInstance OpenOptions ParamChanged RefreshParams "
            "DestroyInstance IdleTick RenderFrame PlanFrame RenderPlannedFrame CustomDataOp "
            "0 1 2 3 4 5 6 7 9 10 11 9 OutOfMemory UnknownException 1000 ");
}
#endif

}  // namespace
}  // namespace kelp::effect
