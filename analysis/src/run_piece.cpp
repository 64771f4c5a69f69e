#include "analysis/src/run_piece.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

#include "platform/memory/packed_words.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::AffineState;
using marrow::tracking::AllFeatures;
using marrow::tracking::RunState;
using Cell = marrow::tracking::tracking_feature<float>;
using tessel::utility::Guid;
using Words = std::vector<std::int32_t>;

// A piece: MixHash of run and rest; then, packed, first row, row behind the last and slots with a
// state; for each row x, y, status and correlation of all slots, as the difference of their bits
// from the row before (the piece's first row from 0), and the floats of each slot's state.
constexpr std::size_t kHeadWords = 3;
constexpr std::size_t kCellWords = sizeof(Cell) / sizeof(std::int32_t);
constexpr std::size_t kStateWords = sizeof(AffineState) / sizeof(std::int32_t);
static_assert(sizeof(Cell) == 16 && sizeof(AffineState) % sizeof(std::int32_t) == 0 &&
              std::is_trivially_copyable_v<AffineState>);

Guid CheckOf(const Guid& run, std::span<const std::uint8_t> body) {
  return MixHash(run, body.data(), body.size());
}

std::int32_t Plus(std::int32_t a, std::int32_t b) {
  return static_cast<std::int32_t>(static_cast<std::uint32_t>(a) + static_cast<std::uint32_t>(b));
}

std::int32_t Minus(std::int32_t a, std::int32_t b) {
  return static_cast<std::int32_t>(static_cast<std::uint32_t>(a) - static_cast<std::uint32_t>(b));
}

// One coordinate of all slots after the other: equals lie together.
void WordsOf(const Cell* row, std::size_t slots, Words& words) {
  words.resize(slots * kCellWords);
  for (std::size_t s = 0; s < slots; ++s) {
    std::int32_t cell[kCellWords];
    std::memcpy(cell, row + s, sizeof cell);
    for (std::size_t k = 0; k < kCellWords; ++k) words[k * slots + s] = cell[k];
  }
}

void CellsOf(const Words& words, std::size_t slots, Cell* row) {
  for (std::size_t s = 0; s < slots; ++s) {
    std::int32_t cell[kCellWords];
    for (std::size_t k = 0; k < kCellWords; ++k) cell[k] = words[k * slots + s];
    std::memcpy(row + s, cell, sizeof cell);
  }
}

}  // namespace

Bytes PackRunPiece(const Guid& run, const AllFeatures& table, std::size_t first,
                   const RunState& state) {
  const auto slots = static_cast<std::size_t>(table.feature_count);
  Bytes body;
  memory::PackWords(Words{static_cast<std::int32_t>(first), static_cast<std::int32_t>(state.rows),
                          static_cast<std::int32_t>(state.slots.size())},
                    body);
  Words before(slots * kCellWords, 0), present, step(before.size());
  for (std::size_t t = first; t < state.rows; ++t) {
    WordsOf(table.features->data() + t * slots, slots, present);
    std::transform(present.begin(), present.end(), before.begin(), step.begin(), Minus);
    memory::PackWords(step, body);
    before.swap(present);
  }
  Words states(state.slots.size() * kStateWords);
  if (!states.empty()) std::memcpy(states.data(), state.slots.data(), states.size() * 4);
  memory::PackWords(states, body);
  const Guid::Bytes check = CheckOf(run, body).bytes();
  body.insert(body.begin(), check.begin(), check.end());
  return body;
}

bool TakeRunPiece(const Guid& run, std::span<const std::uint8_t> piece, AllFeatures& table,
                  RunState& state) {
  Guid::Bytes check;
  if (piece.size() < check.size()) return false;
  std::copy_n(piece.begin(), check.size(), check.begin());
  const auto body = piece.subspan(check.size());
  if (CheckOf(run, body) != Guid(check)) return false;

  const auto slots = static_cast<std::size_t>(table.feature_count);
  std::size_t place = 0;
  Words head(kHeadWords);
  if (!memory::UnpackWords(body, place, head)) return false;
  const auto first = static_cast<std::size_t>(head[0]), end = static_cast<std::size_t>(head[1]);
  if (first != state.rows || end <= first || head[1] >= table.frame_count || head[2] < 0 ||
      head[2] > table.feature_count) {
    return false;
  }
  Words row(slots * kCellWords, 0), step(row.size());
  for (std::size_t t = first; t < end; ++t) {
    if (!memory::UnpackWords(body, place, step)) return false;
    std::transform(row.begin(), row.end(), step.begin(), row.begin(), Plus);
    CellsOf(row, slots, table.features->data() + t * slots);
  }
  Words states(static_cast<std::size_t>(head[2]) * kStateWords);
  if (!memory::UnpackWords(body, place, states) || place != body.size()) return false;
  state.rows = end;
  state.slots.assign(static_cast<std::size_t>(head[2]), AffineState());
  if (!states.empty())
    std::memcpy(static_cast<void*>(state.slots.data()), states.data(), states.size() * 4);
  return true;
}

}  // namespace kelp::analysis
