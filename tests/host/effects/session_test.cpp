#include "host/effects/session.h"

#include <gtest/gtest.h>

#include <thread>

#include "host/base/operations.h"
#include "tests/host/effects/drawn_clip.h"
#include "tests/host/effects/probe.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;
using namespace probe;

// What the plug-in holds when all effects are gone and it was stopped.
std::string LeaksAfter(Host& host) {
  EXPECT_TRUE(host.Stop().ok());
  return host.LeakReport();
}

TEST(SessionTest, WorkRunsInTicksAndWritesItsControls) {
  Host host(PROBE_PLUGIN);
  host.handles().MoveOnUnlock(true);
  EXPECT_EQ(host.version(), 0x10000u);
  EXPECT_EQ(host.About().message, "A probe.");
  ASSERT_EQ(host.declarations().size(), static_cast<std::size_t>(kParams));
  EXPECT_STREQ(host.declarations()[kAmount].name, "Probe");  // localised, key and comment off
  {
    Session session(host);
    Effect& effect = session.Apply(MakeDrawnLayer());
    ASSERT_TRUE(effect.creation().ok());
    EXPECT_EQ(host.opaque_data().uses(), 2u);  // the standing renderer's too
    EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
    EXPECT_EQ(Session::StatusOf(effect), 0);

    EXPECT_FALSE(effect.Press(kStop).ok());  // disabled
    const std::uint64_t generation = effect.shared()->generation();
    ASSERT_TRUE(effect.Press(kStart).ok());
    EXPECT_EQ(Session::WorkOf(effect), Session::Work::analysing);
    EXPECT_GT(effect.shared()->generation(), generation);
    EXPECT_STREQ(effect.Param(kStop)->name, "working");
    int rounds = 0;
    EXPECT_EQ(session.TickUntilSettled(1h, [&] { return ++rounds == 4; }), Session::Wait::stopped);
    EXPECT_EQ(Session::WorkOf(effect), Session::Work::solving);
    EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
    EXPECT_EQ(Session::StatusOf(effect), 8);
    EXPECT_EQ(*ValueOf(*effect.Param(kStatus)), 308);
    EXPECT_TRUE(effect.Param(kStop)->ui_flags & HX_PARAM_UI_DISABLED);
  }
  EXPECT_EQ(LeaksAfter(host), "");
}

TEST(SessionTest, AMessageIsShownOnce) {
  Host host(PROBE_PLUGIN);
  Session session(host);
  Effect& effect = session.Apply(MakeDrawnLayer());
  effect.Press(kStart);
  EXPECT_EQ(effect.Press(kStop).message, "");  // of the refresh behind it
  EXPECT_EQ(effect.TakeMessages(), std::vector<std::string>{"Stopped"});
  EXPECT_TRUE(effect.TakeMessages().empty());
  EXPECT_TRUE(effect.SetParam(kAmount, 99).ok());
  EXPECT_EQ(host.user_interface().info(),
            std::make_pair(std::string("Amount"), std::string("100%")));
  EXPECT_FALSE(effect.SetParam(kStart, 1).ok());
  EXPECT_FALSE(effect.Press(kAmount).ok());
}

TEST(SessionTest, SavesLoadsAndDuplicatesWhileWorking) {
  Host host(PROBE_PLUGIN);
  host.handles().MoveOnUnlock(true);
  {
    Session session(host);
    const auto layer = MakeDrawnLayer();
    Effect& effect = session.Apply(layer);
    effect.SetParam(kMode, kGrown);
    effect.Press(kStart);
    session.Tick();
    SavedEffect saved;
    ASSERT_TRUE(effect.Save(&saved).ok());
    EXPECT_EQ(saved.match_name, "Probe");
    EXPECT_EQ(saved.values.at(100 + kMode), kGrown);
    ASSERT_FALSE(saved.instance.empty());
    Effect* copy = session.Duplicate(effect, layer);
    ASSERT_TRUE(copy);
    EXPECT_NE(copy->shared()->reference(), effect.shared()->reference());
    EXPECT_NE(copy->shared()->runtime_id(), effect.shared()->runtime_id());
    const auto chain = layer->state()->effects;
    ASSERT_EQ(chain.size(), 2u);
    EXPECT_EQ(chain[0].runtime_id, effect.shared()->runtime_id());
    EXPECT_EQ(chain[0].parameters, chain[1].parameters);
    EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
    EXPECT_EQ(Session::StatusOf(*copy), 8);
    session.Remove(effect);
    EXPECT_EQ(layer->state()->effects.size(), 1u);

    Effect& loaded = session.Load(MakeDrawnLayer(), saved);
    ASSERT_TRUE(loaded.creation().ok());
    EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
    EXPECT_EQ(Session::StatusOf(loaded), 8);
    SavedEffect damaged = saved;
    damaged.instance.pop_back();
    Effect& broken = session.Load(MakeDrawnLayer(), damaged);
    EXPECT_EQ(broken.creation().code, 77);
    EXPECT_EQ(broken.Tick().code, 77);  // tried again, not run on a flattened handle
    damaged.match_name = "Other";
    EXPECT_FALSE(session.Load(MakeDrawnLayer(), damaged).creation().ok());
  }
  EXPECT_EQ(LeaksAfter(host), "");
}

TEST(SessionTest, OtherThreadsPostAndWake) {
  Host host(PROBE_PLUGIN);
  Session session(host);
  Effect& effect = session.Apply(MakeDrawnLayer());
  bool ran = false;
  std::thread other([&] {
    EXPECT_THROW(session.Tick(), std::logic_error);
    session.Post([&] {
      ran = true;
      effect.Press(kStart);
    });
  });
  other.join();
  EXPECT_TRUE(host.WaitForWake(0ms));
  EXPECT_EQ(session.TickUntilSettled(1h), Session::Wait::settled);
  EXPECT_TRUE(ran);
  EXPECT_EQ(Session::StatusOf(effect), 8);
}

}  // namespace
}  // namespace calmframe::host
