#include <cerrno>
#include <cstring>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>
#include <vector>

#include "host/media/clip.h"
#include "host/media/output_file.h"
#include "host/project/project_file.h"
#include "host/project/project_format.h"
#include "host/project/sqlite.h"

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;
using tessel::utility::Guid;

constexpr char kDrop[] =
    "DROP TABLE IF EXISTS setting; DROP TABLE IF EXISTS parameter; DROP TABLE IF EXISTS instance;"
    "DROP TABLE IF EXISTS frames; DROP TABLE IF EXISTS shot;";
constexpr char kDropPieces[] = "DROP TABLE IF EXISTS analysis";  // of ProjectKeeper's
constexpr char kCreate[] =
    "CREATE TABLE setting (key TEXT PRIMARY KEY, value) WITHOUT ROWID;"
    "CREATE TABLE shot (number INTEGER PRIMARY KEY, start_frame INTEGER NOT NULL,"
    " length INTEGER NOT NULL, choice TEXT NOT NULL, instance BLOB NOT NULL);"
    "CREATE TABLE parameter (shot INTEGER, disk_id INTEGER, value REAL NOT NULL,"
    " PRIMARY KEY (shot, disk_id)) WITHOUT ROWID;"
    "CREATE TABLE frames (id INTEGER PRIMARY KEY CHECK (id = 1), bytes BLOB NOT NULL);"
    "PRAGMA application_id = 1130458221; PRAGMA user_version = 6;";
constexpr char kCreateWithoutWork[] =
    "CREATE TABLE analysis (start_frame INTEGER, number INTEGER, bytes BLOB NOT NULL,"
    " PRIMARY KEY (start_frame, number)) WITHOUT ROWID;"
    "PRAGMA application_id = 1130458221; PRAGMA user_version = 6;";
static_assert(kProjectVersion == 6);

// The rows of the file that are not as the project has them.
struct Rows {
  std::vector<std::size_t> shots;
  bool frames = false;
};

void WriteShot(SqliteDatabase& database, std::int64_t number, const SavedShot& shot) {
  SqliteStatement row(database, "INSERT OR REPLACE INTO shot VALUES (?, ?, ?, ?, ?)");
  row.Bind(1, number);
  row.Bind(2, std::int64_t{shot.start_frame});
  row.Bind(3, std::int64_t{shot.length});
  row.Bind(4, shot.choice);
  row.Bind(5, shot.effect.instance);
  row.Step();
  SqliteStatement old(database, "DELETE FROM parameter WHERE shot = ?");
  old.Bind(1, number);
  old.Step();
  SqliteStatement parameter(database, "INSERT INTO parameter VALUES (?, ?, ?)");
  for (const auto& [disk_id, value] : shot.effect.values) {
    parameter.Bind(1, number);
    parameter.Bind(2, std::int64_t{disk_id});
    parameter.Bind(3, value);
    parameter.Step();
  }
}

void Write(SqliteDatabase& database, const Project& project, const ClipPlaces& places,
           const Rows& rows, const Guid& checksum) {
  WriteSettings(database, project, places, checksum);
  for (const char* const more :
       {"DELETE FROM shot WHERE number > ?", "DELETE FROM parameter WHERE shot > ?"}) {
    SqliteStatement fewer(database, more);
    fewer.Bind(1, static_cast<std::int64_t>(project.shots.size()));
    fewer.Step();
  }
  for (const std::size_t shot : rows.shots) {
    WriteShot(database, static_cast<std::int64_t>(shot) + 1, project.shots[shot]);
  }
  if (!rows.frames) return;
  SqliteStatement frames(database, "INSERT OR REPLACE INTO frames VALUES (1, ?)");
  frames.Bind(1, project.clip_frames);
  frames.Step();
}

// A new file gets its name when it is whole. fill(database) makes and fills its tables.
template <class Fill>
void Create(const fs::path& path, const Fill& fill) try {
  const media::OutputPart part(path.parent_path().string(), false, path.string());
  {
    SqliteDatabase database(part.path(), SQLITE_OPEN_READWRITE);
    database.Run("PRAGMA journal_mode = MEMORY; BEGIN");
    fill(database);
    database.Run("COMMIT");
  }
  if (!media::Synced(part.path())) Fail(path, std::strerror(errno));
  fs::rename(part.path(), path);
  media::SyncFolderOf(path.string());
} catch (const media::Failure& failure) {
  throw ProjectFailure(failure.what());
}

}  // namespace

void SaveProject(const std::string& path, const Project& project, std::size_t most) {
  ProjectSaver(path, most).Save(project, 0);
}

void ProjectSaver::Save(const Project& project, std::size_t changed) try {
  // What stands in the file is not known again before all is well.
  const std::optional<Standing> before = std::exchange(standing_, std::nullopt);
  for (const SavedShot& shot : project.shots) {
    if (shot.effect.instance.size() > most_) FailForSize(path_, most_);
  }
  if (project.clip_frames.size() > most_) FailForSize(path_, most_);
  std::error_code error;
  const fs::path place = fs::weakly_canonical(fs::absolute(path_), error);
  const fs::path clip = fs::weakly_canonical(fs::absolute(project.clip_path), error);
  const ClipPlaces places = {clip, clip.lexically_relative(place.parent_path())};

  Standing now = before.value_or(Standing());
  Rows rows, all{.shots = {}, .frames = true};
  now.shots.resize(project.shots.size());
  for (std::size_t s = 0; s < project.shots.size(); ++s) {
    all.shots.push_back(s);
    if (before && s < before->shots.size() && s != changed) continue;
    now.shots[s] = SumOf(project.shots[s]);
    rows.shots.push_back(s);
  }
  now.frames = SumOf(project.clip_frames);
  rows.frames = !before || now.frames != before->frames;
  now.whole = ChecksumOf(project, places, now.shots, now.frames);

  if (fs::exists(place, error)) {
    SqliteDatabase database(place, SQLITE_OPEN_READWRITE);
    CheckedVersion(place, database);
    database.Run("PRAGMA synchronous = EXTRA; BEGIN IMMEDIATE");
    // Another program may have saved meanwhile.
    const bool is_known = before && CheckedVersion(place, database) == kProjectVersion &&
                          SavedChecksum(database) == before->whole;
    if (!is_known) {
      database.Run(kDrop);
      database.Run(kCreate);
    }
    database.Run(kDropPieces);
    Write(database, project, places, is_known ? rows : all, now.whole);
    database.Run("COMMIT");
  } else {
    Create(place, [&](SqliteDatabase& database) {
      database.Run(kCreate);
      Write(database, project, places, all, now.whole);
    });
  }
  standing_ = std::move(now);
} catch (const SqliteError& error) {
  Fail(path_, error);
} catch (const fs::filesystem_error& error) {
  Fail(path_, error.code().message());
}

void CreateWithoutWork(const std::string& path) try {
  std::error_code error;
  Create(fs::weakly_canonical(fs::absolute(path), error),
         [](SqliteDatabase& database) { database.Run(kCreateWithoutWork); });
} catch (const SqliteError& error) {
  Fail(path, error);
} catch (const fs::filesystem_error& error) {
  Fail(path, error.code().message());
}

}  // namespace calmframe::host
