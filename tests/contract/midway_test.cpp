#include <functional>
#include <optional>
#include <string>

#include "tests/contract/played_plugin.h"
#include "tests/support/held_work.h"

// What a user does in the middle of everything: the same at each of these places of an effect's
// way from its making to its settled frames.

namespace calmframe::host {
namespace {

using Work = Session::Work;

constexpr std::int64_t kFrames = 8;

struct Place {
  const char* name;
  Work work;                    // that is under way
  std::int64_t frame = -1;      // whose drawing is held
  const char* stage = nullptr;  // of the solve that is held
  int ticks = 0;                // beyond what leads there
};

constexpr Place kPlaces[] = {
    {"applied", Work::analysing},
    {"first frame", Work::analysing, 0},
    {"first frame, seen", Work::analysing, 0, nullptr, 2},
    {"third frame", Work::analysing, 2, nullptr, 1},
    {"last frame", Work::analysing, kFrames - 1, nullptr, 1},
    {"analysed, not seen", Work::analysing, kFrames},
    {"analysed, seen once", Work::analysing, kFrames, nullptr, 1},
    {"factorization", Work::solving, -1, "Begin - RunFactorization()"},
    {"warps", Work::solving, -1, "Begin - MakeWarperUsingFactorization()", 2},
    {"crop", Work::solving, -1, "End - RunCropper()"},
    {"settled", Work::none},
};

class Midway : public PlayedPlugin {
 protected:
  using Action = std::function<void(const Place& place, Effect& effect)>;

  // An effect of its own clip at each place, and what is done to it there, while the work is held
  // and on after it is let go. Whatever stands then is usable.
  void AtEachPlace(const Action& action) {
    for (const Place& place : kPlaces) {
      SCOPED_TRACE(place.name);
      Hold hold;
      stages_.Take();
      std::optional<std::jthread> release;
      ShakyClip clip{96, 64, kFrames, place.name};
      clip.on_draw = [&](std::int64_t frame) {
        if (frame == place.frame % kFrames) hold.Pass();
      };
      if (place.stage) stages_.HoldAt(place.stage, &hold);
      layer_ = MakeLayer(clip);
      Effect& effect = session().Apply(layer_);
      ASSERT_TRUE(effect.creation().ok());
      if (place.frame >= 0 || place.stage) {
        Reach(place, hold);
        for (int i = 0; i < place.ticks; ++i) session().Tick();
        release = hold.ReleaseSoon();
      } else if (place.work == Work::none) {
        ASSERT_EQ(Settle(effect), kReady);
      }
      action(place, effect);
      for (const auto& standing : session().effects()) ExpectUsable(*standing);
      release.reset();
      while (!session().effects().empty()) session().Remove(*session().effects().back());
      // Renders of the clip may be under way, and they hold on to `hold`.
      while (host().media().counts().requests > 0) std::this_thread::sleep_for(1ms);
      ExpectNothingHeld();
      if (HasFailure()) return;
    }
  }

  void Reach(const Place& place, Hold& hold) {
    while (!hold.Reached(5ms)) session().Tick();
    if (place.frame < kFrames) return;
    session().Tick();  // sees it run
    hold.Release();
    // A job lets its frames go at its end.
    while (host().media().counts().references > 0) std::this_thread::sleep_for(1ms);
  }

  void ExpectUsable(Effect& effect) {
    Bring(effect);
    EXPECT_FALSE(Enabled(effect, kAnalyze));
    EXPECT_FALSE(Enabled(effect, kCancel));
    EXPECT_TRUE(effect.TakeMessages().empty());
  }

