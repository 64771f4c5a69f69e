#include <dlfcn.h>
#include <elf.h>
#include <gtest/gtest.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <vector>

#include "platform/hx/hx.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

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

}  // namespace
}  // namespace kelp::effect
