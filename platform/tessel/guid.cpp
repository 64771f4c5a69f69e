#include "platform/tessel/guid.h"

#include <bit>
#include <random>

namespace tessel::utility {
namespace {

constexpr std::size_t kTextSize = 36;

bool IsDashPlace(std::size_t i) {
  return i == 8 || i == 13 || i == 18 || i == 23;
}

int HexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

// Little-endian; fewer than 8 bytes are followed by zeros.
std::uint64_t LoadWord(const std::uint8_t* bytes, std::size_t count = 8) {
  std::uint64_t word = 0;
  for (std::size_t i = 0; i < count; ++i) word |= std::uint64_t{bytes[i]} << (8 * i);
  return word;
}

void StoreWord(std::uint64_t word, std::uint8_t* bytes) {
  for (int i = 0; i < 8; ++i) bytes[i] = static_cast<std::uint8_t>(word >> (8 * i));
}

std::uint64_t Finish(std::uint64_t word) {
  word = (word ^ (word >> 33)) * 0xff51afd7ed558ccdU;
  word = (word ^ (word >> 33)) * 0xc4ceb9fe1a85ec53U;
  return word ^ (word >> 33);
}

}  // namespace

Guid Guid::MakeUnique() {
  std::random_device random;
  Bytes bytes;
  for (std::size_t i = 0; i < bytes.size(); i += 4) {
    const std::uint32_t word = random();
    for (std::size_t j = 0; j < 4; ++j) bytes[i + j] = static_cast<std::uint8_t>(word >> (8 * j));
  }
  // Marked as random in the way of RFC 4122, section 4.4.
  bytes[6] = static_cast<std::uint8_t>((bytes[6] & 0x0f) | 0x40);
  bytes[8] = static_cast<std::uint8_t>((bytes[8] & 0x3f) | 0x80);
  return Guid(bytes);
}

bool Guid::Parse(const std::string& text, Guid* guid) {
  if (text.size() != kTextSize) return false;
  Bytes bytes{};
  std::size_t digits = 0;
  for (std::size_t i = 0; i < kTextSize; ++i) {
    if (IsDashPlace(i)) {
      if (text[i] != '-') return false;
      continue;
    }
    const int digit = HexDigit(text[i]);
    if (digit < 0) return false;
    bytes[digits / 2] = static_cast<std::uint8_t>(bytes[digits / 2] << 4 | digit);
    ++digits;
  }
  *guid = Guid(bytes);
  return true;
}

Guid Guid::FromText(const std::string& text) {
  Guid guid;
  if (!Parse(text, &guid)) guid = MixHash(Guid(), text.data(), text.size());
  return guid;
}

std::string Guid::ToText() const {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(kTextSize);
  for (const std::uint8_t byte : bytes_) {
    if (IsDashPlace(text.size())) text += '-';
    text += kDigits[byte >> 4];
    text += kDigits[byte & 15];
  }
  return text;
}

// MurmurHash3_x64_128 (Austin Appleby, public domain) with the state in the place of the seed: from
// a state whose halves both hold s it gives the published values for seed s.
Guid MixHash(const Guid& state, const void* data, std::size_t size) {
  constexpr std::uint64_t kC1 = 0x87c37b91114253d5U, kC2 = 0x4cf5ad432745937fU;
  std::uint64_t h1 = LoadWord(state.bytes().data());
  std::uint64_t h2 = LoadWord(state.bytes().data() + 8);
  const auto mix1 = [&](std::uint64_t k) { h1 ^= std::rotl(k * kC1, 31) * kC2; };
  const auto mix2 = [&](std::uint64_t k) { h2 ^= std::rotl(k * kC2, 33) * kC1; };

  const auto* bytes = static_cast<const std::uint8_t*>(data);
  std::size_t left = size;
  for (; left >= 16; left -= 16, bytes += 16) {
    mix1(LoadWord(bytes));
    h1 = (std::rotl(h1, 27) + h2) * 5 + 0x52dce729;
    mix2(LoadWord(bytes + 8));
    h2 = (std::rotl(h2, 31) + h1) * 5 + 0x38495ab5;
  }
  if (left > 8) mix2(LoadWord(bytes + 8, left - 8));
  if (left > 0) mix1(LoadWord(bytes, left < 8 ? left : 8));

  h1 ^= size;
  h2 ^= size;
  h1 += h2;
  h2 += h1;
  h1 = Finish(h1);
  h2 = Finish(h2);
  h1 += h2;
  h2 += h1;

  Guid::Bytes mixed;
  StoreWord(h1, mixed.data());
  StoreWord(h2, mixed.data() + 8);
  return Guid(mixed);
}

}  // namespace tessel::utility
