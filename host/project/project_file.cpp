#include "host/project/project_file.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <limits>
#include <utility>
#include <vector>

#include "host/media/clip_files.h"
#include "host/media/frame_index.h"
#include "host/project/project_format.h"
#include "host/project/project_keeper.h"
#include "host/project/sqlite.h"
#include "host/timeline/source.h"

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;

// Whatever a project tells, memory is taken for frames of this size and a span of so many, and no
// time in ticks leaves 64 bits, which twice the span and a frame more must fit into.
bool IsWithinRanges(const Project& project) {
  if (project.width < 0 || project.height < 0 ||
      std::int64_t{project.width} * project.height > media::kMaximumPixels) {
    return false;
  }
  constexpr std::int64_t kFrames = media::kMaximumFrames;
  std::int64_t last_end = std::numeric_limits<std::int64_t>::min();
  for (const SavedShot& shot : project.shots) {
    const std::int64_t start = shot.start_frame, length = shot.length;
    if (start < -kFrames || start > kFrames || length < 0 || length > kFrames) return false;
    if (start < std::exchange(last_end, start + length)) return false;
    const std::int64_t most =
        std::numeric_limits<std::int64_t>::max() / (2 * (std::abs(start) + length + 1));
    if (project.ticks_per_frame > most) return false;
  }
  if (project.end_frame < last_end || project.end_frame > kFrames) return false;
  return project.ticks_per_frame > 0 && project.field_type >= HX_FIELD_PROGRESSIVE &&
         project.field_type <= HX_FIELD_SECOND_ORDER && project.pixel_aspect.num > 0 &&
         project.pixel_aspect.den != 0;
}

// A blob whose length stands in the column before it.
std::vector<std::uint8_t> BytesOf(const SqliteStatement& row, int column, const std::string& path,
                                  std::size_t most) {
  if (row.Integer(column - 1) > static_cast<std::int64_t>(most)) FailForSize(path, most);
  return row.Bytes(column);
}

void ReadShots(SqliteDatabase& database, const std::string& path, std::size_t most,
               Project& project) {
  const std::string match_name = project.shots.front().effect.match_name;
  project.shots.clear();
  SqliteStatement row(database,
                      "SELECT number, start_frame, length, choice, length(instance), instance "
                      "FROM shot ORDER BY number");
  SqliteStatement parameter(database, "SELECT disk_id, value FROM parameter WHERE shot = ?");
  // Pages may be those of many rows, all of which would be in memory.
  std::error_code error;
  std::uintmax_t left = fs::file_size(path, error);
  const auto take = [&left](std::uintmax_t bytes) {
    if (bytes > left) throw SqliteError(SQLITE_CORRUPT, "shot");
    left -= bytes;
  };
  while (row.Step()) {
    constexpr int kLeastBytes = 32;  // of a row
    take(kLeastBytes + static_cast<std::uintmax_t>(row.Integer(4)));
    SavedShot& shot = project.shots.emplace_back();
    shot.start_frame = static_cast<std::int32_t>(row.Integer(1));
    shot.length = static_cast<std::int32_t>(row.Integer(2));
    shot.choice = row.Text(3);
    take(shot.choice.size());
    shot.effect.match_name = match_name;
    shot.effect.instance = BytesOf(row, 5, path, most);
    parameter.Bind(1, row.Integer(0));
    while (parameter.Step()) {
      shot.effect.values[static_cast<std::int32_t>(parameter.Integer(0))] = parameter.Real(1);
    }
  }
  if (project.shots.empty()) throw SqliteError(SQLITE_CORRUPT, "shot");
}

// The one shot of files before version 5.
void ReadShot(SqliteDatabase& database, const std::string& path, std::size_t most,
              SavedShot& shot) {
  SqliteStatement parameter(database, "SELECT disk_id, value FROM parameter");
  while (parameter.Step()) {
    shot.effect.values[static_cast<std::int32_t>(parameter.Integer(0))] = parameter.Real(1);
  }
  SqliteStatement instance(database, "SELECT length(bytes), bytes FROM instance");
  if (!instance.Step()) throw SqliteError(SQLITE_CORRUPT, "instance");
  shot.effect.instance = BytesOf(instance, 1, path, most);
}

}  // namespace

Project LoadProject(const std::string& path, std::size_t most) try {
  std::error_code error;
  if (!fs::exists(path, error)) Fail(path, "is not there");
  // For writing, since an interrupted save is first taken back; SQLite does without where it must.
  SqliteDatabase database(path, SQLITE_OPEN_READWRITE);
  const std::int64_t version = CheckedVersion(path, database);
  if (!HoldsWork(path)) Fail(path, "holds an analysis that was stopped, and no work yet");
  Project project;
  ReadSettings(database, version, project);
  if (version < 5) {
    SavedShot& shot = project.shots.front();
    ReadShot(database, path, most, shot);
    project.end_frame = static_cast<std::int32_t>(std::int64_t{shot.start_frame} + shot.length);
  } else {
    ReadShots(database, path, most, project);
  }
  if (version >= 3) {
    SqliteStatement frames(database, "SELECT length(bytes), bytes FROM frames");
    if (!frames.Step()) throw SqliteError(SQLITE_CORRUPT, "frames");
    project.clip_frames = BytesOf(frames, 1, path, most);
  }
  if (SavedChecksum(database) != ChecksumOf(project, version) || !IsWithinRanges(project)) {
    throw SqliteError(SQLITE_CORRUPT, "checksum");
  }
  return project;
} catch (const SqliteError& error) {
  Fail(path, error);
}

std::string FindClip(const std::string& path, const Project& project,
                     const std::function<bool(const std::string&)>& admits) {
  const fs::path folder = fs::absolute(path).parent_path();
  std::vector<fs::path> places;
  if (!project.clip_relative.empty()) {
    places.push_back((folder / project.clip_relative).lexically_normal());
  }
  places.emplace_back(project.clip_path);
  places.push_back(folder / fs::path(project.clip_path).filename());
  std::string changed;
  for (const fs::path& place : places) {
    std::error_code error;
    if (!fs::is_regular_file(place, error) && !media::IsSequence(place)) continue;
    if (admits && !admits(place)) continue;
    if (ContentOf(place) == project.clip_content) return place;
    if (changed.empty()) changed = place;
  }
  if (!changed.empty()) Fail(changed, "is not the clip that the project was made from");
  Fail(path, "its clip " + project.clip_path + " is gone");
}

}  // namespace calmframe::host
