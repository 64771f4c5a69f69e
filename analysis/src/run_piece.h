#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/tessel/guid.h"
#include "tracking/track_store.h"
#include "tracking/tracking_run.h"

// What is kept of a run while it is under way: pieces, each of the rows behind those of the piece
// before. With them a later process goes on where the last whole one ends.
namespace kelp::analysis {

using Bytes = std::vector<std::uint8_t>;

// The rows [first, state.rows) of the table, exactly, and the state behind them. `run` tells which
// run: what is analysed, and how.
Bytes PackRunPiece(const tessel::utility::Guid& run, const marrow::tracking::AllFeatures& table,
                   std::size_t first, const marrow::tracking::RunState& state);

// Adds the piece to a table of the run's final dimensions whose first state.rows rows are there;
// the state becomes the piece's. False, and the state stays, for a piece of another run, one that
// does not follow, one behind which no row is left, and a damaged one.
bool TakeRunPiece(const tessel::utility::Guid& run, std::span<const std::uint8_t> piece,
                  marrow::tracking::AllFeatures& table, marrow::tracking::RunState& state);

}  // namespace kelp::analysis
