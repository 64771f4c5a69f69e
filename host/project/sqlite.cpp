#include "host/project/sqlite.h"

#include <new>

namespace calmframe::host {
namespace {

constexpr int kBusyMilliseconds = 5000;

void CheckCode(sqlite3* database, int code) {
  if (code == SQLITE_OK || code == SQLITE_ROW || code == SQLITE_DONE) return;
  throw SqliteError(code, database ? sqlite3_errmsg(database) : sqlite3_errstr(code));
}

// The system's files, but for one kind: a journal may name a journal of several databases, which is
// opened and then removed. None of ours does, and a stranger's may name any file there is.
class OwnFiles {
 public:
  OwnFiles() : files_(FilesOfSystem()) {
    open_of_system = files_.xOpen;
    files_.zName = kName;
    files_.xOpen = [](sqlite3_vfs* own, const char* name, sqlite3_file* file, int flags,
                      int* opened) {
      if ((flags & SQLITE_OPEN_SUPER_JOURNAL) == 0) {
        return open_of_system(own, name, file, flags, opened);
      }
      file->pMethods = nullptr;
      return SQLITE_CORRUPT;
    };
    if (sqlite3_vfs_register(&files_, 0) != SQLITE_OK) throw std::bad_alloc();
  }
  // With the library that this is a part of.
  ~OwnFiles() { sqlite3_vfs_unregister(&files_); }
  OwnFiles(const OwnFiles&) = delete;
  OwnFiles& operator=(const OwnFiles&) = delete;

  static constexpr char kName[] = "calmframe";

 private:
  // There are none where SQLite had no memory to begin with.
  static const sqlite3_vfs& FilesOfSystem() {
    const sqlite3_vfs* const files = sqlite3_vfs_find(nullptr);
    if (!files) throw std::bad_alloc();
    return *files;
  }

  static inline decltype(sqlite3_vfs::xOpen) open_of_system = nullptr;
  sqlite3_vfs files_;
};

}  // namespace

SqliteDatabase::SqliteDatabase(const std::string& path, int flags) {
  static const OwnFiles files;
  const int code = sqlite3_open_v2(path.c_str(), &database_, flags, OwnFiles::kName);
  if (code != SQLITE_OK) {
    const SqliteError error(code, database_ ? sqlite3_errmsg(database_) : sqlite3_errstr(code));
    sqlite3_close(database_);
    throw error;
  }
  sqlite3_busy_timeout(database_, kBusyMilliseconds);
  // Pages that lead to themselves have rows without end.
  constexpr int kMillion = 1'000'000;
  sqlite3_progress_handler(
      database_, kMillion, [](void* left) { return --*static_cast<int*>(left) < 0 ? 1 : 0; },
      &millions_left_);
  for (const int off : {SQLITE_DBCONFIG_ENABLE_VIEW, SQLITE_DBCONFIG_ENABLE_TRIGGER,
                        SQLITE_DBCONFIG_TRUSTED_SCHEMA}) {
    sqlite3_db_config(database_, off, 0, nullptr);
  }
  sqlite3_db_config(database_, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
}

SqliteDatabase::~SqliteDatabase() {
  sqlite3_close(database_);
}

void SqliteDatabase::Run(const char* sql) {
  CheckCode(database_, sqlite3_exec(database_, sql, nullptr, nullptr, nullptr));
}

std::int64_t SqliteDatabase::Number(const char* sql) {
  SqliteStatement statement(*this, sql);
  return statement.Step() ? statement.Integer(0) : 0;
}

void SqliteDatabase::ExpectPlainTables() {
  constexpr const char* kOthers[] = {
      "SELECT count(*) FROM sqlite_master WHERE type NOT IN ('table', 'index') OR rootpage = 0"
      " OR (type = 'index' AND sql IS NOT NULL) OR (name = 'analysis' AND sql LIKE '%check%')",
      "SELECT count(*) FROM sqlite_master AS own, pragma_table_xinfo(own.name) AS field"
      " WHERE field.hidden <> 0"};
  for (const char* const others : kOthers) {
    if (Number(others) != 0) throw SqliteError(SQLITE_CORRUPT, "tables");
  }
}

SqliteStatement::SqliteStatement(SqliteDatabase& database, const char* sql) : database_(database) {
  Check(sqlite3_prepare_v2(database.get(), sql, -1, &statement_, nullptr));
}

void SqliteStatement::Check(int code) const {
  CheckCode(database_.get(), code);
}

void SqliteStatement::Bind(int parameter, std::int64_t value) {
  Check(sqlite3_bind_int64(statement_, parameter, value));
}

void SqliteStatement::Bind(int parameter, double value) {
  Check(sqlite3_bind_double(statement_, parameter, value));
}

void SqliteStatement::Bind(int parameter, const std::string& value) {
  Check(sqlite3_bind_text64(statement_, parameter, value.data(), value.size(), SQLITE_STATIC,
                            SQLITE_UTF8));
}

void SqliteStatement::Bind(int parameter, const std::vector<std::uint8_t>& value) {
  // A null pointer would be no blob at all.
  const void* bytes = value.empty() ? static_cast<const void*>("") : value.data();
  Check(sqlite3_bind_blob64(statement_, parameter, bytes, value.size(), SQLITE_STATIC));
}

bool SqliteStatement::Step() {
  const int code = sqlite3_step(statement_);
  if (code == SQLITE_ROW) return true;
  sqlite3_reset(statement_);
  Check(code);
  return false;
}

void SqliteStatement::CheckMemory(const void* value) const {
  if (!value && sqlite3_errcode(database_.get()) == SQLITE_NOMEM) Check(SQLITE_NOMEM);
}

std::string SqliteStatement::Text(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement_, column));
  CheckMemory(text);
  return text
             ? std::string(text, static_cast<std::size_t>(sqlite3_column_bytes(statement_, column)))
             : std::string();
}

std::vector<std::uint8_t> SqliteStatement::Bytes(int column) const {
  const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_, column));
  CheckMemory(bytes);
  const int size = sqlite3_column_bytes(statement_, column);
  return bytes ? std::vector<std::uint8_t>(bytes, bytes + size) : std::vector<std::uint8_t>();
}

}  // namespace calmframe::host
