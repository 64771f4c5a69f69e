#include "analysis/src/track_file.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <new>
#include <vector>

#include "platform/tessel/debug.h"
#include "platform/tessel/filesupport.h"

namespace kelp::analysis {
namespace {

using Cell = marrow::tracking::tracking_feature<float>;
static_assert(sizeof(Cell) == 16);

constexpr std::int64_t kMagic = -11;

bool WriteHeader(tessel::filesupport::File& file, std::int32_t first_row, std::int32_t end_row,
                 std::uint32_t feature_count) {
  unsigned char header[20];
  std::memcpy(header, &kMagic, 8);
  std::memcpy(header + 8, &first_row, 4);
  std::memcpy(header + 12, &end_row, 4);
  std::memcpy(header + 16, &feature_count, 4);
  return file.Write(header, sizeof header);
}

bool WriteRows(tessel::filesupport::File& file, const Cell* cells, std::size_t available,
               std::int64_t rows, std::size_t feature_count) {
  if (feature_count == 0) return true;
  std::vector<Cell> row;
  try {
    row.resize(feature_count);
  } catch (const std::bad_alloc&) {
    return false;
  }
  for (std::int64_t r = 0; r < rows; ++r) {
    const std::size_t whole = std::min(available, feature_count);
    std::copy_n(cells, whole, row.begin());
    std::fill(row.begin() + static_cast<std::ptrdiff_t>(whole), row.end(),
              Cell{0, 0, marrow::tracking::feature_status::kEmpty, 0});
    cells += whole;
    available -= whole;
    if (!file.Write(row.data(), row.size() * sizeof(Cell))) return false;
  }
  return true;
}

}  // namespace

TrackFileResult WriteTrackFile(const std::string& path, const Cell* cells, std::size_t available,
                               std::int32_t first_row, std::int32_t end_row,
                               std::uint32_t feature_count) {
  tessel::filesupport::File file;
  if (!file.OpenForWriting(path)) return TrackFileResult::NotOpened;
  const bool written =
      WriteHeader(file, first_row, end_row, feature_count) &&
      WriteRows(file, cells, available, std::int64_t{end_row} - first_row, feature_count);
  const bool closed = file.Close();
  if (!written) return TrackFileResult::NotWritten;
  return closed ? TrackFileResult::Written : TrackFileResult::NotClosed;
}

void WriteAnalysisServerTrackFile(const marrow::tracking::AllFeatures& table) {
  if (!tessel::debug::DebugDatabase::GetBool("WriteAnalysisServerTrackFile")) return;
  std::error_code error;
  const std::filesystem::path folder = std::filesystem::temp_directory_path(error);
  if (error) return;
  const marrow::tracking::TrackCells& cells = *table.features;
  const std::size_t begin =
      std::min(cells.size(), static_cast<std::size_t>(table.first_frame) *
                                 static_cast<std::size_t>(table.feature_count));
  WriteTrackFile((folder / "OVAnalysis_unquantized.trk").string(), cells.data() + begin,
                 cells.size() - begin, 0, table.frame_count,
                 static_cast<std::uint32_t>(table.feature_count));
}

}  // namespace kelp::analysis
