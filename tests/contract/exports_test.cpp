#include <dlfcn.h>
#include <elf.h>

#include <atomic>
#include <fstream>
#include <iterator>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "tests/contract/played_plugin.h"

// What the library shows of itself: its names, and what a renderer outside of it may rely on.

namespace calmframe::host {
namespace {

// Names that the library defines for others.
std::set<std::string> DefinedSymbols(const char* path) {
  std::ifstream file(path, std::ios::binary);
  const std::vector<char> bytes{std::istreambuf_iterator<char>(file), {}};
  const auto* header = reinterpret_cast<const Elf64_Ehdr*>(bytes.data());
  const auto* sections = reinterpret_cast<const Elf64_Shdr*>(bytes.data() + header->e_shoff);
  std::set<std::string> names;
  for (int i = 0; i < header->e_shnum; ++i) {
    if (sections[i].sh_type != SHT_DYNSYM) continue;
    const char* texts = bytes.data() + sections[sections[i].sh_link].sh_offset;
    const auto* symbols = reinterpret_cast<const Elf64_Sym*>(bytes.data() + sections[i].sh_offset);
    for (std::size_t n = 0; n < sections[i].sh_size / sizeof(Elf64_Sym); ++n) {
      if (symbols[n].st_shndx != SHN_UNDEF) names.insert(texts + symbols[n].st_name);
    }
  }
  return names;
}

TEST(Exports, SevenNamesAndNothingElse) {
  const std::set<std::string> names = {"EffectMainExtra", "allowCUDARendering", "getOVVarVector",
                                       "getCropWindow",   "getStabilizerData",  "HXp_G_fcd_table",
                                       "HXPL_16000"};
  EXPECT_EQ(DefinedSymbols(CALMFRAME_PLUGIN), names);
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
    return host().library().exports().get_var_vector(effect.opaque_data(), frame);
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
  EXPECT_EQ(host().library().exports().get_var_vector(nullptr, 0), nullptr);
}

// Renderers outside read and draw while solves and framings are made.
TEST_F(OutsideRenderer, ReadsWhileTheUserInterfaceSolves) {
  constexpr std::int32_t kFrames = 8;
  const PluginExports& exports = host().library().exports();
  Effect& effect = session().Apply(MakeLayer({96, 64, kFrames, "read meanwhile", 0.3}));
  ASSERT_EQ(Settle(effect), 8);
  const void* const block = effect.opaque_data();
  std::atomic<bool> end{false};
  std::atomic<int> allowed{0};
  std::vector<std::jthread> readers;
  for (int i = 0; i < 3; ++i) {
    readers.emplace_back([&, i] {
      for (std::int32_t frame = i; !end; frame = (frame + 1) % kFrames) {
        allowed += exports.allow_cuda_rendering(block);
        std::int32_t n[8];
        float bounds[4], rect[4] = {-1, -1, -1, -1};
        EXPECT_TRUE(exports.get_stabilizer_data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5],
                                                &bounds[0], &bounds[1], &bounds[2], &bounds[3],
                                                &n[6], &n[7]));
        const HX_VarVector* const record = exports.get_var_vector(block, frame);
        EXPECT_EQ(n[0], kFrames);
        EXPECT_EQ(record->columns, n[2]);
        EXPECT_EQ(record->rows, n[3]);
        exports.get_crop_window(block, frame, &rect[0], &rect[1], &rect[2], &rect[3]);
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
  end = true;
  readers.clear();
  EXPECT_GT(allowed, 0);
}

}  // namespace
}  // namespace calmframe::host
