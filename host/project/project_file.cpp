#include "host/project/project_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <limits>
#include <type_traits>
#include <utility>
#include <vector>

#include "host/media/clip_files.h"
#include "host/media/frame_index.h"
#include "host/project/project_keeper.h"
#include "host/project/sqlite.h"
#include "host/timeline/source.h"

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;
using tessel::utility::Guid;

constexpr std::int64_t kApplicationId = 0x43616c6d;  // "Calm", in the database's header
// 1: the first. 2: the pixels' aspect; it was not told before. 3: the clip's frames. 4: the choice.
// 5: several shots, where one stood among the settings before.
constexpr std::int64_t kVersion = 5;

constexpr char kChecksum[] = "checksum";
constexpr char kCreate[] =
    "DROP TABLE IF EXISTS setting; DROP TABLE IF EXISTS parameter; DROP TABLE IF EXISTS instance;"
    "DROP TABLE IF EXISTS frames; DROP TABLE IF EXISTS shot; DROP TABLE IF EXISTS analysis;"
    "CREATE TABLE setting (key TEXT PRIMARY KEY, value) WITHOUT ROWID;"
    "CREATE TABLE shot (number INTEGER PRIMARY KEY, start_frame INTEGER NOT NULL,"
    " length INTEGER NOT NULL, choice TEXT NOT NULL, instance BLOB NOT NULL);"
    "CREATE TABLE parameter (shot INTEGER, disk_id INTEGER, value REAL NOT NULL,"
    " PRIMARY KEY (shot, disk_id)) WITHOUT ROWID;"
    "CREATE TABLE frames (id INTEGER PRIMARY KEY CHECK (id = 1), bytes BLOB NOT NULL);"
    "PRAGMA application_id = 1130458221; PRAGMA user_version = 5;";
// See ProjectKeeper.
constexpr char kCreateWithoutWork[] =
    "CREATE TABLE analysis (start_frame INTEGER, number INTEGER, bytes BLOB NOT NULL,"
    " PRIMARY KEY (start_frame, number)) WITHOUT ROWID;"
    "PRAGMA application_id = 1130458221; PRAGMA user_version = 5;";
static_assert(kApplicationId == 1130458221 && kVersion == 5);

[[noreturn]] void Fail(const std::string& path, const std::string& cause) {
  throw ProjectFailure(path + ": " + cause);
}

[[noreturn]] void FailForSize(const std::string& path, std::size_t most) {
  Fail(path, "its results take more than " + std::to_string(most) +
                 " bytes, the most that a project holds");
}

// SQLite's refusals in a user's words.
[[noreturn]] void Fail(const std::string& path, const SqliteError& error) {
  switch (error.code) {
    case SQLITE_NOTADB:
      Fail(path, "is no project");
    case SQLITE_CORRUPT:
    case SQLITE_ERROR:
      Fail(path, "is damaged");
    case SQLITE_FULL:
      Fail(path, "the disk is full");
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
      Fail(path, "is in use by another program");
    case SQLITE_READONLY:
      Fail(path, "may not be written");
    default:
      Fail(path, error.what());
  }
}

// The settings that a file of the version has, each with its place in the record. One list serves
// both ways.
template <class Record, class Visit>
void VisitSettings(Record& project, std::int64_t version, const Visit& visit) {
  auto& first = project.shots.front();
  visit("clip_path", project.clip_path);
  visit("clip_relative", project.clip_relative);
  visit("clip_content", project.clip_content);
  visit("width", project.width);
  visit("height", project.height);
  if (version < 5) {
    visit("start_frame", first.start_frame);
    visit("length", first.length);
  }
  visit("ticks_per_frame", project.ticks_per_frame);
  visit("field_type", project.field_type);
  visit("match_name", first.effect.match_name);
  if (version < 2) return;
  visit("pixel_aspect_num", project.pixel_aspect.num);
  visit("pixel_aspect_den", project.pixel_aspect.den);
  if (version == 4) visit("choice", first.choice);
  if (version >= 5) visit("end_frame", project.end_frame);
}

