#include <malloc.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <random>
#include <shared_mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/tessel/threads.h"
#include "tests/contract/played_plugin.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;

constexpr std::int64_t kFrames = 30, kMostStart = 4;
constexpr std::size_t kMostEffects = 4;

class TourThreads : public PlayedPlugin {
 protected:
  // Of a test run; the environment may want more.
  static std::chrono::seconds Length() {
    const char* const seconds = std::getenv("CALMFRAME_STRESS_SECONDS");
    return std::chrono::seconds(seconds ? std::atoi(seconds) : 5);
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
        if ((effect = Any(random))) renderer = std::make_unique<Renderer>(host(), effect);
      }
      for (unsigned i = 0; renderer && i < random() % 8; ++i) {
        const bool direct = random() % 3 == 0;
        RenderRequest request{static_cast<std::int64_t>(random() % (kFrames - kMostStart))};
        request.bit_depth = 8 << random() % (direct ? 2 : 3);
        request.downsample.den = 1 + random() % 2;
        if (random() % 4 == 0) request.part = HX_Rect{10, 10, 50, 40};
        const RenderedFrame frame = direct ? renderer->Direct(request) : renderer->Planned(request);
        ++rendered_;
        if (frame.pixels) continue;
        // The frames of one that was taken off its layer have no source any more.
        const std::shared_lock lock(mutex_);
        if (std::count(standing_.begin(), standing_.end(), effect) == 0) break;
        if (!faults_) Fail(frame.result.Line(direct ? "direct" : "planned"));
      }
    }
  }

  // A renderer outside of the plug-in; the standing renderer of an effect keeps its block.
  void ReadExportsOn(unsigned seed) {
    std::mt19937 random(seed);
    const PluginExports& exports = host().library().exports();
    while (!ends_) {
      const std::shared_lock lock(mutex_);
      const auto effect = Any(random);
      if (!effect) continue;
      const void* block = host().opaque_data().Peek(effect->reference());
      exports.allow_cuda_rendering(block);
      std::int32_t words[8];
      float bounds[4];
      exports.get_stabilizer_data(block, &words[0], &words[1], &words[2], &words[3], &words[4],
                                  &words[5], &bounds[0], &bounds[1], &bounds[2], &bounds[3],
                                  &words[6], &words[7]);
    }
  }

  void Fail(const std::string& why) {
    if (failed_++ == 0) ADD_FAILURE() << why;
  }

  void Keep(Effect& effect) {
    ++instances_;
    const std::lock_guard lock(mutex_);
    standing_.push_back(effect.shared());
  }
  void Drop(Effect& effect) {
    const std::lock_guard lock(mutex_);
    std::erase(standing_, effect.shared());
    session().Remove(effect);
  }

  // Something of the host goes wrong from now on, or nothing does.
  void SwitchFaults(std::mt19937& random) {
    MediaFaults& media = host().media().faults;
    switch (random() % 12) {
      case 0:
        return Operations::Get().FailNth(1 + random() % 200);
      case 1:
        media.null_frame = true;
        return;
      case 2:
        media.early_callback = true;
        return;
      case 3:
        media.late_callback_ms = 20;
        return;
      case 4:
        media.render_refused = true;
        return;
      case 5:
        media.identifier_failed = true;
        return;
      case 6:
        media.property_missing = true;
        return;
      case 7:
        media.node_missing = true;
        return;
      default:
        return SwitchFaultsOff();
    }
  }
  void SwitchFaultsOff() {
    Operations::Get().FailNone();
    MediaFaults& media = host().media().faults;
    for (std::atomic<bool>* fault :
         {&media.null_frame, &media.early_callback, &media.render_refused, &media.identifier_failed,
          &media.property_missing, &media.node_missing}) {
      *fault = false;
    }
    media.late_callback_ms = 0;
  }

  // One thing that a user may do.
  void Act(std::mt19937& random, const std::vector<boost::shared_ptr<Layer>>& layers) {
    ++acts_;
    if (faults_ && random() % 8 == 0) SwitchFaults(random);
    const auto& effects = session().effects();
    const boost::shared_ptr<Layer>& layer = layers[random() % layers.size()];
    Effect& effect = *effects[random() % effects.size()];
    const bool room = effects.size() < kMostEffects;
    switch (random() % 19) {
      case 0:
      case 1:
        effect.Press(kAnalyze);  // refused where it is disabled
        break;
      case 2:
        effect.Press(kCancel);
        break;
      case 3:
        effect.SetParam(kFraming, 1 + random() % 4);
        break;
      case 4:
        effect.SetParam(kSmoothness, random() % 100);
        break;
      case 5:
        EXPECT_TRUE(effect.Save(&saved_).ok() || faults_);
        break;
      case 6:
        Session::PauseBackgroundWork(random() % 2 == 0);
        break;
      case 7:
        layer->Change([&](LayerState& state) {
          state.start_frame = static_cast<std::int32_t>(random() % (kMostStart + 1));
          state.length = static_cast<std::int32_t>(kFrames - kMostStart);
        });
        break;
      case 8:
        layer->Change([&](LayerState& state) { state.refusal = random() % 2 ? "" : "Not now."; });
        break;
      case 9:
        if (room) Keep(session().Apply(layer));
        break;
      case 10:
        if (room && !saved_.instance.empty()) Keep(session().Load(layer, saved_));
        break;
      case 11:
        if (Effect* const copy = room ? session().Duplicate(effect, layer) : nullptr) Keep(*copy);
        break;
      case 12:
        if (effects.size() > 1) Drop(effect);
        break;
      default:
        session().Tick();
        std::this_thread::sleep_for(2ms);
    }
  }

  // What a user does about effects that something went wrong with.
  void Rouse() {
    for (const auto& effect : session().effects()) {
      effect->SetParam(kSmoothness, 29);  // a solve that failed is tried again
    }
    session().TickUntilSettled(2000ms);  // a status that could not be told keeps a host waiting
    for (const auto& effect : session().effects()) {
      if (Enabled(*effect, kAnalyze)) {
        EXPECT_TRUE(effect->Press(kAnalyze).ok());
      }
    }
  }

  // The frames of an effect whose tracks are rounded, as they are in a saved one, anew solved.
  std::vector<std::shared_ptr<WorldBuffer>> FramesOf(Effect& effect) {
    effect.SetParam(kSmoothness, 30);
    Settle(effect);
    if (Enabled(effect, kAnalyze)) {  // what was under way was of another range
      EXPECT_TRUE(effect.Press(kAnalyze).ok());
    }
    EXPECT_EQ(Settle(effect), 8);
    SavedEffect saved;
    EXPECT_TRUE(effect.Save(&saved).ok());
    effect.SetParam(kSmoothness, 31);
    EXPECT_EQ(Settle(effect), 8);
    const auto renderer = effect.MakeRenderer();
    return {renderer->Planned({7, 16}).OnLayer(), renderer->Direct({8}).OnLayer()};
  }

  std::atomic<bool> ends_{false};
  std::atomic<int> rendered_{0}, failed_{0}, acts_{0};
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
  const std::vector<boost::shared_ptr<Layer>> layers = {
      MakeLayer({160, 120, kFrames, "played with"}), MakeLayer({128, 96, kFrames, "and another"})};
  for (const auto& layer : layers) Keep(session().Apply(layer));
  std::vector<std::jthread> threads;
  for (unsigned t = 0; t < 4; ++t) threads.emplace_back([this, t] { RenderOn(t); });
  threads.emplace_back([this] { ReadExportsOn(99); });
  std::mt19937 random(7);
  const auto end = std::chrono::steady_clock::now() + Length();
  while (std::chrono::steady_clock::now() < end && !HasFailure()) Act(random, layers);
  // In the middle of whatever goes on.
  Drop(*session().effects().back());
  ends_ = true;
  threads.clear();
  EXPECT_GT(rendered_, 0);
  Session::PauseBackgroundWork(false);
  for (const auto& layer : layers) {
    layer->Change([](LayerState& state) { state.refusal.clear(); });
  }
  for (const auto& effect : session().effects()) {
    Settle(*effect);
    if (Enabled(*effect, kAnalyze)) {
      EXPECT_TRUE(effect->Press(kAnalyze).ok());
    }
    EXPECT_EQ(Settle(*effect), 8);
  }
}

