#include <malloc.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cstdio>
#include <functional>
#include <memory>
#include <mutex>
#include <random>
#include <shared_mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/tessel/threads.h"
#include "tests/contract/played_plugin.h"

namespace calmframe::host {
namespace {

constexpr std::int64_t kPlayed = 30, kMostStart = 4;
constexpr std::size_t kMostEffects = 4;
const ShakyClip kClips[] = {{160, 120, kPlayed, "played with"}, {128, 96, kPlayed, "and another"}};

class TourThreads : public PlayedPlugin {
 protected:
  // A user acts on effects, at first one on each of both layers, while other threads render them
  // and read their exports: until `enough`, asked before each act.
  void Storm(std::mt19937& random, const std::function<bool()>& enough) {
    layers_ = {MakeLayer(kClips[0]), MakeLayer(kClips[1])};
    for (const auto& layer : layers_) Keep(&session().Apply(layer));
    ends_ = false;
    std::vector<std::jthread> threads;
    for (int t = 0; t < 4; ++t) {
      threads.emplace_back([this, seed = static_cast<unsigned>(random())] { RenderOn(seed); });
    }
    while (!enough() && !HasFailure()) Act(random);
    Drop(*session().effects().back());  // in the middle of whatever goes on
    ends_ = true;
    threads.clear();
    SwitchFaultsOff();
    Session::PauseBackgroundWork(false);
    for (const auto& layer : layers_) Refuse(*layer, "");
  }

  // What render threads choose from. They make their renderers while the effect stands; then they
  // may go on without it.
  std::shared_ptr<TimelineEffect> Any(std::mt19937& random) {
    return standing_.empty() ? nullptr : standing_[random() % standing_.size()];
  }

  void RenderOn(unsigned seed) {
    std::mt19937 random(seed);
    while (!ends_) {
      std::shared_ptr<TimelineEffect> effect;
      std::unique_ptr<Renderer> renderer;
      {
        const std::shared_lock lock(mutex_);
        if ((effect = Any(random))) {
          renderer = std::make_unique<Renderer>(host(), effect);
          ReadExports(*effect);
        }
      }
      for (unsigned i = 0; renderer && i < random() % 8; ++i) {
        const bool direct = random() % 3 == 0;
        RenderRequest request{static_cast<std::int64_t>(random() % (kPlayed - kMostStart))};
        request.bit_depth = 8 << random() % (direct ? 2 : 3);
        request.downsample.den = 1 + random() % 2;
        if (random() % 4 == 0) request.part = HX_Rect{10, 10, 50, 40};
        const RenderedFrame frame = Render(*renderer, direct, request);
        ++rendered_;
        if (frame.pixels) continue;
        // The frames of one that was taken off its layer have no source any more.
        const std::shared_lock lock(mutex_);
        if (std::count(standing_.begin(), standing_.end(), effect) == 0) break;
        if (!faults_ && failed_++ == 0) ADD_FAILURE() << frame.result.Line("a render");
      }
    }
  }

  // As a renderer outside of the plug-in; the standing renderer of an effect keeps its block.
  void ReadExports(const TimelineEffect& effect) {
    const void* const block = host().opaque_data().Peek(effect.reference());
    exports().allow_cuda_rendering(block);
    DataOf(block);
  }

  void Keep(Effect* effect) {  // null: none was made
    if (!effect) return;
    ++instances_;
    const std::lock_guard lock(mutex_);
    standing_.push_back(effect->shared());
  }
  void Drop(Effect& effect) {
    const std::lock_guard lock(mutex_);
    std::erase(standing_, effect.shared());
    session().Remove(effect);
  }

  std::array<std::atomic<bool>*, 6> Switches() {
    MediaFaults& media = host().media().faults;
    return {&media.null_frame,        &media.early_callback,   &media.render_refused,
            &media.identifier_failed, &media.property_missing, &media.node_missing};
  }
  // Something of the host goes wrong from now on, or nothing does.
  void SwitchFaults(std::mt19937& random) {
    const unsigned which = random() % 12;
    if (which < Switches().size()) {
      *Switches()[which] = true;
    } else if (which == 6) {
      host().media().faults.late_callback_ms = 20;
    } else if (which == 7) {
      Operations::Get().FailNth(1 + random() % 200);
    } else {
      SwitchFaultsOff();
    }
  }
  void SwitchFaultsOff() {
    Operations::Get().FailNone();
    for (std::atomic<bool>* fault : Switches()) *fault = false;
    host().media().faults.late_callback_ms = 0;
  }

