#pragma once

#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "tracking/track_store.h"

// The track table within a stored state: the positions of all cells, then the statuses of all, row
// after row; or packed, each row by itself. No counts and no correlations.
namespace kelp::effect::state_format {

// Positions to the nearest 32nd of a pixel; what has no such form, which only a dead cell may hold,
// is 0 or the nearest that has one. The vector must hold feature_count * frame_count cells.
void WriteTrackTable(tessel::filesupport::OutputByteStream& out,
                     const marrow::tracking::AllFeatures& table, PayloadForm form);

// Fills the cells of a table whose counts are set. Throws StreamError for data that ends early, and
// takes no more memory than a small multiple of what it has read.
void ReadTrackTable(tessel::filesupport::InputByteStream& in, bool fixed_point, PayloadForm form,
                    marrow::tracking::AllFeatures& table);

}  // namespace kelp::effect::state_format
