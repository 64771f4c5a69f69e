#include "host/project/project_format.h"

#include <cstring>
#include <functional>
#include <type_traits>

namespace calmframe::host {
namespace {

using tessel::utility::Guid;

constexpr std::int64_t kApplicationId = 0x43616c6d;  // "Calm", in the database's header
constexpr char kChecksum[] = "checksum";
constexpr char kSelectSetting[] = "SELECT value FROM setting WHERE key = ?";

// The settings that a file of the version has, each with its place in the record. One list serves
// both ways.
template <class Record, class Places, class Visit>
void VisitSettings(Record& project, Places& places, std::int64_t version, const Visit& visit) {
  auto& first = project.shots.front();
  visit("clip_path", places.clip_path);
  visit("clip_relative", places.clip_relative);
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

// A sum over several things, one behind the other.
class Checksum {
 public:
  void Mix(const void* data, std::size_t size) {
    sum_ = tessel::utility::MixHash(sum_, data, size);
  }
  void Mix(const Guid& sum) { Mix(sum.bytes().data(), sum.bytes().size()); }
  const Guid& sum() const { return sum_; }

 private:
  Guid sum_;
};

void MixShot(const SavedShot& shot, std::int64_t version, Checksum& sum) {
  if (version >= 5) {
    const std::int64_t told[] = {shot.start_frame, shot.length,
                                 static_cast<std::int64_t>(shot.choice.size())};
    sum.Mix(told, sizeof told);
    sum.Mix(shot.choice.data(), shot.choice.size());
  }
  for (const auto& [disk_id, value] : shot.effect.values) {
    sum.Mix(&disk_id, sizeof disk_id);
    sum.Mix(&value, sizeof value);
  }
  sum.Mix(shot.effect.instance.data(), shot.effect.instance.size());
}

template <class Places>
void MixSettings(const Project& project, const Places& places, std::int64_t version,
                 Checksum& sum) {
  VisitSettings(project, places, version, [&]<class Value>(const char* key, const Value& value) {
    sum.Mix(key, std::strlen(key));
    if constexpr (std::is_same_v<Value, std::string>) {
      sum.Mix(value.data(), value.size());
    } else if constexpr (std::is_same_v<Value, Guid>) {
      sum.Mix(value);
    } else {
      const std::int64_t number = value;
      sum.Mix(&number, sizeof number);
    }
  });
}

template <class Places>
Guid SumOfSums(const Project& project, const Places& places, const std::vector<Guid>& shots,
               const Guid& frames) {
  Checksum sum;
  MixSettings(project, places, kProjectVersion, sum);
  for (const Guid& shot : shots) sum.Mix(shot);
  sum.Mix(frames);
  return sum.sum();
}

}  // namespace

void Fail(const std::string& path, const std::string& cause) {
  throw ProjectFailure(path + ": " + cause);
}

void FailForSize(const std::string& path, std::size_t most) {
  Fail(path, "its results take more than " + std::to_string(most) +
                 " bytes, the most that a project holds");
}

void Fail(const std::string& path, const SqliteError& error) {
  switch (error.code) {
    case SQLITE_NOTADB:
      Fail(path, "is no project");
    case SQLITE_CORRUPT:
    case SQLITE_ERROR:
    case SQLITE_INTERRUPT:
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

Guid SumOf(const SavedShot& shot) {
  Checksum sum;
  MixShot(shot, kProjectVersion, sum);
  return sum.sum();
}

Guid SumOf(const std::vector<std::uint8_t>& bytes) {
  return tessel::utility::MixHash(Guid(), bytes.data(), bytes.size());
}

Guid ChecksumOf(const Project& project, const ClipPlaces& places, const std::vector<Guid>& shots,
                const Guid& frames) {
  return SumOfSums(project, places, shots, frames);
}

Guid ChecksumOf(const Project& project, std::int64_t version) {
  if (version >= 6) {
    std::vector<Guid> shots;
    for (const SavedShot& shot : project.shots) shots.push_back(SumOf(shot));
    return SumOfSums(project, project, shots, SumOf(project.clip_frames));
  }
  Checksum sum;
  MixSettings(project, project, version, sum);
  for (const SavedShot& shot : project.shots) MixShot(shot, version, sum);
  if (version >= 3) sum.Mix(project.clip_frames.data(), project.clip_frames.size());
  return sum.sum();
}

std::int64_t CheckedVersion(const std::string& path, SqliteDatabase& database) {
  if (database.Number("PRAGMA application_id") != kApplicationId) Fail(path, "is no project");
  database.ExpectPlainTables();
  const std::int64_t version = database.Number("PRAGMA user_version");
  if (version > kProjectVersion) Fail(path, "was saved by a newer version of the program");
  return version;
}

void ReadSettings(SqliteDatabase& database, std::int64_t version, Project& project) {
  SqliteStatement setting(database, kSelectSetting);
  VisitSettings(project, project, version, SettingReader{setting});
}

void WriteSettings(SqliteDatabase& database, const Project& project, const ClipPlaces& places,
                   const Guid& checksum) {
  SqliteStatement setting(database, "INSERT OR REPLACE INTO setting VALUES (?, ?)");
  VisitSettings(project, places, kProjectVersion, SettingWriter{setting});
  SettingWriter{setting}(kChecksum, checksum);
}

Guid SavedChecksum(SqliteDatabase& database) {
  SqliteStatement setting(database, kSelectSetting);
  Guid checksum;
  SettingReader{setting}(kChecksum, checksum);
  return checksum;
}

}  // namespace calmframe::host