  // One thing that a user may do.
  void Act(std::mt19937& random) {
    const auto& effects = session().effects();
    const boost::shared_ptr<Layer>& layer = layers_[random() % layers_.size()];
    Effect& effect = *effects[random() % effects.size()];
    const bool room = effects.size() < kMostEffects;
    if (faults_ && random() % 8 == 0) SwitchFaults(random);
    const std::function<void()> acts[] = {
        [&] { effect.Press(kAnalyze); },  // refused where it is disabled
        [&] { effect.Press(kAnalyze); },
        [&] { effect.Press(kCancel); },
        [&] { effect.SetParam(kFraming, 1 + random() % 4); },
        [&] { effect.SetParam(kSmoothness, random() % 100); },
        [&] { EXPECT_TRUE(effect.Save(&saved_).ok() || faults_); },
        [&] { Session::PauseBackgroundWork(random() % 2 == 0); },
        [&] {
          layer->Change([start = random() % (kMostStart + 1)](LayerState& state) {
            state.start_frame = static_cast<std::int32_t>(start);
            state.length = static_cast<std::int32_t>(kPlayed - kMostStart);
          });
        },
        [&] { Refuse(*layer, random() % 2 ? "" : "Not now."); },
        [&] { Keep(room ? &session().Apply(layer) : nullptr); },
        [&] { Keep(room && !saved_.instance.empty() ? &session().Load(layer, saved_) : nullptr); },
        [&] { Keep(room ? session().Duplicate(effect, layer) : nullptr); },
        [&] {
          if (effects.size() > 1) Drop(effect);
        }};
    const std::size_t which = random() % 19;
    if (which < std::size(acts)) return acts[which]();
    session().Tick();  // as a host's loop does
    host().wake()->Wait(2ms);
  }

  std::vector<boost::shared_ptr<Layer>> layers_;
  std::atomic<bool> ends_{false};
  std::atomic<int> rendered_{0}, failed_{0};
  bool faults_ = false;  // constant while there are threads
  int instances_ = 0;    // that were made

 private:
  std::shared_mutex mutex_;
  std::vector<std::shared_ptr<TimelineEffect>> standing_;  // guarded by mutex_
  SavedEffect saved_;
};

// Whatever the user does to effects meanwhile, renders get a frame each time; and in the end each
// of the effects can be brought to steadied frames.
TEST_F(TourThreads, RendersGoOnWhileEffectsArePlayedWith) {
  std::mt19937 random(7);
  int acts = Setting("CALMFRAME_STRESS_ACTS", 600);
  Storm(random, [&] { return acts-- == 0; });
  EXPECT_GT(rendered_, 0);
  for (const auto& effect : session().effects()) Bring(*effect);
}

// Effects come and go at random while faults do, until so many were made; then nothing is left of
// those that went, memory has not grown since a quarter of them, and those that stand give the very
// frames of one that was left alone.
TEST_F(TourThreads, ASoakLosesNothingAndLeavesNothing) {
  const int wanted = Setting("CALMFRAME_SOAK_INSTANCES", 20);
  std::mt19937 random(static_cast<unsigned>(Setting("CALMFRAME_SEED", 1)));
  faults_ = true;
  std::size_t held_early = 0;
  for (int quarter = 1; quarter <= 4; ++quarter) {
    Storm(random, [&] { return 4 * instances_ >= quarter * wanted; });
    for (const auto& layer : layers_) Trim(*layer, 0, kPlayed);
    const std::size_t survivors = session().effects().size();
    for (std::size_t i = 0; i < survivors; ++i) {
      SCOPED_TRACE("instance " + std::to_string(instances_));
      Effect& effect = *session().effects()[i];
      const Frames frames = FramesOf(effect);
      const bool first = effect.shared()->layer() == layers_[0];
      Effect& fresh = session().Load(MakeLayer(kClips[first ? 0 : 1]),
                                     {kMatchName, effect.shared()->params().Values(), {}});
      ExpectSame(frames, FramesOf(fresh));
      session().Remove(fresh);
    }
    while (!session().effects().empty()) Drop(*session().effects().back());
    tessel::threads::Shutdown();  // jobs that wait for joiners
    ExpectNothingHeld();
    host().media().SetCacheBytes(0);
    host().media().SetCacheBytes(Settings().media.cache_bytes);
    malloc_trim(0);
    const std::size_t held = mallinfo2().uordblks + mallinfo2().hblkhd;
    std::printf("%d instances, %d frames, %zu KiB held\n", instances_, rendered_.load(),
                held >> 10);
    if (quarter == 1) held_early = held;
    EXPECT_LT(held, held_early + (std::size_t{2} << 20));
    if (HasFailure()) return;
  }
}

}  // namespace
}  // namespace calmframe::host
