#include "host/plugin/property_record.h"

#include <gmock/gmock.h>

#include <string>
#include <string_view>

#include "host/plugin/plugin_library.h"

namespace calmframe::host {
namespace {

using namespace std::string_literals;
using testing::ThrowsMessage;

std::string Little(std::uint32_t value, int bytes) {
  std::string text;
  for (int i = 0; i < bytes; ++i) text += static_cast<char>(value >> 8 * i);
  return text;
}

std::string Header(std::uint32_t count) {
  return Little(1, 2) + Little(0, 4) + Little(count, 4);
}

std::string Property(std::string_view key, const std::string& value, bool padded = true) {
  std::string stored = value;
  stored.resize((value.size() + 3) / 4 * 4);
  return "XVN8" + std::string(key) + Little(0, 4) +
         Little(static_cast<std::uint32_t>(padded ? stored.size() : value.size()), 4) + stored;
}

std::string Whole(bool padded) {
  return Header(5) + Property("dnik", "TKFx") + Property("eman", "\x05$$$/A"s, padded) +
         Property("?new", "unknown to this reader", padded) + Property("4668", "Main\0"s, padded) +
         Property("ANMx", "\6Effect"s, padded);
}

PluginProperties Read(const std::string& record) {
  return ReadPropertyRecord(record.data(), record.size());
}

TEST(PropertyRecordReader, TakesPaddedAndUnpaddedLengthsAndSkipsUnknownKeys) {
  for (const bool padded : {true, false}) {
    const PluginProperties properties = Read(Whole(padded));
    EXPECT_EQ(properties.name, "$$$/A");
    EXPECT_EQ(properties.entry, "Main");
    EXPECT_EQ(properties.match_name, "Effect");
    EXPECT_EQ(properties.host_flags, 0u);
  }
  const PluginProperties words = Read(
      Header(5) + Property("dnik", "TKFx") + Property("4668", "E\0"s) + Property("ANMx", "\1m") +
      Property("FNIx", "\x34\x12", false) + Property("2LGx", "\x48\x94\x02\0"s));
  EXPECT_EQ(words.effect_info, 0x1234u);
  EXPECT_EQ(words.out_flags_2, 0x00029448u);
}

TEST(PropertyRecordReader, RefusesWhatIsCutAnywhere) {
  const std::string record = Whole(false);
  for (std::size_t size = 0; size + 1 < record.size(); ++size) {  // one byte of padding may be gone
    EXPECT_THROW(Read(record.substr(0, size)), PluginError) << size;
  }
  Read(record.substr(0, record.size() - 1));
}

TEST(PropertyRecordReader, RefusesDamageWithItsCause) {
  const auto damaged = [](std::size_t at, const std::string& bytes) {
    return Whole(true).replace(at, bytes.size(), bytes);
  };
  const struct {
    std::string record;
    const char* cause;
  } cases[] = {
      {damaged(0, "\2"), "property record of another version"},
      {damaged(2, "\1"), "property record of another version"},
      {damaged(6, "\x7"), "property record ends within a property"},
      {damaged(10, "XVN7"), "property of another vendor"},
      {damaged(26, "TKFy"), "plug-in of another kind"},
      {damaged(22, "\xff\xff\xff\xff"), "property record ends within a property"},
      {damaged(46, "\x08"), "property \"eman\" is too short"},
      {Header(1) + Property("dnik", "TKFx"), "property record without an entry"},
      {Header(1) + Property("4668", "Main"), "property \"4668\" has no end"},
      {Header(0), "property record without a kind"},
  };
  for (const auto& c : cases) {
    EXPECT_THAT([&] { Read(c.record); }, ThrowsMessage<PluginError>(c.cause));
  }
}

TEST(PluginLibraryTest, RefusalsNameTheFile) {
  EXPECT_THAT([] { PluginLibrary("/nowhere.so"); },
              ThrowsMessage<PluginError>(testing::StartsWith("/nowhere.so: ")));
  EXPECT_THAT(
      [] { PluginLibrary(OTHER_LIBRARY); },
      ThrowsMessage<PluginError>(OTHER_LIBRARY ": not a plug-in, it has no property record"));
}

}  // namespace
}  // namespace calmframe::host
