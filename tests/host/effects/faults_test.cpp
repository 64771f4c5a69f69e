#include <gtest/gtest.h>

#include <set>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/host/effects/drawn_clip.h"
#include "tests/host/effects/probe.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;
using namespace probe;

const std::set<HX_Err> kCodes = {HX_ERR_NONE,   HX_ERR_UNKNOWN,       HX_ERR_HANDLE_LOCK,
                                 HX_ERR_MEMORY, HX_ERR_MISSING_SUITE, HX_ERR_NO_INSTANCE,
                                 kFaultCode};

// A little of everything; codes that came, in order.
std::vector<HX_Err> Tour(Host& host) {
  std::vector<HX_Err> codes;
  Session session(host);
  Effect& effect = session.Apply(MakeDrawnLayer());
  codes.push_back(effect.creation().code);
  codes.push_back(effect.Press(kStart).code);
  codes.push_back(effect.SetParam(kAmount, 7).code);
  for (int i = 0; i < kTicks; ++i) codes.push_back(effect.Tick().code);
  SavedEffect saved;
  codes.push_back(effect.Save(&saved).code);
  const auto renderer = effect.MakeRenderer();
  codes.push_back(renderer->result().code);
  codes.push_back(renderer->Direct({1}).result.code);
  codes.push_back(renderer->Planned({1}).result.code);
  return codes;
}

class FaultsTest : public testing::Test {
 protected:
  ~FaultsTest() override { Operations::Get().FailNone(); }
};

TEST_F(FaultsTest, WhicheverOperationFailsNothingIsLostAndTheNextTourIsWhole) {
  Host host(PROBE_PLUGIN);
  host.handles().MoveOnUnlock(true);
  std::uint64_t operations = Operations::Get().count();
  const std::vector<HX_Err> whole = Tour(host);
  operations = Operations::Get().count() - operations;
  for (const HX_Err code : whole) EXPECT_EQ(code, 0);
  ASSERT_GT(operations, 80u);

  std::uint64_t seen = 0;
  for (std::uint64_t n = 1; n <= operations; ++n) {
    Operations::Get().FailNth(static_cast<std::int64_t>(n));
    bool failed = false;
    for (const HX_Err code : Tour(host)) {
      EXPECT_TRUE(kCodes.count(code)) << n << ": " << code;
      failed = failed || code != 0;
    }
    seen += failed ? 1 : 0;
    Operations::Get().FailNone();
    ASSERT_EQ(Ledger::Get().Report(), "") << n;
    ASSERT_EQ(host.instances().size(), 0u) << n;
    ASSERT_EQ(host.opaque_data().uses(), 0u) << n;
    ASSERT_EQ(host.handles().count(), 1u) << n;  // the plug-in's global data
  }
  // What fails while the effect is taken apart, or within a refresh of no answer, shows no code.
  EXPECT_GT(seen, operations / 2);
  EXPECT_EQ(Tour(host), whole);
  host.Stop();
  EXPECT_EQ(host.LeakReport(), "");
}

TEST_F(FaultsTest, AStartThatFailsIsToldAndLeavesNothing) {
  for (const char* operation : {"open_strings", "new_handle", "lock_handle", "add_param"}) {
    Operations::Get().FailAlways(operation);
    try {
      Host host(PROBE_PLUGIN);
      ADD_FAILURE() << operation;
    } catch (const PluginError& error) {
      EXPECT_NE(std::string(error.what()).find(PROBE_PLUGIN ": "), std::string::npos);
    }
    EXPECT_EQ(Host::active(), nullptr);
    EXPECT_EQ(Ledger::Get().Report(), "") << operation;
    Operations::Get().FailNone();
  }
  Host host(PROBE_PLUGIN);
  EXPECT_THROW(Host second(PROBE_PLUGIN), std::logic_error);
}

TEST_F(FaultsTest, AMissingSuiteIsRefusedByName) {
  Host host(PROBE_PLUGIN);
  Session session(host);
  Operations::Get().FailAlways("acquire " HX_OPAQUE_EFFECT_DATA_SUITE);
  Effect& effect = session.Apply(MakeDrawnLayer());
  EXPECT_EQ(effect.creation().code, HX_ERR_MISSING_SUITE);
  Operations::Get().FailNone();
  EXPECT_TRUE(effect.Press(kStart).ok());  // makes the instance that could not be had
  EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
  EXPECT_EQ(Session::StatusOf(effect), 8);
}

}  // namespace
}  // namespace calmframe::host
