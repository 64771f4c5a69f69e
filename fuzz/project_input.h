#pragma once

#include <zlib.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <string>
#include <vector>

#include "stabilizer/effect/src/instance_handle.h"

// How the fuzzer's input tells of a project: these bytes, then those of the saved instance, packed.
namespace calmframe::host {

struct ProjectInput {
  double value = 0;
  std::uint64_t control = 0;          // of those that are declared, that has `value`; wraps
  std::uint64_t ticks_per_frame = 0;  // of the layer, less one; what no project may tell wraps
  std::int16_t start_frame = 0, length = 0;  // of the layer; wraps
  std::uint8_t flags = 0, work = 0;          // below
  std::uint8_t framing = 0;                  // from 0; wraps
  std::uint8_t frame = 0;                    // of the layer, that is drawn
};
static_assert(sizeof(ProjectInput) == 32);

// Of a layer, past the clip's end and its own table's.
inline constexpr std::int16_t kMostFrames = 64;
// With a start of 16 bits, times stay in 63.
inline constexpr std::uint64_t kMostTicks = std::uint64_t{1} << 46;

enum : std::uint8_t {
  kToBeDeflated = 1,  // the payload, so that changes reach past the compression
  kOnePixel = 2,      // the clip
  kWidePixels = 4,    // the clip's
  kDirectly = 8,      // drawn
  kDeeply = 16,       // drawn, at 16 bits
  kFields = 32,       // each a picture, the clip's frames
  kBanner = 64,       // drawn too, where there is one
  kWhole = 128,       // drawn in full size, and not a quarter of it
};

// What is begun takes as long as a hundred others, so that few changes shall lead to it.
enum : std::uint8_t {
  kBegins = 1,   // what is to be made
  kSettles = 2,  // what is to be made is made
};

// As a payload's length, where none is told: that of the bytes that follow.
inline constexpr std::uint64_t kAllThatFollow = 0;

// Within an instance's bytes: zeros, by their number less one, from kManyZeros on in 256s; a text,
// up to the next such byte, whose length comes ahead of it and follows its changes; and a byte as
// it stands. So a state with its warps takes a kilobyte or two, and one change of it goes a long
// way.
enum : char { kZeros = 0, kText = 1, kPlain = 2 };
inline constexpr std::size_t kManyZeros = 0x80;
// Enough for any sample.
inline constexpr std::size_t kLongestInstance = 1 << 17;

inline std::string Unpacked(const char* packed, std::size_t size) {
  std::string bytes;
  for (std::size_t i = 0; i < size && bytes.size() < kLongestInstance; ++i) {
    if (packed[i] == kZeros && i + 1 < size) {
      const std::size_t number = static_cast<std::uint8_t>(packed[++i]);
      bytes.append(number < kManyZeros ? number + 1 : (number - kManyZeros + 1) * 256, '\0');
    } else if (packed[i] == kText) {
      const std::size_t begin = ++i;
      while (i < size && packed[i] != kText) ++i;
      const auto units = static_cast<std::uint32_t>(i - begin);
      bytes.append(reinterpret_cast<const char*>(&units), sizeof units);
      for (std::size_t unit = begin; unit < i; ++unit) bytes += {packed[unit], '\0'};
    } else {
      if (packed[i] == kPlain && i + 1 < size) ++i;
      bytes += packed[i];
    }
  }
  return bytes;
}

// Units of the text at that place, as far as it is one that is kept as such: an object of JSON.
inline std::uint32_t TextAt(const std::string& bytes, std::size_t place) {
  std::uint32_t units = 0;
  if (bytes.size() < place + 6 || bytes[place + 4] != '{') return 0;
  std::memcpy(&units, bytes.data() + place, sizeof units);
  if (units > (bytes.size() - place - 4) / 2) return 0;
  for (std::uint32_t i = 0; i < units; ++i) {
    if (bytes[place + 4 + 2 * i] < ' ' || bytes[place + 5 + 2 * i] != 0) return 0;
  }
  return units;
}

inline std::string Packed(const std::string& bytes) {
  std::string packed;
  for (std::size_t i = 0; i < bytes.size();) {
    std::size_t zeros = 0;
    while (i + zeros < bytes.size() && bytes[i + zeros] == 0 && !TextAt(bytes, i + zeros)) ++zeros;
    if (const std::uint32_t units = TextAt(bytes, i)) {
      packed += kText;
      for (std::uint32_t unit = 0; unit < units; ++unit) packed += bytes[i + 4 + 2 * unit];
      packed += kText;
      i += 4 + 2 * std::size_t{units};
    } else if (zeros > 0) {
      std::size_t taken = zeros < 256 ? std::min<std::size_t>(zeros, kManyZeros) : zeros / 256;
      if (zeros >= 256) taken = std::min<std::size_t>(taken, 256 - kManyZeros);
      packed += kZeros;
      packed += static_cast<char>(zeros < 256 ? taken - 1 : kManyZeros + taken - 1);
      i += zeros < 256 ? taken : taken * 256;
    } else {
      if (bytes[i] == kText || bytes[i] == kPlain) packed += kPlain;
      packed += bytes[i++];
    }
  }
  return packed;
}

inline std::string Deflated(const std::string& bytes) {
  uLongf size = compressBound(bytes.size());
  std::string deflated(size, '\0');
  if (compress2(reinterpret_cast<Bytef*>(deflated.data()), &size,
                reinterpret_cast<const Bytef*>(bytes.data()), bytes.size(), 1) != Z_OK) {
    throw std::runtime_error("not deflated");
  }
  deflated.resize(size);
  return deflated;
}

// The bytes of an instance whose header's length is to be that of what follows; with the payload
// compressed where it is to be.
inline std::vector<std::uint8_t> InstanceIn(std::string instance, bool to_be_deflated) {
  using kelp::effect::InstanceHandleHeader;
  if (instance.size() >= sizeof(InstanceHandleHeader)) {
    InstanceHandleHeader header;
    std::memcpy(static_cast<void*>(&header), instance.data(), sizeof header);
    if (to_be_deflated) {
      const std::string payload = Deflated(instance.substr(sizeof header));
      header.raw = 0;
      header.payload_length = payload.size();
      instance.assign(reinterpret_cast<const char*>(&header), sizeof header);
      instance += payload;
    } else if (header.payload_length == kAllThatFollow) {
      header.payload_length = instance.size() - sizeof header;
      std::memcpy(instance.data(), &header, sizeof header);
    }
  }
  return {instance.begin(), instance.end()};
}

}  // namespace calmframe::host
