#include <cstdlib>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/hx/hx_suites.h"
#include "tests/contract/played_plugin.h"

namespace calmframe::host {
namespace {

// A status that could not be told keeps a host waiting.
constexpr auto kPatience = 1000ms;

const ShakyClip kClip{96, 64, 6, "short clip"};

class TourFaults : public PlayedPlugin {
 protected:
  // From the making of two effects to the end of one. A command that fails says why, by a code of
  // its own or by a message.
  void Play() {
    const auto expect_clear = [](const CommandResult& result) {
      static const std::set<HX_Err> kClear = {HX_ERR_NONE,        kFaultCode,
                                              HX_ERR_MEMORY,      HX_ERR_MISSING_SUITE,
                                              HX_ERR_HANDLE_LOCK, HX_ERR_NO_INSTANCE};
      EXPECT_TRUE(kClear.count(result.code) || !result.message.empty()) << result.code;
      EXPECT_TRUE(result.code != HX_ERR_MISSING_SUITE ||
                  result.message == "Not able to acquire OVK Suite.")
          << result.message;
    };
    Effect& effect = session().Apply(MakeLayer(kClip));
    Effect& other = session().Apply(MakeLayer(kClip));
    expect_clear(effect.creation());
    session().TickUntilSettled(kPatience);
    expect_clear(effect.SetParam(kFraming, 2));
    session().TickUntilSettled(kPatience);
    {
      const auto renderer = effect.MakeRenderer();
      expect_clear(renderer->result());
      expect_clear(renderer->Direct({3}).result);
      expect_clear(renderer->Planned({3, 16}).result);
    }
    SavedEffect saved;
    expect_clear(effect.Save(&saved));
    expect_clear(effect.Tick());
    session().Remove(other);
    faulty_ = &effect;
  }

  // With the fault gone the effect works as if nothing had been.
  void Recover() {
    Operations::Get().FailNone();
    Bring(*faulty_, kPatience);
    session().Remove(*faulty_);
    ExpectNothingHeld();
  }

  Effect* faulty_ = nullptr;
};

TEST_F(TourFaults, AMissingSuiteIsSurvived) {
  for (const char* suite :
       {HX_PARAM_UTILS_SUITE, HX_UTILITY_SUITE, HX_PRIVATE_EFFECT_SUITE, HX_APP_SUITE,
        HX_ADV_APP_SUITE, HX_WORLD_SUITE, HX_STRING_SUITE, HX_ANALYSIS_HOST_SUITE,
        HX_STABILIZER_HOST_SUITE, HX_OPAQUE_EFFECT_DATA_SUITE, HX_SEQUENCE_INFO_SUITE,
        HX_VIDEO_SEGMENT_SUITE, HX_VIDEO_SEGMENT_RENDER_SUITE, HX_CUTPIX_SUITE,
        HX_CUTPIX_CACHE_SUITE}) {
    SCOPED_TRACE(suite);
    Operations::Get().FailAlways(std::string("acquire ") + suite);
    Play();
    Recover();
  }
}

// A host that never heard of an analysis would not wait for its end.
TEST_F(TourFaults, AStatusThatCouldNotBeToldIsToldWithTheNextTick) {
  Session::PauseBackgroundWork(true);
  Operations::Get().FailNth(1, "Param Utils.SetParamValue");
  Effect& effect = session().Apply(MakeLayer(kClip));
  EXPECT_EQ(effect.Tick().code, kFaultCode);
  EXPECT_EQ(Session::StatusOf(effect), 0);
  EXPECT_TRUE(effect.Tick().ok());
  EXPECT_EQ(Session::StatusOf(effect), 4);
  Session::PauseBackgroundWork(false);
  EXPECT_EQ(Settle(effect), kReady);
  // One that was told of and can't begin is over.
  EXPECT_TRUE(effect.SetParam(kDetailedAnalysis, 1).ok());
  EXPECT_EQ(Session::StatusOf(effect), 4);
  Operations::Get().FailAlways("Video Segment.GetSegmentNodeAt");
  EXPECT_FALSE(effect.Tick().ok());
  EXPECT_EQ(Session::WorkOf(effect), Session::Work::none);
  Operations::Get().FailNone();
  EXPECT_TRUE(effect.Tick().ok());
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), kReady);
}

// The operations of a tour by name: the first, the second and the last, which other threads' make
// another one each time; all of them where the environment wants it.
TEST_F(TourFaults, AFailingOperationIsSurvivedWhicheverItIs) {
  Operations::Get().Record(true);
  Play();
  Operations::Get().Record(false);
  std::map<std::string, std::int64_t> counts;
  for (const std::string& name : Operations::Get().recorded()) ++counts[name];
  Recover();
  EXPECT_GT(counts.size(), 60u);
  for (const auto& [name, count] : counts) {
    for (std::int64_t n = 1; n <= count; ++n) {
      if (n > 2 && n < count && !std::getenv("CALMFRAME_ALL_FAULTS")) continue;
      SCOPED_TRACE(name + " " + std::to_string(n));
      Operations::Get().FailNth(n, name);
      Play();
      Recover();
      if (HasFailure()) return;
    }
  }
}

}  // namespace
}  // namespace calmframe::host
