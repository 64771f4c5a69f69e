#include "stabilizer/effect/src/state_format/stored_tracks.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <stdexcept>
#include <vector>

#include "stabilizer/effect/src/state_format/format.h"

namespace kelp::effect::state_format {
namespace {

using Cell = marrow::tracking::tracking_feature<float>;

constexpr float kStepsPerPixel = 32.0f;
constexpr float kStep = 0.03125f;
constexpr std::uint64_t kCellBytes = 12;
// Beyond what the fixed-point form can hold; no frame is that large.
constexpr float kFarthest = 67108864.0f;

constexpr std::size_t kPiece = 1 << 14;  // cells

std::int32_t Steps(float position) {
  const float scaled = position * kStepsPerPixel;
  if (std::isnan(scaled)) return 0;
  constexpr auto kMost = std::numeric_limits<std::int32_t>::max();
  constexpr auto kLeast = std::numeric_limits<std::int32_t>::min();
  if (scaled >= -static_cast<float>(kLeast)) return kMost;
  if (scaled <= static_cast<float>(kLeast)) return kLeast;
  return static_cast<std::int32_t>(std::round(scaled));
}

float Tame(float position) {
  return std::isnan(position) ? 0.0f : std::clamp(position, -kFarthest, kFarthest);
}

// Calls visit(first, count) for the cells, a piece at a time.
template <class Visit>
void ForEachPiece(std::size_t cells, const Visit& visit) {
  for (std::size_t first = 0; first < cells; first += kPiece) {
    visit(first, std::min(kPiece, cells - first));
  }
}

}  // namespace

void WriteTrackTable(tessel::filesupport::OutputByteStream& out,
                     const marrow::tracking::AllFeatures& table) {
  const marrow::tracking::TrackCells& cells = *table.features;
  if (cells.size() !=
      static_cast<std::size_t>(table.feature_count) * static_cast<std::size_t>(table.frame_count)) {
    throw std::logic_error("track table of another size than its counts tell");
  }
  std::vector<std::int32_t> words;
  ForEachPiece(cells.size(), [&](std::size_t first, std::size_t count) {
    words.clear();
    for (std::size_t i = first; i < first + count; ++i) {
      words.push_back(Steps(cells[i].x));
      words.push_back(Steps(cells[i].y));
    }
    out.Write(words.data(), words.size() * sizeof words[0]);
  });
  ForEachPiece(cells.size(), [&](std::size_t first, std::size_t count) {
    words.clear();
    for (std::size_t i = first; i < first + count; ++i) words.push_back(cells[i].status);
    out.Write(words.data(), words.size() * sizeof words[0]);
  });
}

void ReadTrackTable(tessel::filesupport::InputByteStream& in, bool fixed_point,
                    marrow::tracking::AllFeatures& table) {
  const auto slots = static_cast<std::uint64_t>(table.feature_count);
  const auto rows = static_cast<std::uint64_t>(table.frame_count);
  ExpectRoomFor(in, slots * rows, kCellBytes);
  marrow::tracking::TrackCells& cells = *table.features;
  // A zip stream's bound lies far above what most hold, so cells come into being as they are read.
  ForEachPiece(slots * rows, [&](std::size_t first, std::size_t count) {
    cells.resize(first + count);
    std::vector<std::int32_t> fixed(fixed_point ? 2 * count : 0);
    std::vector<float> floats(fixed_point ? 0 : 2 * count);
    if (fixed_point) {
      in.Read(fixed.data(), fixed.size() * sizeof fixed[0]);
    } else {
      in.Read(floats.data(), floats.size() * sizeof floats[0]);
    }
    for (std::size_t i = 0; i < count; ++i) {
      Cell& cell = cells[first + i];
      cell.x = fixed_point ? static_cast<float>(fixed[2 * i]) * kStep : Tame(floats[2 * i]);
      cell.y = fixed_point ? static_cast<float>(fixed[2 * i + 1]) * kStep : Tame(floats[2 * i + 1]);
      cell.correlation = 0;
    }
  });
  ForEachPiece(slots * rows, [&](std::size_t first, std::size_t count) {
    std::vector<std::int32_t> statuses(count);
    in.Read(statuses.data(), count * sizeof statuses[0]);
    for (std::size_t i = 0; i < count; ++i) cells[first + i].status = statuses[i];
  });
}

}  // namespace kelp::effect::state_format