// Over all that a project holds. SQLite reads a cut or flipped page as it finds it.
Guid ChecksumOf(const Project& project, std::int64_t version) {
  Guid sum;
  const auto mix = [&](const void* data, std::size_t size) {
    sum = tessel::utility::MixHash(sum, data, size);
  };
  VisitSettings(project, version, [&]<class Value>(const char* key, const Value& value) {
    mix(key, std::strlen(key));
    if constexpr (std::is_same_v<Value, std::string>) {
      mix(value.data(), value.size());
    } else if constexpr (std::is_same_v<Value, Guid>) {
      mix(value.bytes().data(), value.bytes().size());
    } else {
      const std::int64_t number = value;
      mix(&number, sizeof number);
    }
  });
  for (const SavedShot& shot : project.shots) {
    if (version >= 5) {
      const std::int64_t told[] = {shot.start_frame, shot.length,
                                   static_cast<std::int64_t>(shot.choice.size())};
      mix(told, sizeof told);
      mix(shot.choice.data(), shot.choice.size());
    }
    for (const auto& [disk_id, value] : shot.effect.values) {
      mix(&disk_id, sizeof disk_id);
      mix(&value, sizeof value);
    }
    mix(shot.effect.instance.data(), shot.effect.instance.size());
  }
  if (version >= 3) mix(project.clip_frames.data(), project.clip_frames.size());
  return sum;
}

