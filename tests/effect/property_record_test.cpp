#include <dlfcn.h>
#include <elf.h>
#include <gtest/gtest.h>
#include <link.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "tests/effect/fake_host.h"

namespace {

struct Property {
  std::string vendor, key;
  std::uint32_t index, length;
  std::string value;  // with its padding
};

// As a stranger reads the record: little-endian words without alignment, bounded by its size.
class Reader {
 public:
  Reader(const unsigned char* data, std::size_t size) : data_(data), end_(data + size) {}
  std::uint32_t Number(int bytes) {
    const std::string text = Text(static_cast<std::size_t>(bytes));
    std::uint32_t value = 0;
    for (int i = bytes; i-- > 0;) value = value << 8 | static_cast<unsigned char>(text[i]);
    return value;
  }
  std::string Text(std::size_t size) {
    if (size > static_cast<std::size_t>(end_ - data_)) throw std::out_of_range("record");
    const std::string text(data_, data_ + size);
    data_ += size;
    return text;
  }
  bool AtEnd() const { return data_ == end_; }

 private:
  const unsigned char* data_;
  const unsigned char* end_;
};

class PropertyRecordTest : public testing::Test {
 protected:
  PropertyRecordTest() : library_(dlopen(PROBE_PLUGIN, RTLD_NOW | RTLD_LOCAL)) {}
  ~PropertyRecordTest() override {
    if (library_) dlclose(library_);
  }
  void SetUp() override {
    ASSERT_TRUE(library_) << dlerror();
    record_ = static_cast<const unsigned char*>(dlsym(library_, "HXPL_16000"));
    ASSERT_TRUE(record_) << dlerror();
    Dl_info info;
    ASSERT_TRUE(dladdr1(record_, &info, reinterpret_cast<void**>(&symbol_), RTLD_DL_SYMENT));
    ASSERT_STREQ(info.dli_sname, "HXPL_16000");
  }

  void* library_;
  const unsigned char* record_ = nullptr;
  ElfW(Sym) * symbol_ = nullptr;
};

std::string Word(std::uint32_t value) {
  return {static_cast<char>(value), static_cast<char>(value >> 8), static_cast<char>(value >> 16),
          static_cast<char>(value >> 24)};
}

TEST_F(PropertyRecordTest, TwelvePropertiesAndNothingElse) {
  using namespace std::string_literals;
  const Property expected[] = {
      {"XVN8", "dnik", 0, 4, "TKFx"},
      {"XVN8", "eman", 0, 40, "\x27$$$/OV/Effect/Name/Stabilizer=Calmframe"},
      {"XVN8", "gtac", 0, 40, "\x26$$$/OV/Effect/Category/Distort=Distort\0"s},
      {"XVN8", "4668", 0, 16, "EffectMainExtra\0"s},
      {"XVN8", "RVPx", 0, 4, Word(2)},
      {"XVN8", "RVSx", 0, 4, Word(13)},
      {"XVN8", "REVx", 0, 4, Word(0x00080600)},
      {"XVN8", "FNIx", 0, 2, "\0\0\0\0"s},
      {"XVN8", "OLGx", 0, 4, Word(0x02001216)},
      {"XVN8", "2LGx", 0, 4, Word(0x00029448)},
      {"XVN8", "ANMx", 0, 24, "\x17KLPX SubspaceStabilizer"},
      {"XVN8", "LFxq", 0, 4, Word(9)},
  };
  Reader reader(record_, symbol_->st_size);
  EXPECT_EQ(reader.Number(2), 1u);
  EXPECT_EQ(reader.Number(4), 0u);
  ASSERT_EQ(reader.Number(4), std::size(expected));
  for (const Property& property : expected) {
    EXPECT_EQ(reader.Text(4), property.vendor);
    EXPECT_EQ(reader.Text(4), property.key);
    EXPECT_EQ(reader.Number(4), property.index) << property.key;
    const std::uint32_t length = reader.Number(4);
    EXPECT_EQ(length, property.length) << property.key;
    EXPECT_EQ(reader.Text((length + 3) / 4 * 4), property.value) << property.key;
  }
  EXPECT_TRUE(reader.AtEnd());
}

TEST_F(PropertyRecordTest, NamesTheEntryThatAHostThenCalls) {
  const auto entry = reinterpret_cast<HX_EffectMain>(dlsym(library_, "EffectMainExtra"));
  ASSERT_TRUE(entry) << dlerror();
  FakeHost host;
  EXPECT_EQ(host.Call(entry, 19), 0);
  EXPECT_STREQ(host.out.return_msg, "");
  EXPECT_EQ(host.Call(entry, 0), 0);
  EXPECT_STREQ(host.out.return_msg, "about");
}

TEST_F(PropertyRecordTest, FillsASectionOfItsOwn) {
  std::ifstream file(PROBE_PLUGIN, std::ios::binary);
  const std::string bytes((std::istreambuf_iterator<char>(file)), {});
  ElfW(Ehdr) header;
  ASSERT_GT(bytes.size(), sizeof(header));
  std::memcpy(&header, bytes.data(), sizeof(header));
  std::vector<ElfW(Shdr)> sections(header.e_shnum);
  std::memcpy(sections.data(), bytes.data() + header.e_shoff,
              sections.size() * sizeof(sections[0]));
  int found = 0;
  for (const ElfW(Shdr) & section : sections) {
    const char* name = bytes.data() + sections[header.e_shstrndx].sh_offset + section.sh_name;
    if (std::strcmp(name, ".hxpl") != 0) continue;
    ++found;
    EXPECT_EQ(section.sh_size, symbol_->st_size);
    EXPECT_EQ(std::memcmp(bytes.data() + section.sh_offset, record_, symbol_->st_size), 0);
  }
  EXPECT_EQ(found, 1);
}

}  // namespace