// Effects come and go at random while faults do, until so many were made; then nothing is left of
// those that went, memory has not grown since a quarter of them, and those that stand give the very
// frames of one that was left alone.
TEST_F(TourThreads, ASoakLosesNothingAndLeavesNothing) {
  const auto setting = [](const char* name, int unless_set) {
    const char* const text = std::getenv(name);
    return text ? std::atoi(text) : unless_set;
  };
  const int wanted = setting("CALMFRAME_SOAK_INSTANCES", 20);
  std::mt19937 random(static_cast<unsigned>(setting("CALMFRAME_SEED", 1)));
  faults_ = true;
  std::jthread watchdog([this](std::stop_token stop) {
    for (int last = -1, waits = 0; !stop.stop_requested(); std::this_thread::sleep_for(100ms)) {
      waits = std::exchange(last, acts_.load()) == acts_ ? waits + 1 : 0;
      if (waits < 3000) continue;
      std::fprintf(stderr, "nothing has moved for five minutes\n");
      std::abort();
    }
  });
  const ShakyClip clips[] = {{160, 120, kFrames, "soaked"}, {128, 96, kFrames, "soaked too"}};
  std::size_t held_early = 0;
  for (int quarter = 1; quarter <= 4; ++quarter) {
    const std::vector<boost::shared_ptr<Layer>> layers = {MakeLayer(clips[0]), MakeLayer(clips[1])};
    for (const auto& layer : layers) Keep(session().Apply(layer));
    ends_ = false;
    {
      std::vector<std::jthread> threads;
      for (unsigned t = 0; t < 3; ++t) {
        threads.emplace_back([this, seed = static_cast<unsigned>(random())] { RenderOn(seed); });
      }
      threads.emplace_back([this] { ReadExportsOn(99); });
      while (4 * instances_ < quarter * wanted && !HasFailure()) Act(random, layers);
      ends_ = true;
    }
    SwitchFaultsOff();
    Session::PauseBackgroundWork(false);
    for (const auto& layer : layers) {
      layer->Change([](LayerState& state) {
        state.refusal.clear();
        state.start_frame = 0;
        state.length = static_cast<std::int32_t>(kFrames);
      });
    }
    Rouse();
    std::vector<Effect*> survivors;
    for (const auto& effect : session().effects()) survivors.push_back(effect.get());
    for (Effect* effect : survivors) {
      SCOPED_TRACE("instance " + std::to_string(instances_));
      const auto frames = FramesOf(*effect);
      const bool first = effect->shared()->layer() == layers[0];
      Effect& fresh =
          session().Load(MakeLayer(clips[first ? 0 : 1]),
                         {"KLPX SubspaceStabilizer", effect->shared()->params().Values(), {}});
      const auto undisturbed = FramesOf(fresh);
      for (std::size_t i = 0; i < frames.size(); ++i) {
        EXPECT_EQ(Difference(*frames[i], *undisturbed[i]), 0);
      }
      session().Remove(fresh);
    }
    while (!session().effects().empty()) Drop(*session().effects().back());
    tessel::threads::Shutdown();              // jobs that wait for joiners
    EXPECT_EQ(host().handles().count(), 1u);  // the plug-in's global data
    EXPECT_EQ(host().worlds().count(), 0u);
    EXPECT_EQ(host().opaque_data().uses(), 0u);
    // A job whose effect went while it was saved may hold suites until the plug-in is stopped.
    EXPECT_EQ(Ledger::Get().mistakes(), std::vector<std::string>());
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
