#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <vector>

#include "host/effects/payload_form.h"
#include "host/stabilize/solved_clip.h"

// A solved effect's bytes, unpacked and measured. docs/state_format.md tells what stands in them.
namespace calmframe::host {

// Where what is read or changed lies in a payload.
struct SolvedLayout {
  std::int32_t source_width = 0, source_height = 0, aspect = 1;
  std::uint32_t aspect_divisor = 1;
  std::int32_t first_frame = 0, frames = 0, slots = 0;
  std::int32_t columns = 0, rows = 0;
  std::size_t warps = 0, warps_end = 0;
  std::size_t map = 0, map_entries = 0;
  std::size_t tracks = 0;
  // Of a packed payload, by frame: where its warp's bytes and its row of tracks begin.
  std::vector<std::size_t> packed_warps, packed_tracks;
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

inline constexpr std::size_t kMapKeyBytes = 2 * sizeof(std::int32_t);
inline constexpr std::size_t kMatrixBytes = 9 * sizeof(double);

// One frame's warp as it is stored: four corners, and for each vertex how far it lies from where
// the corners' map puts it, x and y in 1/256 pixel.
struct StoredWarp {
  std::array<Point, 4> corners;
  std::vector<std::int32_t> offsets;
};

struct SolvedPayload {
  PayloadForm form = PayloadForm::raw;  // of `bytes`: raw or packed
  std::vector<std::uint8_t> inflated;   // of a deflated instance
  std::span<const std::uint8_t> bytes;  // of the instance, or those
  SolvedLayout layout;

  SolvedPayload() = default;
  SolvedPayload(SolvedPayload&&) = default;
  SolvedPayload& operator=(SolvedPayload&&) = default;

  template <class T>
  T At(std::size_t place) const {
    T value;
    std::memcpy(&value, bytes.data() + place, sizeof value);
    return value;
  }
  // Throw NoSolvedClip where packed bytes are none.
  void Read(std::size_t frame, StoredWarp& warp) const;
  void Read(std::size_t frame, TrackRow& row) const;

 private:
  // Behind a count that stands there.
  std::span<const std::uint8_t> Packed(std::size_t place) const;
};

// Of a flattened instance, whose bytes it refers to. Throws NoSolvedClip.
SolvedPayload ReadPayload(std::span<const std::uint8_t> instance);

// Makes an instance with a payload that is appended to it piece by piece.
class InstanceWriter {
 public:
  // `size`: about how large it will be.
  InstanceWriter(PayloadForm form, std::size_t size);
  void Append(std::span<const std::uint8_t> bytes);
  template <class T>
  void Append(const T& value) {
    Append(std::span(reinterpret_cast<const std::uint8_t*>(&value), sizeof value));
  }
  // `columns`: of its grid.
  void Append(const StoredWarp& warp, std::size_t columns);
  std::vector<std::uint8_t> Take();

 private:
  const PayloadForm form_;
  std::vector<std::uint8_t> instance_;
};

}  // namespace calmframe::host
