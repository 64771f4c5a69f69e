#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/hx/hx_properties.h"

namespace kelp::effect {
namespace {

// A block of bytes that grows while the compiler runs.
struct Bytes {
  std::array<unsigned char, 1024> data{};
  std::size_t size = 0;

  constexpr void Little(std::uint64_t value, int bytes) {
    for (int i = 0; i < bytes; ++i) data[size++] = static_cast<unsigned char>(value >> (8 * i));
  }
  constexpr void Text(std::string_view text) {
    for (const char c : text) data[size++] = static_cast<unsigned char>(c);
  }
  constexpr void Property(const char* key, std::size_t length) {
    Text(HX_PROPERTY_VENDOR);
    Text(key);
    Little(0, 4);
    Little(length, 4);
  }
  constexpr void Pad(std::size_t begin) {
    while ((size - begin) % 4 != 0) data[size++] = 0;
  }

  constexpr void Word(const char* key, std::uint32_t value) {
    Property(key, 4);
    Little(value, 4);
  }
  // Texts count their padding.
  constexpr void Pascal(const char* key, std::string_view text) {
    Property(key, (1 + text.size() + 3) / 4 * 4);
    const std::size_t begin = size;
    Little(text.size(), 1);
    Text(text);
    Pad(begin);
  }
  constexpr void ZeroEnded(const char* key, std::string_view text) {
    Property(key, (text.size() + 1 + 3) / 4 * 4);
    const std::size_t begin = size;
    Text(text);
    Little(0, 1);
    Pad(begin);
  }
};

constexpr Bytes Record() {
  Bytes record;
  record.Little(HX_PROPERTY_VERSION, 2);
  record.Little(HX_PROPERTY_SECOND_VERSION, 4);
  record.Little(12, 4);
  record.Property(HX_KEY_KIND, 4);
  record.Text(HX_KIND_EFFECT);
  record.Pascal(HX_KEY_NAME, "$$$/OV/Effect/Name/Stabilizer=Calmframe");
  record.Pascal(HX_KEY_CATEGORY, "$$$/OV/Effect/Category/Distort=Distort");
  record.ZeroEnded(HX_KEY_ENTRY_64, "EffectMainExtra");
  record.Word(HX_KEY_HOST_PLUGIN_VERSION, 2);
  record.Word(HX_KEY_HOST_SPEC_VERSION, 13);
  record.Word(HX_KEY_EFFECT_VERSION, 0x00080600);
  record.Property(HX_KEY_EFFECT_INFO, 2);
  record.Little(0, 4);  // two bytes and two of padding
  record.Word(HX_KEY_OUT_FLAGS, 0x02001216);
  record.Word(HX_KEY_OUT_FLAGS_2, 0x00029448);
  record.Pascal(HX_KEY_MATCH_NAME, "KLPX SubspaceStabilizer");  // never changes
  record.Word(HX_KEY_HOST_FLAGS, 9);
  return record;
}

constexpr auto Trimmed() {
  constexpr Bytes record = Record();
  std::array<unsigned char, record.size> trimmed{};
  std::copy_n(record.data.begin(), record.size, trimmed.begin());
  return trimmed;
}

}  // namespace
}  // namespace kelp::effect

// The name is HX_PROPERTY_SYMBOL. The sanitizers keep their hands off symbols with a section of
// their own, so that the symbol's size stays the record's.
extern "C" {
__attribute__((used, visibility("default"),
               section(HX_PROPERTY_SECTION))) extern const auto HXPL_16000 =
    kelp::effect::Trimmed();
}