  boost::shared_ptr<Layer> layer_;  // of the place
  SolveStages stages_;
};

TEST_F(Midway, AnAnalysisIsCancelledAndASolveIsNot) {
  AtEachPlace([this](const Place& place, Effect& effect) {
    EXPECT_EQ(Enabled(effect, kCancel), place.work == Work::analysing);
    EXPECT_EQ(effect.Press(kCancel).ok(), place.work == Work::analysing);
    if (place.work == Work::analysing) {
      EXPECT_EQ(host().user_interface().info().first, "Stabilizer analysis canceled.");
      EXPECT_TRUE(Enabled(effect, kAnalyze));
      EXPECT_EQ(Settle(effect), 1);
      EXPECT_EQ(stages_.Take(), "");
    } else {
      EXPECT_EQ(Settle(effect), kReady);
    }
  });
}

TEST_F(Midway, DestroyedItLeavesNothingBehind) {
  AtEachPlace([this](const Place&, Effect& effect) {
    session().Remove(effect);
    session().Apply(MakeLayer({96, 64, kFrames, "afterwards"}));
  });
}

TEST_F(Midway, SavedAndDuplicatedItGoesOn) {
  AtEachPlace([this](const Place&, Effect& effect) {
    Saved(effect);
    EXPECT_TRUE(session().Duplicate(effect, MakeLayer({96, 64, kFrames, "copy"})));
  });
}

TEST_F(Midway, DetailedAnalysisStartsAgain) {
  AtEachPlace([this](const Place&, Effect& effect) {
    EXPECT_TRUE(effect.SetParam(kDetailedAnalysis, 1).ok());
    EXPECT_EQ(Session::WorkOf(effect), Work::analysing);
    EXPECT_EQ(Settle(effect), kReady);
  });
}

TEST_F(Midway, WhatIsSolvedIsWhatTheControlsSayAtTheEnd) {
  AtEachPlace([this](const Place&, Effect& effect) {
    effect.SetParam(kSmoothness, 80);
    effect.SetParam(kFraming, 1);
    EXPECT_EQ(Settle(effect), kReady);
    EXPECT_NE(stages_.Take(), "");
    const auto frame = effect.MakeRenderer()->Planned({3}).OnLayer();
    Effect& fresh = session().Load(MakeLayer({96, 64, kFrames, "fresh"}),
                                   {kMatchName, effect.shared()->params().Values(), {}});
    EXPECT_EQ(Settle(fresh), kReady);
    EXPECT_EQ(Difference(*frame, *fresh.MakeRenderer()->Planned({3}).OnLayer()), 0);
  });
}

TEST_F(Midway, AnEffectBeneathOffersAnalyzeOnceTheWorkIsDone) {
  AtEachPlace([this](const Place& place, Effect& effect) {
    layer_->InsertEffect(0, OtherEffect());
    Settle(effect);
    session().Tick();
    // The first tick alone asks what stands beneath.
    const bool known = std::string(place.name) == "applied";
    EXPECT_EQ(Enabled(effect, kAnalyze), !known);
  });
}

TEST_F(Midway, ARefusalHealsWithItsCause) {
  AtEachPlace([this](const Place&, Effect& effect) {
    Refuse(*layer_, "Not this layer.");
    for (int i = 0; i < 3; ++i) session().Tick();
    EXPECT_TRUE(effect.MakeRenderer()->Planned({3}).pixels);
    Refuse(*layer_, "");
    session().Tick();
    effect.TakeMessages();
  });
}

TEST_F(Midway, BackgroundWorkRestsWhileTheHostPauses) {
  AtEachPlace([this](const Place& place, Effect& effect) {
    Session::PauseBackgroundWork(true);
    for (int i = 0; i < 5; ++i) session().Tick();
    EXPECT_TRUE(effect.MakeRenderer()->Planned({7}).pixels);
    if (place.frame < kFrames - 1 && place.work == Work::analysing) {
      EXPECT_EQ(Session::WorkOf(effect), Work::analysing);
    }
    Session::PauseBackgroundWork(false);
  });
}

TEST_F(Midway, ATrimmedLayerOffersAnalyzeAndNeedsNone) {
  AtEachPlace([this](const Place&, Effect& effect) {
    layer_->Change([](LayerState& state) { state.length = kFrames - 2; });
    EXPECT_EQ(Settle(effect), kReady);
    session().Tick();
    EXPECT_TRUE(Enabled(effect, kAnalyze));
  });
}

}  // namespace
}  // namespace calmframe::host
