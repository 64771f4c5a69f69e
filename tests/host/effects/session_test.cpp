#include "host/effects/session.h"

#include <deque>
#include <thread>
#include <utility>

#include "tests/host/effects/probe_test.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

enum : std::int32_t { kButton = 1, kAmount, kStatus };
constexpr std::int32_t kAmountDiskId = 20;

// An effect with an instance of two bytes, of which the second tells whether it is flattened, and
// with statuses that its ticks show one after the other.
class SessionTest : public ProbeTest {
 protected:
  SessionTest() {
    on[HX_CMD_DECLARE_PARAMS] = [](const Call& call) -> HX_Err {
      HX_ParamDef button{0, HX_PARAM_BUTTON, "Start", HX_PARAM_FLAG_SUPERVISED, 0, 0, {}};
      HX_ParamDef amount{kAmountDiskId, HX_PARAM_FLOAT_SLIDER, "Amount", 0x40, 0, 0, {}};
      amount.u.fs = {5, 0, 10, 0, 1, 5, 0.05f, 0, 0};
      HX_ParamDef status{Session::kStatusDiskId, HX_PARAM_FLOAT_SLIDER, "", 0, 512, 0, {}};
      status.u.fs = {0, 0, 2e9f, 0, 2000, 0, 0.05f, 0, 0};
      for (const HX_ParamDef& param : {button, amount, status}) {
        EXPECT_EQ(call.cb().add_param(nullptr, -1, &param), HX_ERR_NONE);
      }
      call.out->num_params = 4;
      return HX_ERR_NONE;
    };
    on[HX_CMD_CREATE_INSTANCE] = [this](const Call& call) { return NewInstance(call, 0); };
    on[HX_CMD_FLATTEN_INSTANCE] = [this](const Call& call) { return NewInstance(call, 1); };
    on[HX_CMD_RESTORE_INSTANCE] = [this](const Call& call) -> HX_Err {
      const HX_Handle old = call.in->instance_handle;
      if (old && host->handles().BytesOf(old) != std::vector<std::uint8_t>{0, 1}) return 77;
      return NewInstance(call, 0);
    };
    on[HX_CMD_DESTROY_INSTANCE] = [](const Call& call) -> HX_Err {
      if (call.in->instance_handle) call.cb().dispose_handle(call.in->instance_handle);
      call.out->instance_handle = nullptr;
      return HX_ERR_NONE;
    };
    on[HX_CMD_IDLE_TICK] = [this](const Call& call) -> HX_Err {
      if (statuses.empty()) return HX_ERR_NONE;
      call.params[kStatus]->u.fs.value = std::exchange(statuses[0], 0);
      call.params[kStatus]->change_flag = 1;
      statuses.pop_front();
      return HX_ERR_NONE;
    };
    Start();
  }

  HX_Err NewInstance(const Call& call, std::uint8_t flat) {
    if (call.in->instance_handle) call.cb().dispose_handle(call.in->instance_handle);
    call.in->instance_handle = call.out->instance_handle = host->handles().NewFrom({0, flat});
    return HX_ERR_NONE;
  }

  std::deque<double> statuses;
};

TEST_F(SessionTest, WorkRunsInTicksUntilItSettles) {
  Effect& effect = session->Apply(MakeDrawnLayer());
  ASSERT_TRUE(effect.creation().ok());
  statuses = {104, 204, 305, 407, 508};
  const std::uint64_t generation = effect.shared()->generation();
  session->Tick();
  EXPECT_EQ(Session::WorkOf(effect), Session::Work::analysing);
  EXPECT_GT(effect.shared()->generation(), generation);
  EXPECT_EQ(session->TickUntilSettled(1h, [&] { return Session::StatusOf(effect) == 5; }),
            Session::Wait::stopped);
  EXPECT_EQ(Session::WorkOf(effect), Session::Work::solving);
  session->Tick();
  EXPECT_EQ(Session::WorkOf(effect), Session::Work::solving);
  EXPECT_EQ(session->TickUntilSettled(1h), Session::Wait::settled);
  EXPECT_EQ(*ValueOf(*effect.Param(kStatus)), 508);
  statuses = {604};
  session->Tick();
  EXPECT_EQ(session->TickUntilSettled(0ms), Session::Wait::timed_out);
}

