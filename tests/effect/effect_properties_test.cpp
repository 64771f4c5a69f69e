#include <elf.h>
#include <gtest/gtest.h>
#include <link.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

namespace {

std::string Little(std::uint32_t value, int bytes) {
  std::string text;
  for (int i = 0; i < bytes; ++i) text += static_cast<char>(value >> 8 * i);
  return text;
}

// By its name it is found in every test that loads the plug-in.
TEST(PropertyRecord, TwelvePropertiesFillASectionOfTheirOwn) {
  using namespace std::string_literals;
  const struct {
    const char* key;
    std::uint32_t length;
    std::string value;  // with its padding
  } properties[] = {
      {"dnik", 4, "TKFx"},
      {"eman", 40, "\x27$$$/OV/Effect/Name/Stabilizer=Calmframe"},
      {"gtac", 40, "\x26$$$/OV/Effect/Category/Distort=Distort\0"s},
      {"4668", 16, "EffectMainExtra\0"s},
      {"RVPx", 4, Little(2, 4)},
      {"RVSx", 4, Little(13, 4)},
      {"REVx", 4, Little(0x00080600, 4)},
      {"FNIx", 2, "\0\0\0\0"s},
      {"OLGx", 4, Little(0x02001216, 4)},
      {"2LGx", 4, Little(0x00029448, 4)},
      {"ANMx", 24, "\x17KLPX SubspaceStabilizer"},
      {"LFxq", 4, Little(9, 4)},
  };
  std::string expected = Little(1, 2) + Little(0, 4) + Little(std::size(properties), 4);
  for (const auto& [key, length, value] : properties) {
    expected += "XVN8"s + key + Little(0, 4) + Little(length, 4) + value;
  }
  std::ifstream file(CALMFRAME_PLUGIN, std::ios::binary);
  const std::string bytes((std::istreambuf_iterator<char>(file)), {});
  ElfW(Ehdr) header;
  ASSERT_GT(bytes.size(), sizeof(header));
  std::memcpy(&header, bytes.data(), sizeof(header));
  std::vector<ElfW(Shdr)> sections(header.e_shnum);
  std::memcpy(sections.data(), bytes.data() + header.e_shoff,
              sections.size() * sizeof(sections[0]));
  std::vector<std::string> found;
  for (const ElfW(Shdr) & section : sections) {
    const char* name = bytes.data() + sections[header.e_shstrndx].sh_offset + section.sh_name;
    if (std::strcmp(name, ".hxpl") == 0) {
      found.push_back(bytes.substr(section.sh_offset, section.sh_size));
    }
  }
  EXPECT_EQ(found, std::vector<std::string>{expected});
}

}  // namespace
