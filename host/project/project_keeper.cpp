#include "host/project/project_keeper.h"

#include <algorithm>
#include <exception>
#include <filesystem>
#include <utility>

#include "host/project/project_file.h"
#include "host/project/sqlite.h"

namespace calmframe::host {
namespace {

constexpr std::int64_t kRatio = 50;  // of the time between pieces to that of keeping one

bool HasTable(SqliteDatabase& database, const std::string& name) {
  SqliteStatement table(database, "SELECT 1 FROM sqlite_master WHERE type = 'table' AND name = ?");
  table.Bind(1, name);
  return table.Step();
}

}  // namespace

ProjectKeeper::ProjectKeeper(std::string path, std::int32_t start_frame,
                             std::chrono::milliseconds apart)
    : path_(std::move(path)),
      start_frame_(start_frame),
      apart_(apart),
      next_(Clock::now() + apart) {}

bool ProjectKeeper::Wants() noexcept {
  if (failed_ || Clock::now() < next_) return false;
  next_ = Clock::now() + apart_;
  return true;
}

void ProjectKeeper::Keep(std::size_t number, const std::uint8_t* bytes, std::size_t size) noexcept
    try {
  if (failed_) return;
  const Clock::time_point begun = Clock::now();
  if (!std::filesystem::exists(path_)) CreateWithoutWork(path_);
  SqliteDatabase database(path_, SQLITE_OPEN_READWRITE);
  database.ExpectPlainTables();
  database.Run(
      "PRAGMA synchronous = FULL; BEGIN IMMEDIATE;"
      "CREATE TABLE IF NOT EXISTS analysis (start_frame INTEGER, number INTEGER,"
      " bytes BLOB NOT NULL, PRIMARY KEY (start_frame, number)) WITHOUT ROWID");
  SqliteStatement old(database, "DELETE FROM analysis WHERE start_frame = ? AND number >= ?");
  old.Bind(1, start_frame_);
  old.Bind(2, static_cast<std::int64_t>(number));
  old.Step();
  SqliteStatement piece(database, "INSERT INTO analysis VALUES (?, ?, ?)");
  const std::vector<std::uint8_t> copy(bytes, bytes + size);
  piece.Bind(1, start_frame_);
  piece.Bind(2, static_cast<std::int64_t>(number));
  piece.Bind(3, copy);
  piece.Step();
  database.Run("COMMIT");
  const Clock::time_point end = Clock::now();
  next_ = end + std::max(apart_, (end - begun) * kRatio);
} catch (const std::exception&) {
  failed_ = true;
}

const std::vector<std::uint8_t>* ProjectKeeper::Find(std::size_t number) noexcept try {
  if (!std::filesystem::exists(path_)) return nullptr;
  SqliteDatabase database(path_, SQLITE_OPEN_READWRITE);
  if (!HasTable(database, "analysis")) return nullptr;
  database.ExpectPlainTables();
  SqliteStatement piece(database,
                        "SELECT bytes FROM analysis WHERE start_frame = ? AND number = ?");
  piece.Bind(1, start_frame_);
  piece.Bind(2, static_cast<std::int64_t>(number));
  if (!piece.Step()) return nullptr;
  found_ = piece.Bytes(0);
  return &found_;
} catch (const std::exception&) {
  return nullptr;
}

bool HoldsWork(const std::string& path) try {
  SqliteDatabase database(path, SQLITE_OPEN_READWRITE);
  return !HasTable(database, "analysis") || HasTable(database, "setting");
} catch (const std::exception&) {
  return true;
}

}  // namespace calmframe::host
