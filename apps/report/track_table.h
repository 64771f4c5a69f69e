#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace calmframe::report {

// A track file as docs/track_file.md tells it: a row a frame (a field where the clip is
// interlaced), a slot a feature.
struct TrackTable {
  struct Cell {
    float x = 0, y = 0;  // source pixels
    std::int32_t status = -1;
    float correlation = 0;
    bool alive() const { return status >= 0; }
    bool begins() const { return status > 0; }
  };
  std::size_t rows = 0, slots = 0;
  std::vector<Cell> cells;
  const Cell& At(std::size_t row, std::size_t slot) const { return cells[row * slots + slot]; }
};

// Null where the file is none or isn't whole.
std::optional<TrackTable> ReadTrackFile(const std::string& path);

// In how many rows a track is seen, the median over all tracks; 0 without any.
std::size_t MedianLife(const TrackTable& table);

}  // namespace calmframe::report
