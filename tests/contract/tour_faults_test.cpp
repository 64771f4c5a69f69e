#include <cstdlib>
#include <map>
#include <set>
#include <string>

#include "tests/contract/short_tour.h"

namespace calmframe::host {
namespace {

class TourFaults : public ShortTour {
 protected:
  // Of a tour: a command that failed said why, by a code of its own or by a message. With the fault
  // gone the effect works as if nothing had been.
  void ExpectRecovery() {
    static const std::set<HX_Err> kClear = {HX_ERR_NONE,        kFaultCode,
                                            HX_ERR_MEMORY,      HX_ERR_MISSING_SUITE,
                                            HX_ERR_HANDLE_LOCK, HX_ERR_NO_INSTANCE};
    for (const CommandResult& result : results_) {
      EXPECT_TRUE(kClear.count(result.code) || !result.message.empty()) << result.code;
      EXPECT_TRUE(result.code != HX_ERR_MISSING_SUITE ||
                  result.message == "Not able to acquire OVK Suite.")
          << result.message;
    }
    EXPECT_EQ(unfinished_, 0);
    Operations::Get().FailNone();
    Bring(*session().effects().front(), kPatience);
    while (!session().effects().empty()) session().Remove(*session().effects().back());
    ExpectNothingHeld();
  }
};

// A host that never heard of an analysis would not wait for its end.
TEST_F(TourFaults, AStatusThatCouldNotBeToldIsToldWithTheNextTick) {
  Session::PauseBackgroundWork(true);
  Operations::Get().FailNth(1, "Param Utils.SetParamValue");
  Effect& effect = session().Apply(ShortLayer());
  EXPECT_EQ(effect.Tick().code, kFaultCode);
  EXPECT_EQ(Session::StatusOf(effect), 0);
  EXPECT_TRUE(effect.Tick().ok());
  EXPECT_EQ(Session::StatusOf(effect), 4);
  Session::PauseBackgroundWork(false);
  EXPECT_EQ(Settle(effect), kReady);
}

// The operations of a tour by name: the first, the second and the last, which other threads' make
// another one each time; all of them where the environment wants it. And without each suite.
TEST_F(TourFaults, AFailingOperationIsSurvivedWhicheverItIs) {
  Operations::Get().Record(true);
  Play(ShortLayer());
  Operations::Get().Record(false);
  ExpectRecovery();
  std::map<std::string, std::int64_t> counts;
  for (const std::string& name : Operations::Get().recorded()) ++counts[name];
  EXPECT_GT(counts.size(), 60u);
  int suites = 0;
  for (const auto& [name, count] : counts) {
    const bool suite = name.rfind("acquire ", 0) == 0;
    suites += suite;
    for (std::int64_t n = suite ? 0 : 1; n <= count; ++n) {  // 0: always
      if (n > 2 && n < count && !std::getenv("CALMFRAME_ALL_FAULTS")) continue;
      SCOPED_TRACE(name + " " + std::to_string(n));
      n == 0 ? Operations::Get().FailAlways(name) : Operations::Get().FailNth(n, name);
      Play(ShortLayer());
      ExpectRecovery();
      if (HasFailure()) return;
    }
  }
  EXPECT_EQ(suites, 16);
}

}  // namespace
}  // namespace calmframe::host
