#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "tracking/track_store.h"

namespace kelp::analysis {

enum class TrackFileResult { Written = 0, NotOpened = 1, NotWritten = 2, NotClosed = 3 };

// Dumps rows [first_row, end_row) of a track table to a TRK file: a 20-byte header, then 16 bytes a
// cell, row after row, little-endian; dead cells as they stand. `cells` is the first of these rows;
// where fewer than all their cells are `available`, the rest is written as zeros of status -1. The
// path is UTF-8; what stood there is lost.
TrackFileResult WriteTrackFile(const std::string& path,
                               const marrow::tracking::tracking_feature<float>* cells,
                               std::size_t available, std::int32_t first_row, std::int32_t end_row,
                               std::uint32_t feature_count);

// At the end of each analysis, if the debug option "WriteAnalysisServerTrackFile" holds: all rows
// to "OVAnalysis_unquantized.trk" in the system's folder for temporary files. The cells come from
// row first_frame of the table's vector on, which is row 0 only of a run from frame 0; what lies
// behind the vector is missing.
void WriteAnalysisServerTrackFile(const marrow::tracking::AllFeatures& all_features);

}  // namespace kelp::analysis
