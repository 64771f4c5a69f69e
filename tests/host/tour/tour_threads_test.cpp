#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <random>
#include <shared_mutex>
#include <string>
#include <thread>
#include <vector>

#include "tests/host/tour/played_plugin.h"

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
        Fail(frame.result.Line(direct ? "direct" : "planned"));
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
    const std::lock_guard lock(mutex_);
    standing_.push_back(effect.shared());
  }
  void Drop(Effect& effect) {
    const std::lock_guard lock(mutex_);
    std::erase(standing_, effect.shared());
    session().Remove(effect);
  }

  // One thing that a user may do.
  void Act(std::mt19937& random, const std::vector<boost::shared_ptr<Layer>>& layers) {
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
        EXPECT_TRUE(effect.Save(&saved_).ok());
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

  std::atomic<bool> ends_{false};
  std::atomic<int> rendered_{0}, failed_{0};

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

}  // namespace
}  // namespace calmframe::host
