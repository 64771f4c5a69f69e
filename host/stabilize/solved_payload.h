#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "host/stabilize/solved_clip.h"

// A solved effect's bytes, unpacked and measured. docs/state_format.md tells what stands in them.
namespace calmframe::host {

// Where what is read or changed lies in a payload.
struct SolvedLayout {
  std::int32_t source_width = 0, source_height = 0, aspect = 1;
  std::uint32_t aspect_divisor = 1;
  std::int32_t first_frame = 0, frames = 0, slots = 0;
  std::int32_t columns = 0, rows = 0;
  std::size_t warps = 0;
  std::size_t map = 0, map_entries = 0;
  std::size_t tracks = 0;
  std::size_t crop = 0;  // from whether there is one
  bool has_crop = false;

  std::size_t vertices() const {
    return static_cast<std::size_t>(columns) * static_cast<std::size_t>(rows);
  }
  std::size_t cells() const {
    return static_cast<std::size_t>(frames) * static_cast<std::size_t>(slots);
  }
  // The width in square pixels, rounded half up, at least 1.
  double square_width() const;
};

inline constexpr std::size_t kCornerBytes = 4 * 2 * sizeof(double);
inline constexpr std::size_t kOffsetBytes = 2 * sizeof(std::int32_t);  // of a vertex
inline constexpr std::size_t kMapKeyBytes = 2 * sizeof(std::int32_t);
inline constexpr std::size_t kMatrixBytes = 9 * sizeof(double);
// Of a cell of the track table; positions and statuses stand apart.
inline constexpr std::size_t kPositionBytes = 2 * sizeof(std::int32_t);
inline constexpr std::size_t kStatusBytes = sizeof(std::int32_t);

struct SolvedPayload {
  std::string bytes;
  SolvedLayout layout;

  template <class T>
  T At(std::size_t place) const {
    T value;
    std::memcpy(&value, bytes.data() + place, sizeof value);
    return value;
  }
  template <class T>
  void Put(std::size_t place, const T& value) {
    std::memcpy(bytes.data() + place, &value, sizeof value);
  }
};

// Throws NoSolvedClip.
SolvedPayload ReadPayload(const std::vector<std::uint8_t>& instance);

// An instance with that payload, raw.
std::vector<std::uint8_t> InstanceOf(const std::string& payload);

}  // namespace calmframe::host
