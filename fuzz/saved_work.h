#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <numeric>
#include <string>

#include "fuzz/input.h"
#include "fuzz/project_input.h"
#include "fuzz/scratch_file.h"
#include "host/project/project_file.h"
#include "platform/hx/hx_types.h"
#include "platform/tessel/guid.h"

// How a fuzzer's input tells of a file of saved work: a kind, then its bytes, or what stands in it.
namespace calmframe::fuzz {

enum class WorkKind : std::uint8_t {
  bytes,  // of the file
  told,   // SavedWork, a choice and a text of SQL, each to its zero, frames, a packed instance
  kind_count
};

struct SavedWork {
  std::int64_t ticks_per_frame = 0;
  double value = 0;          // of the parameter
  std::int32_t control = 0;  // its disk id
  std::int32_t width = 0, height = 0;
  std::int32_t aspect_num = 1;
  std::uint32_t aspect_den = 1;
  std::int32_t start_frame = 0, length = 0, end_frame = 0;
  std::uint16_t frame_bytes = 0;  // of what was found of the clip's frames
  std::uint8_t field_type = 0;
  std::uint8_t shots = 0;  // one behind the other, less one
};
static_assert(sizeof(SavedWork) == 56);

inline host::Project ProjectOf(const SavedWork& work, const std::string& choice,
                               const std::string& frames, const std::string& instance) {
  host::Project project;
  project.clip_path = "/clips/clip.mp4";
  const std::int64_t divisor = std::gcd(HX_TICKS_PER_SECOND, work.ticks_per_frame);
  // As the library tells frames of the identity "clip".
  std::string content = "frames";
  for (const std::int64_t number : {std::int64_t{work.width}, std::int64_t{work.height},
                                    divisor ? HX_TICKS_PER_SECOND / divisor : 0,
                                    divisor ? work.ticks_per_frame / divisor : 0}) {
    content += " " + std::to_string(number);
  }
  project.clip_content = tessel::utility::Guid::FromText(content + " clip");
  project.clip_frames.assign(frames.begin(), frames.end());
  project.width = work.width;
  project.height = work.height;
  project.pixel_aspect = {work.aspect_num, work.aspect_den};
  project.ticks_per_frame = work.ticks_per_frame;
  project.field_type = work.field_type;
  project.end_frame = work.end_frame;
  project.shots.resize(1 + work.shots % 3);
  std::uint32_t start = static_cast<std::uint32_t>(work.start_frame);
  for (host::SavedShot& shot : project.shots) {
    shot.start_frame = static_cast<std::int32_t>(start);
    shot.length = work.length;
    shot.choice = choice;
    shot.effect.match_name = "KLPX SubspaceStabilizer";
    shot.effect.values[work.control] = work.value;
    shot.effect.instance =
        host::InstanceIn(host::Unpacked(instance.data(), instance.size()), false);
    start += static_cast<std::uint32_t>(work.length);
  }
  return project;
}

// What stands in a file may be more than what a program puts there.
inline void RunSql(const std::string& path, const std::string& sql) {
  sqlite3* database = nullptr;
  if (sqlite3_open(path.c_str(), &database) == SQLITE_OK) {
    sqlite3_limit(database, SQLITE_LIMIT_LENGTH, 1 << 20);
    // No other file, beside the one without a name that VACUUM takes.
    sqlite3_set_authorizer(
        database,
        [](void*, int action, const char* name, const char*, const char*, const char*) {
          return action == SQLITE_ATTACH && name && *name ? SQLITE_DENY : SQLITE_OK;
        },
        nullptr);
    int turns = 0;
    sqlite3_progress_handler(
        database, 1000, [](void* count) { return ++*static_cast<int*>(count) > 20 ? 1 : 0; },
        &turns);
    sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr);
  }
  sqlite3_close(database);
}

// Makes the file that the rest of the input tells of; false where it is none that could be saved.
inline bool MakeSavedWork(Input& input, const ScratchFile& file) {
  if (input.Take<std::uint8_t>() % static_cast<int>(WorkKind::kind_count) ==
      static_cast<int>(WorkKind::bytes)) {
    file.Write(input.TakeRest());
    return true;
  }
  const auto work = input.Take<SavedWork>();
  const std::string choice = input.TakeText(), sql = input.TakeText();
  const std::string frames = input.TakeBytes(work.frame_bytes);
  try {
    host::SaveProject(file.path(), ProjectOf(work, choice, frames, input.TakeRest()));
  } catch (const host::ProjectFailure&) {
    return false;
  }
  if (!sql.empty()) RunSql(file.path(), sql);
  return true;
}

}  // namespace calmframe::fuzz
