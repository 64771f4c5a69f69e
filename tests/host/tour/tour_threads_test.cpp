#include <atomic>
#include <random>
#include <thread>
#include <vector>

#include "tests/host/tour/played_plugin.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;

class TourThreads : public PlayedPlugin {};

// Whatever the user does to the effect meanwhile, renders get a frame each time.
TEST_F(TourThreads, RendersGoOnWhileTheEffectIsPlayedWith) {
  const ShakyClip clip{96, 64, 12, "played with"};
  const auto layer = MakeLayer(clip);
  for (int round = 0; round < 3; ++round) {
    Effect& effect = session().Apply(layer);
    std::atomic<bool> ends{false};
    std::atomic<int> failed{0}, rendered{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
      threads.emplace_back([&, t] {
        const auto renderer = effect.MakeRenderer();
        for (int i = t; !ends; ++i) {
          const RenderRequest request{i % clip.frames, i % 2 ? 8 : 16, {1, i % 3 ? 1u : 2u}};
          const RenderedFrame frame =
              i % 5 ? renderer->Planned(request) : renderer->Direct(request);
          failed += frame.pixels ? 0 : 1;
          ++rendered;
        }
      });
    }
    // The exports of a renderer outside of the plug-in; the standing renderer keeps the block.
    threads.emplace_back([&] {
      const PluginExports& exports = host().library().exports();
      while (!ends) {
        const void* block = host().opaque_data().Peek(effect.shared()->reference());
        exports.allow_cuda_rendering(block);
        std::int32_t words[8];
        float bounds[4];
        exports.get_stabilizer_data(block, &words[0], &words[1], &words[2], &words[3], &words[4],
                                    &words[5], &bounds[0], &bounds[1], &bounds[2], &bounds[3],
                                    &words[6], &words[7]);
      }
    });
    std::mt19937 random(static_cast<unsigned>(round));
    const std::int64_t steps = 60;
    for (std::int64_t step = 0; step < steps; ++step) {
      switch (random() % 8) {
        case 0:
          if (Enabled(effect, kAnalyze)) {
            effect.Press(kAnalyze);
          }
          break;
        case 1:
          if (Enabled(effect, kCancel)) {
            effect.Press(kCancel);
          }
          break;
        case 2:
          effect.SetParam(kFraming, 1 + random() % 4);
          break;
        case 3:
          effect.SetParam(kSmoothness, random() % 100);
          break;
        case 4: {
          SavedEffect saved;
          EXPECT_TRUE(effect.Save(&saved).ok());
          break;
        }
        case 5:
          Session::PauseBackgroundWork(random() % 2 == 0);
          break;
        default:
          session().Tick();
          std::this_thread::sleep_for(5ms);
      }
    }
    Session::PauseBackgroundWork(false);
    ends = true;
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(failed, 0);
    EXPECT_GT(rendered, 0);
    session().Remove(effect);  // in the middle of whatever goes on
  }
}

}  // namespace
}  // namespace calmframe::host
