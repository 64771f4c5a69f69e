#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "host/project/project_file.h"
#include "host/project/sqlite.h"
#include "platform/tessel/guid.h"

// What saving and loading a project's file share.

namespace calmframe::host {

// 1: the first. 2: the pixels' aspect; it was not told before. 3: the clip's frames. 4: the choice.
// 5: several shots, where one stood among the settings before. 6: a checksum of checksums.
inline constexpr std::int64_t kProjectVersion = 6;

[[noreturn]] void Fail(const std::string& path, const std::string& cause);
[[noreturn]] void FailForSize(const std::string& path, std::size_t most);
// SQLite's refusals in a user's words.
[[noreturn]] void Fail(const std::string& path, const SqliteError& error);

// Where a project's clip lies, as it is about to be saved; a Project has the same two.
struct ClipPlaces {
  std::string clip_path, clip_relative;
};

// Of an open file of that version. Throws SqliteError where one is missing.
void ReadSettings(SqliteDatabase& database, std::int64_t version, Project& project);
// Into an open file of this version.
void WriteSettings(SqliteDatabase& database, const Project& project, const ClipPlaces& places,
                   const tessel::utility::Guid& checksum);

// Over a shot as this version has it, and over bytes.
tessel::utility::Guid SumOf(const SavedShot& shot);
tessel::utility::Guid SumOf(const std::vector<std::uint8_t>& bytes);
// Over all that a project holds, of its settings, and of the sums of its shots and its clip's
// frames. SQLite reads a cut or flipped page as it finds it.
tessel::utility::Guid ChecksumOf(const Project& project, const ClipPlaces& places,
                                 const std::vector<tessel::utility::Guid>& shots,
                                 const tessel::utility::Guid& frames);
// As a file of that version has it.
tessel::utility::Guid ChecksumOf(const Project& project, std::int64_t version);

// Throws ProjectFailure where it is no project, or of a newer version, and SqliteError where its
// tables are no plain ones.
std::int64_t CheckedVersion(const std::string& path, SqliteDatabase& database);
// Of an open file. Throws SqliteError where it has none.
tessel::utility::Guid SavedChecksum(SqliteDatabase& database);

}  // namespace calmframe::host
