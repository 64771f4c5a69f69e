#include "stabilizer/effect/src/state_format/stored_tracks.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <cstdint>
#include <limits>
#include <span>
#include <stdexcept>
#include <utility>
#include <vector>

#include "stabilizer/effect/src/state_format/format.h"

namespace kelp::effect::state_format {
namespace {

using marrow::tracking::AllFeatures;
using marrow::tracking::PackedCells;
using marrow::tracking::TrackCells;
using tessel::filesupport::InputByteStream;
using tessel::filesupport::OutputByteStream;
using tessel::filesupport::StreamError;
using Cell = marrow::tracking::tracking_feature<float>;
using Words = std::vector<std::int32_t>;

constexpr float kStepsPerPixel = 32.0f;
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

void WriteWords(OutputByteStream& out, const Words& words) {
  out.Write(words.data(), words.size() * sizeof words[0]);
}

void ReadWords(InputByteStream& in, Words& words) {
  in.Read(words.data(), words.size() * sizeof words[0]);
}

void WritePackedTable(OutputByteStream& out, const AllFeatures& table) {
  std::vector<Cell> cells(static_cast<std::size_t>(table.feature_count));
  Words steps(2 * cells.size()), statuses(cells.size());
  for (std::size_t row = 0; row < static_cast<std::size_t>(table.frame_count); ++row) {
    std::vector<std::uint8_t> made;
    std::span<const std::uint8_t> bytes;
    if (table.packed) {
      bytes = table.packed->packed(row);
    } else {
      table.ReadRow(row, cells.data());
      for (std::size_t s = 0; s < cells.size(); ++s) {
        steps[s] = Steps(cells[s].x);
        steps[cells.size() + s] = Steps(cells[s].y);
        statuses[s] = cells[s].status;
      }
      bytes = made = PackedCells::Pack(row, steps, statuses);
    }
    out << static_cast<std::uint32_t>(bytes.size());
    out.Write(bytes.data(), bytes.size());
  }
}

void ReadPackedTable(InputByteStream& in, std::uint64_t rows, PackedCells& cells) {
  for (std::uint64_t row = 0; row < rows; ++row) {
    std::uint32_t size = 0;
    in >> size;
    ExpectRoomFor(in, size, 1);
    std::vector<std::uint8_t> bytes(size);
    in.Read(bytes.data(), size);
    if (!cells.AppendPacked(std::move(bytes))) throw StreamError("a row of tracks is none");
  }
}

// Positions of the oldest versions, which no steps hold.
void ReadFloatPositions(InputByteStream& in, std::uint64_t count, TrackCells& cells) {
  // A zip stream's bound lies far above what most hold, so cells come into being as they are read.
  ForEachPiece(count, [&](std::size_t first, std::size_t of_piece) {
    cells.resize(first + of_piece);
    std::vector<float> floats(2 * of_piece);
    in.Read(floats.data(), floats.size() * sizeof floats[0]);
    for (std::size_t i = 0; i < of_piece; ++i) {
      cells[first + i] = {Tame(floats[2 * i]), Tame(floats[2 * i + 1]), 0, 0};
    }
  });
}

}  // namespace

void WriteTrackTable(OutputByteStream& out, const AllFeatures& table, PayloadForm form) {
  const auto slots = static_cast<std::size_t>(table.feature_count);
  const auto rows = static_cast<std::size_t>(table.frame_count);
  if (table.packed ? table.packed->slots() != slots || table.packed->rows() != rows
                   : table.features->size() != slots * rows) {
    throw std::logic_error("track table of another size than its counts tell");
  }
  if (form == PayloadForm::packed) return WritePackedTable(out, table);
  std::vector<Cell> cells(slots);
  Words words;
  for (std::size_t row = 0; row < rows; ++row) {
    table.ReadRow(row, cells.data());
    words.clear();
    for (const Cell& cell : cells) {
      words.push_back(Steps(cell.x));
      words.push_back(Steps(cell.y));
    }
    WriteWords(out, words);
  }
  for (std::size_t row = 0; row < rows; ++row) {
    table.ReadRow(row, cells.data());
    words.clear();
    for (const Cell& cell : cells) words.push_back(cell.status);
    WriteWords(out, words);
  }
}

void ReadTrackTable(InputByteStream& in, bool fixed_point, PayloadForm form, AllFeatures& table) {
  const auto slots = static_cast<std::uint64_t>(table.feature_count);
  const auto rows = static_cast<std::uint64_t>(table.frame_count);
  const auto packed = boost::make_shared<PackedCells>(slots);
  if (form == PayloadForm::packed) {
    ReadPackedTable(in, rows, *packed);
    table.packed = packed;
    return;
  }
  ExpectRoomFor(in, slots * rows, kCellBytes);
  if (!fixed_point) {
    TrackCells& cells = *table.features;
    ReadFloatPositions(in, slots * rows, cells);
    ForEachPiece(slots * rows, [&](std::size_t first, std::size_t count) {
      Words statuses(count);
      ReadWords(in, statuses);
      for (std::size_t i = 0; i < count; ++i) cells[first + i].status = statuses[i];
    });
    return;
  }
  // A zip stream's bound lies far above what most hold, so rows come into being as they are read.
  for (std::uint64_t row = 0; row < rows; ++row) {
    Words pairs, steps;
    for (std::size_t left = 2 * slots; left > 0;) {
      const std::size_t first = pairs.size();
      pairs.resize(first + std::min<std::size_t>(left, kPiece));
      in.Read(pairs.data() + first, (pairs.size() - first) * sizeof pairs[0]);
      left -= pairs.size() - first;
    }
    for (const std::size_t axis : {0, 1}) {
      for (std::size_t s = 0; s < slots; ++s) steps.push_back(pairs[2 * s + axis]);
    }
    packed->AppendPositions(steps);
  }
  for (std::uint64_t row = 0; row < rows; ++row) {
    Words statuses(slots);
    ReadWords(in, statuses);
    packed->SetStatuses(row, statuses);
  }
  table.packed = packed;
}

}  // namespace kelp::effect::state_format
