#include <vector>

#include "platform/hx/hx_suites.h"
#include "tests/host/tour/played_plugin.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;

// A status that could not be told keeps a host waiting.
constexpr auto kPatience = 1500ms;

const ShakyClip kClip{96, 64, 8, "short clip"};

class TourFaults : public PlayedPlugin {
 protected:
  // Codes of all commands but those of the idle loop.
  std::vector<HX_Err> Play() {
    std::vector<HX_Err> codes;
    Effect& effect = session().Apply(MakeLayer(kClip));
    codes.push_back(effect.creation().code);
    session().TickUntilSettled(kPatience);
    codes.push_back(effect.SetParam(kFraming, 2).code);
    session().TickUntilSettled(kPatience);
    const auto renderer = effect.MakeRenderer();
    codes.push_back(renderer->result().code);
    codes.push_back(renderer->Direct({3}).result.code);
    codes.push_back(renderer->Planned({3, 16}).result.code);
    SavedEffect saved;
    codes.push_back(effect.Save(&saved).code);
    codes.push_back(effect.Tick().code);
    faulty_ = &effect;
    return codes;
  }

  // With the fault gone the effect works as if nothing had been.
  void Recover() {
    Operations::Get().FailNone();
    session().TickUntilSettled(kPatience);
    if (Enabled(*faulty_, kAnalyze)) {
      EXPECT_TRUE(faulty_->Press(kAnalyze).ok());
    }
    EXPECT_EQ(Settle(*faulty_), 8);
    EXPECT_TRUE(faulty_->MakeRenderer()->Planned({3}).pixels);
    session().Remove(*faulty_);
    EXPECT_EQ(Ledger::Get().mistakes(), std::vector<std::string>());  // a job may hold suites yet
    EXPECT_EQ(host().handles().count(), 1u);                          // the plug-in's global data
    EXPECT_EQ(host().worlds().count(), 0u);
    EXPECT_EQ(host().opaque_data().uses(), 0u);
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

TEST_F(TourFaults, AFailingOperationIsSurvivedWhicheverItIs) {
  const std::uint64_t before = Operations::Get().count();
  for (const HX_Err code : Play()) EXPECT_EQ(code, 0);
  const std::uint64_t operations = Operations::Get().count() - before;
  Recover();
  // Early ones one by one, then fewer and fewer; the job's thread makes their order vary anyway.
  const char* all = std::getenv("CALMFRAME_ALL_FAULTS");
  for (std::uint64_t n = 1; n <= operations; n += all ? 1 : 1 + n / 6) {
    SCOPED_TRACE(n);
    Operations::Get().FailNth(static_cast<std::int64_t>(n));
    Play();
    Recover();
    if (HasFailure()) break;
  }
}

}  // namespace
}  // namespace calmframe::host
