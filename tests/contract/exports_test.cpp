#include <dlfcn.h>

#include <atomic>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "tests/contract/played_plugin.h"
#include "tests/support/scratch_folder.h"

// What the library shows of itself: its names, and what a renderer outside of it may rely on.

namespace calmframe::host {
namespace {

TEST(Exports, SevenNamesAndNothingElse) {
  const ScratchFolder folder;
  const std::string command =
      "nm --dynamic --defined-only --format=posix '" CALMFRAME_PLUGIN "' | cut -d' ' -f1 >";
  ASSERT_EQ(std::system((command + folder.In("names")).c_str()), 0);
  EXPECT_EQ(folder.Content("names"),
            "EffectMainExtra\nHXPL_16000\nHXp_G_fcd_table\nallowCUDARendering\ngetCropWindow\n"
            "getOVVarVector\ngetStabilizerData\n");
}

TEST(Exports, TheLibraryIsGoneWhenItIsClosed) {
  {
    Host host(CALMFRAME_PLUGIN);
    for (const std::uint32_t unknown : {2u, 12u, 19u, 100u}) {
      HX_InData in{};
      HX_OutData out{};
      EXPECT_TRUE(host.Command(unknown, in, out).ok()) << unknown;
    }
    EXPECT_TRUE(host.Stop().ok());
    EXPECT_EQ(host.LeakReport(), "");
  }
  EXPECT_EQ(dlopen(CALMFRAME_PLUGIN, RTLD_NOW | RTLD_NOLOAD), nullptr);
}

class OutsideRenderer : public PlayedPlugin {
 protected:
  const HX_VarVector* Warp(Effect& effect, std::int32_t frame) {
    return exports().get_var_vector(effect.opaque_data(), frame);
  }
};

TEST_F(OutsideRenderer, AThreadsWarpOutlivesTheSolveItCameFrom) {
  Effect& effect = session().Apply(MakeLayer({96, 64, 8, "outlived"}));
  EXPECT_EQ(Warp(effect, 0), nullptr) << "nothing is solved";
  ASSERT_EQ(Settle(effect), 8);
  const HX_VarVector* const drawn = Warp(effect, 5);
  ASSERT_TRUE(drawn);
  EXPECT_THROW(Warp(effect, 8), std::out_of_range);  // and lets go of nothing
  const std::vector<double> values(drawn->values, drawn->values + 2 * drawn->columns * drawn->rows);
  effect.SetParam(kSmoothness, 5);
  ASSERT_EQ(Settle(effect), 8);
  std::thread([&] {
    const HX_VarVector* const other = Warp(effect, 5);
    EXPECT_NE(other->values, drawn->values);
    EXPECT_FALSE(std::equal(values.begin(), values.end(), other->values));
  }).join();
  EXPECT_TRUE(std::equal(values.begin(), values.end(), drawn->values));
  EXPECT_EQ(exports().get_var_vector(nullptr, 0), nullptr);
}

// Renderers outside read and draw while solves and framings are made.
TEST_F(OutsideRenderer, ReadsWhileTheUserInterfaceSolves) {
  constexpr std::int32_t kFrames = 8;
  Effect& effect = Steady({96, 64, kFrames, "read meanwhile", 0.3});
  const void* const block = effect.opaque_data();
  std::atomic<bool> end{false};
  std::atomic<int> allowed{0}, rounds{0};
  std::vector<std::jthread> readers;
  constexpr int kReaders = 3;
  for (int i = 0; i < kReaders; ++i) {
    readers.emplace_back([&, i] {
      for (std::int32_t frame = i; !end; frame = (frame + 1) % kFrames, ++rounds) {
        allowed += exports().allow_cuda_rendering(block);
        float rect[4] = {-1, -1, -1, -1};
        const auto n = DataOf(block);
        const HX_VarVector* const record = exports().get_var_vector(block, frame);
        EXPECT_EQ(n[0], kFrames);
        EXPECT_EQ(record->columns, n[2]);
        EXPECT_EQ(record->rows, n[3]);
        exports().get_crop_window(block, frame, &rect[0], &rect[1], &rect[2], &rect[3]);
        EXPECT_LE(rect[0], rect[2]);
        EXPECT_LE(rect[1], rect[3]);
        // What a renderer draws with stays whole: the frame's middle is near its place.
        const std::int32_t vertices = record->columns * record->rows;
        double x = 0, y = 0;
        for (std::int32_t v = 0; v < vertices; ++v) {
          x += record->values[2 * v] / vertices;
          y += record->values[2 * v + 1] / vertices;
        }
        EXPECT_NEAR(x, 47.5, 16);
        EXPECT_NEAR(y, 31.5, 16);
      }
    });
  }
  for (int change = 0; change < 20; ++change) {
    effect.SetParam(change % 2 ? kMaximumScale : kSmoothness, 110 + change);
    EXPECT_EQ(Settle(effect), 8);
  }
  // Until one has read all of it at rest, when what is solved fits the controls.
  const int at_rest = rounds;
  while (rounds <= at_rest + kReaders) std::this_thread::yield();
  end = true;
  readers.clear();
  EXPECT_GT(allowed, 0);
}

}  // namespace
}  // namespace calmframe::host