TEST_F(SessionTest, SavesLoadsAndDuplicates) {
  const auto layer = MakeDrawnLayer();
  Effect& effect = session->Apply(layer);
  const std::string unset = layer->state()->effects[0].parameters;
  effect.SetParam(kAmount, 7);
  EXPECT_NE(layer->state()->effects[0].parameters, unset);
  EXPECT_FALSE(effect.SetParam(kButton, 1).ok());
  EXPECT_FALSE(effect.Press(kAmount).ok());
  EXPECT_FALSE(effect.DeleteTracks({{1, 2}}).ok()) << "it knows of no tracks";
  SavedEffect saved;
  ASSERT_TRUE(effect.Save(&saved).ok());
  EXPECT_TRUE(effect.Tick().ok());
  EXPECT_EQ(saved.match_name, "Probe");
  EXPECT_EQ(saved.values.at(kAmountDiskId), 7);
  EXPECT_THAT(saved.instance, ElementsAre(0, 1));
  Effect* copy = session->Duplicate(effect, layer);
  ASSERT_TRUE(copy);
  EXPECT_NE(copy->shared()->reference(), effect.shared()->reference());
  const auto chain = layer->state()->effects;
  ASSERT_EQ(chain.size(), 2u);
  EXPECT_EQ(chain[0].runtime_id, effect.shared()->runtime_id());
  EXPECT_NE(chain[1].runtime_id, chain[0].runtime_id);
  EXPECT_EQ(chain[0].parameters, chain[1].parameters);
  session->Remove(effect);
  EXPECT_EQ(layer->state()->effects.size(), 1u);

  Effect& loaded = session->Load(MakeDrawnLayer(), saved);
  EXPECT_TRUE(loaded.creation().ok());
  EXPECT_EQ(*ValueOf(*loaded.Param(kAmount)), 7);
  saved.instance.pop_back();
  Effect& broken = session->Load(MakeDrawnLayer(), saved);
  EXPECT_EQ(broken.creation().code, 77);
  EXPECT_EQ(broken.Tick().code, 77) << "tried again, not run on a flattened handle";
  saved.match_name = "Other";
  EXPECT_FALSE(session->Load(MakeDrawnLayer(), saved).creation().ok());
}

// Side by side: what the plug-in asks for is done to the one it is about.
TEST_F(SessionTest, TwoHostsHaveLoopsAndDeclarationsOfTheirOwn) {
  on[HX_CMD_DECLARE_PARAMS] = [](const Call& call) -> HX_Err {
    HX_ParamDef param{};
    param.kind = HX_PARAM_CHECKBOX;
    call.out->num_params = 2;
    return call.cb().add_param(nullptr, -1, &param);
  };
  auto other = std::make_unique<Host>(Probe());
  EXPECT_EQ(other->declarations().size(), 2u);
  on.clear();
  const Host third(Probe());
  EXPECT_EQ(third.declarations().size(), 1u);
  Session others(*other);
  HX_EffectRef effect = nullptr;
  on[HX_CMD_CREATE_INSTANCE] = [&](const Call& call) -> HX_Err {
    effect = call.ref();
    call.Suite<HX_AdvAppSuite1>(HX_ADV_APP_SUITE, HX_ADV_APP_SUITE_VERSION)->RefreshAllWindows();
    return HX_ERR_NONE;
  };
  others.Apply(MakeDrawnLayer());
  EXPECT_EQ(other->user_interface().refreshes(), 1u);
  EXPECT_EQ(host->user_interface().refreshes(), 0u);
  const HX_PrivateEffectSuite3* suite = nullptr;
  on[HX_CMD_IDLE_TICK] = [&](const Call& call) -> HX_Err {
    suite =
        call.Suite<HX_PrivateEffectSuite3>(HX_PRIVATE_EFFECT_SUITE, HX_PRIVATE_EFFECT_SUITE_VERSION)
            .get();
    return HX_ERR_NONE;
  };
  others.Tick();
  ASSERT_EQ(suite->ForceRerender(effect), HX_ERR_NONE);  // on no host's command
  EXPECT_TRUE(other->wake()->Wait(0ms));
  EXPECT_FALSE(host->wake()->Wait(0ms));
}

TEST_F(SessionTest, OtherThreadsPostAndWake) {
  bool ran = false;
  std::jthread([&] {
    EXPECT_THROW(session->Tick(), std::logic_error);
    session->Post([&] { ran = true; });
  }).join();
  EXPECT_TRUE(host->wake()->Wait(0ms));
  EXPECT_FALSE(host->wake()->Wait(0ms));
  session->Tick();
  EXPECT_TRUE(ran);
}

}  // namespace
}  // namespace calmframe::host
