#include <dlfcn.h>
#include <elf.h>
#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cstring>
#include <fstream>
#include <iterator>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/hx/hx.h"
#include "stabilizer/effect/src/shared_data.h"
#include "tests/stabilizer_effect/stabilizer_host.h"

namespace kelp::effect {
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

class PluginTest : public ::testing::Test {
 protected:
  PluginTest() : library_(dlopen(CALMFRAME_PLUGIN, RTLD_NOW | RTLD_LOCAL)) {
    if (!library_) ADD_FAILURE() << dlerror();
  }
  ~PluginTest() override {
    if (library_) dlclose(library_);
  }
  template <class Function>
  Function Find(const char* name) {
    return reinterpret_cast<Function>(dlsym(library_, name));
  }

  void* library_;
};

TEST_F(PluginTest, ExportsItsSevenNamesAndNothingElse) {
  const std::set<std::string> names = {"EffectMainExtra", "allowCUDARendering", "getOVVarVector",
                                       "getCropWindow",   "getStabilizerData",  "HXp_G_fcd_table",
                                       "HXPL_16000"};
  EXPECT_EQ(DefinedSymbols(CALMFRAME_PLUGIN), names);
}

TEST_F(PluginTest, RunsCommandsAndIsGoneWhenItIsClosed) {
  {
    FakeHost host;
    const auto entry = Find<HX_EffectMain>("EffectMainExtra");
    for (const std::uint32_t command : {2u, 12u, 19u, 100u}) {
      EXPECT_EQ(host.Call(entry, command), HX_ERR_NONE);
    }
    ASSERT_EQ(host.Call(entry, HX_CMD_START_PLUGIN), HX_ERR_NONE);
    ASSERT_EQ(host.Call(entry, HX_CMD_DECLARE_PARAMS), HX_ERR_NONE);
    EXPECT_EQ(host.out.num_params, 31);
    ASSERT_EQ(host.Call(entry, HX_CMD_ABOUT), HX_ERR_NONE);
    EXPECT_STREQ(host.out.return_msg,
                 "Calmframe, v1.0\n\nStabilizes footage without manual tracking.");
    ASSERT_EQ(host.Call(entry, HX_CMD_STOP_PLUGIN), HX_ERR_NONE);
    EXPECT_EQ(host.Leaks(), "");
  }
  ASSERT_EQ(dlclose(library_), 0);
  library_ = dlopen(CALMFRAME_PLUGIN, RTLD_NOW | RTLD_NOLOAD);
  EXPECT_EQ(library_, nullptr);
}

// What a renderer outside gets of a block.
TEST_F(PluginTest, RendererExports) {
  const auto allow = Find<HX_AllowCUDARendering>(HX_EXPORT_ALLOW_CUDA_RENDERING);
  const auto warp = Find<HX_GetOVVarVector>(HX_EXPORT_GET_VAR_VECTOR);
  const auto window = Find<HX_GetCropWindow>(HX_EXPORT_GET_CROP_WINDOW);
  const auto data = Find<HX_GetStabilizerData>(HX_EXPORT_GET_STABILIZER_DATA);
  ASSERT_TRUE(allow && warp && window && data && dlsym(library_, HX_EXPORT_FCD_TABLE));

  std::int32_t n[8];
  float f[4];
  const auto reset = [&] {
    std::fill(std::begin(n), std::end(n), -77);
    std::fill(std::begin(f), std::end(f), -77.0f);
  };
  const auto ask = [&](const void* block) {
    return data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5], &f[0], &f[1], &f[2], &f[3], &n[6],
                &n[7]);
  };
  StabilizerSharedData block;
  for (const void* none : {static_cast<const void*>(nullptr), static_cast<const void*>(&block)}) {
    reset();
    EXPECT_EQ(allow(none), 0);
    EXPECT_EQ(warp(none, 0), nullptr);
    window(none, 0, &f[0], &f[1], &f[2], &f[3]);
    EXPECT_FALSE(ask(none));
    for (const std::int32_t word : n) EXPECT_EQ(word, -77);
    for (const float word : f) EXPECT_EQ(word, -77);
  }

  block.contents.warper = ShiftingWarper(64, 48, {{0, 0}, {10, -6}});
  block.contents.first_frame = 5;
  block.contents.source_width = 60;
  block.contents.source_height = 48;
  block.contents.gpu_allowed = true;
  EXPECT_EQ(allow(&block), 1);
  EXPECT_EQ(warp(&block, 1), block.contents.warper->frameWarp(1).get());
  EXPECT_THROW(warp(&block, 2), std::out_of_range);
  EXPECT_THROW(warp(&block, -1), std::out_of_range);
  reset();
  window(&block, 0, &f[0], &f[1], &f[2], &f[3]);
  EXPECT_EQ(f[0], -77);
  ASSERT_TRUE(ask(&block));
  const auto& grid = *block.contents.warper;
  const std::int32_t numbers[] = {2, 5, grid.gridCols(), grid.gridRows(), -77, -77, 60, 48};
  EXPECT_TRUE(std::equal(std::begin(n), std::end(n), numbers));
  const float bounds[] = {0, -6, 73, 47};
  EXPECT_TRUE(std::equal(std::begin(f), std::end(f), bounds));

  const auto crop = boost::make_shared<cropper>(2, 74, 54);
  crop->cropWidth = 40;
  crop->cropHeight = 30;
  crop->rects[1] = {1, 2, 3, 4};  // left, right, top, bottom
  block.contents.crop = crop;
  ASSERT_TRUE(ask(&block));
  EXPECT_EQ(n[4], 40);
  EXPECT_EQ(n[5], 30);
  window(&block, 1, &f[0], &f[1], &f[2], &f[3]);
  const float rect[] = {1, 3, 2, 4};
  EXPECT_TRUE(std::equal(std::begin(f), std::end(f), rect));
}

}  // namespace
}  // namespace kelp::effect
