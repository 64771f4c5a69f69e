#include "apps/report/track_table.h"

#include <algorithm>
#include <filesystem>
#include <fstream>

namespace calmframe::report {

std::optional<TrackTable> ReadTrackFile(const std::string& path) {
  constexpr std::int64_t kMarker = -11;
  constexpr std::uintmax_t kHeaderBytes = 20;
  static_assert(sizeof(TrackTable::Cell) == 16);
  std::error_code error;
  const std::uintmax_t bytes = std::filesystem::file_size(path, error);
  std::ifstream file(path, std::ios::binary);
  std::int64_t marker = 0;
  std::int32_t first = 0, end = 0;
  std::uint32_t slots = 0;
  const auto read = [&file](auto* to, std::size_t size) {
    return static_cast<bool>(
        file.read(reinterpret_cast<char*>(to), static_cast<std::streamsize>(size)));
  };
  if (error || !read(&marker, sizeof marker) || !read(&first, sizeof first) ||
      !read(&end, sizeof end) || !read(&slots, sizeof slots) || marker != kMarker || first != 0 ||
      end < 0) {
    return {};
  }
  TrackTable table;
  table.rows = static_cast<std::size_t>(end);
  table.slots = slots;
  const std::size_t cells = table.rows * table.slots;
  if ((bytes - kHeaderBytes) / sizeof(TrackTable::Cell) < cells) return {};
  table.cells.resize(cells);
  if (!read(table.cells.data(), cells * sizeof(TrackTable::Cell))) return {};
  return table;
}

std::size_t MedianLife(const TrackTable& table) {
  std::vector<std::size_t> lives;
  for (std::size_t slot = 0; slot < table.slots; ++slot) {
    std::size_t life = 0;
    for (std::size_t row = 0; row <= table.rows; ++row) {
      const bool alive = row < table.rows && table.At(row, slot).alive();
      if (life > 0 && (!alive || table.At(row, slot).begins())) {
        lives.push_back(life);
        life = 0;
      }
      life += alive;
    }
  }
  if (lives.empty()) return 0;
  const auto middle = lives.begin() + static_cast<std::ptrdiff_t>(lives.size() / 2);
  std::nth_element(lives.begin(), middle, lives.end());
  return *middle;
}

}  // namespace calmframe::report