// Whatever a project tells, memory is taken for frames of this size and a span of so many, and no
// time in ticks leaves 64 bits, which twice the span and a frame more must fit into.
bool IsWithinRanges(const Project& project) {
  if (project.width < 0 || project.height < 0 ||
      std::int64_t{project.width} * project.height > media::kMaximumPixels) {
    return false;
  }
  constexpr auto kFrames = static_cast<std::int64_t>(media::kMaximumFrames);
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

struct SettingWriter {
  SqliteStatement& insert;

  void operator()(const char* key, const std::string& value) const { Insert(key, value); }
  void operator()(const char* key, const Guid& value) const { Insert(key, value.ToText()); }
  void operator()(const char* key, std::int64_t value) const { Insert(key, value); }

 private:
  template <class Value>
  void Insert(const char* key, const Value& value) const {
    const std::string key_text = key;
    insert.Bind(1, key_text);
    insert.Bind(2, value);
    insert.Step();
  }
};

struct SettingReader {
  SqliteStatement& select;

  void operator()(const char* key, std::string& value) const {
    Read(key, [&] { value = select.Text(0); });
  }
  void operator()(const char* key, Guid& value) const {
    Read(key, [&] {
      if (!Guid::Parse(select.Text(0), &value)) throw SqliteError(SQLITE_CORRUPT, key);
    });
  }
  void operator()(const char* key, std::int32_t& value) const {
    Read(key, [&] { value = static_cast<std::int32_t>(select.Integer(0)); });
  }
  void operator()(const char* key, std::uint32_t& value) const {
    Read(key, [&] { value = static_cast<std::uint32_t>(select.Integer(0)); });
  }
  void operator()(const char* key, std::int64_t& value) const {
    Read(key, [&] { value = select.Integer(0); });
  }

 private:
  void Read(const char* key, const std::function<void()>& take) const {
    const std::string key_text = key;
    select.Bind(1, key_text);
    if (!select.Step()) throw SqliteError(SQLITE_CORRUPT, key);
    take();
    while (select.Step()) {
    }
  }
};

// A blob whose length stands in the column before it.
std::vector<std::uint8_t> BytesOf(const SqliteStatement& row, int column, const std::string& path,
                                  std::size_t most) {
  if (row.Integer(column - 1) > static_cast<std::int64_t>(most)) FailForSize(path, most);
  return row.Bytes(column);
}

void Write(SqliteDatabase& database, const Project& project) {
  SqliteStatement setting(database, "INSERT INTO setting VALUES (?, ?)");
  VisitSettings(project, kVersion, SettingWriter{setting});
  SettingWriter{setting}(kChecksum, ChecksumOf(project, kVersion));
  SqliteStatement row(database, "INSERT INTO shot VALUES (?, ?, ?, ?, ?)");
  SqliteStatement parameter(database, "INSERT INTO parameter VALUES (?, ?, ?)");
  std::int64_t number = 0;
  for (const SavedShot& shot : project.shots) {
    row.Bind(1, ++number);
    row.Bind(2, std::int64_t{shot.start_frame});
    row.Bind(3, std::int64_t{shot.length});
    row.Bind(4, shot.choice);
    row.Bind(5, shot.effect.instance);
    row.Step();
    for (const auto& [disk_id, value] : shot.effect.values) {
      parameter.Bind(1, number);
      parameter.Bind(2, std::int64_t{disk_id});
      parameter.Bind(3, value);
      parameter.Step();
    }
  }
  SqliteStatement frames(database, "INSERT INTO frames VALUES (1, ?)");
  frames.Bind(1, project.clip_frames);
  frames.Step();
}

void ReadShots(SqliteDatabase& database, const std::string& path, std::size_t most,
               Project& project) {
  const std::string match_name = project.shots.front().effect.match_name;
  project.shots.clear();
  SqliteStatement row(database,
                      "SELECT number, start_frame, length, choice, length(instance), instance "
                      "FROM shot ORDER BY number");
  SqliteStatement parameter(database, "SELECT disk_id, value FROM parameter WHERE shot = ?");
  while (row.Step()) {
    SavedShot& shot = project.shots.emplace_back();
    shot.start_frame = static_cast<std::int32_t>(row.Integer(1));
    shot.length = static_cast<std::int32_t>(row.Integer(2));
    shot.choice = row.Text(3);
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

std::int64_t CheckedVersion(const std::string& path, SqliteDatabase& database) {
  if (database.Number("PRAGMA application_id") != kApplicationId) Fail(path, "is no project");
  const std::int64_t version = database.Number("PRAGMA user_version");
  if (version > kVersion) Fail(path, "was saved by a newer version of the program");
  return version;
}

void Sync(const fs::path& place) {
  const int file = open(place.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return;
  fsync(file);
  close(file);
}

// A new file gets its name when it is whole.
template <class Fill>
void Create(const fs::path& path, const Fill& fill) {
  std::string temporary = path.parent_path() / ".";
  temporary += path.filename().string();
  temporary += ".XXXXXX";
  const int made = mkstemp(temporary.data());
  if (made < 0) Fail(path, std::strerror(errno));
  close(made);
  try {
    {
      SqliteDatabase database(temporary, SQLITE_OPEN_READWRITE);
      database.Run("PRAGMA journal_mode = MEMORY; BEGIN");
      fill(database);
      database.Run("COMMIT");
    }
    chmod(temporary.c_str(), 0644);
    Sync(temporary);
    fs::rename(temporary, path);
    Sync(path.parent_path());
  } catch (...) {
    unlink(temporary.c_str());
    throw;
  }
}

void Replace(const fs::path& path, const Project& project) {
  SqliteDatabase database(path, SQLITE_OPEN_READWRITE);
  CheckedVersion(path, database);
  database.Run("PRAGMA synchronous = FULL; BEGIN IMMEDIATE");
  database.Run(kCreate);
  Write(database, project);
  database.Run("COMMIT");
}

}  // namespace

void SaveProject(const std::string& path, const Project& project, std::size_t most) try {
  for (const SavedShot& shot : project.shots) {
    if (shot.effect.instance.size() > most) FailForSize(path, most);
  }
  if (project.clip_frames.size() > most) FailForSize(path, most);
  std::error_code error;
  const fs::path place = fs::weakly_canonical(fs::absolute(path), error);
  Project saved = project;
  const fs::path clip = fs::weakly_canonical(fs::absolute(project.clip_path), error);
  saved.clip_path = clip;
  saved.clip_relative = clip.lexically_relative(place.parent_path());
  if (fs::exists(place, error)) {
    Replace(place, saved);
  } else {
    Create(place, [&](SqliteDatabase& database) {
      database.Run(kCreate);
      Write(database, saved);
    });
  }
} catch (const SqliteError& error) {
  Fail(path, error);
} catch (const fs::filesystem_error& error) {
  Fail(path, error.code().message());
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

Project LoadProject(const std::string& path, std::size_t most) try {
  std::error_code error;
  if (!fs::exists(path, error)) Fail(path, "is not there");
  // For writing, since an interrupted save is first taken back; SQLite does without where it must.
  SqliteDatabase database(path, SQLITE_OPEN_READWRITE);
  const std::int64_t version = CheckedVersion(path, database);
  if (!HoldsWork(path)) Fail(path, "holds an analysis that was stopped, and no work yet");
  Project project;
  SqliteStatement setting(database, "SELECT value FROM setting WHERE key = ?");
  VisitSettings(project, version, SettingReader{setting});
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
  Guid checksum;
  SettingReader{setting}(kChecksum, checksum);
  if (checksum != ChecksumOf(project, version) || !IsWithinRanges(project)) {
    throw SqliteError(SQLITE_CORRUPT, kChecksum);
  }
  return project;
} catch (const SqliteError& error) {
  Fail(path, error);
}

std::string FindClip(const std::string& path, const Project& project) {
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
    if (ContentOf(place) == project.clip_content) return place;
    if (changed.empty()) changed = place;
  }
  if (!changed.empty()) Fail(changed, "is not the clip that the project was made from");
  Fail(path, "its clip " + project.clip_path + " is gone");
}

}  // namespace calmframe::host
