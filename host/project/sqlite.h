#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace calmframe::host {

// What SQLite refuses: its primary result code, and its words.
class SqliteError : public std::runtime_error {
 public:
  SqliteError(int result_code, const std::string& words)
      : std::runtime_error(words), code(result_code & 0xff) {}
  const int code;
};

// An open database, for one thread. Waits some seconds for others that use it. Every operation
// throws SqliteError. What a strange file computes as it is read is kept out: its views and
// triggers are never run; nor does its journal lead to other files.
class SqliteDatabase {
 public:
  // flags: SQLITE_OPEN_*.
  SqliteDatabase(const std::string& path, int flags);
  ~SqliteDatabase();
  SqliteDatabase(const SqliteDatabase&) = delete;
  SqliteDatabase& operator=(const SqliteDatabase&) = delete;

  void Run(const char* sql);
  std::int64_t Number(const char* sql);  // first column of the first row; 0 without one
  // Throws SqliteError, as for a damaged file, where one of its tables is not just what was stored:
  // a view, a module's, or one with columns, indices or conditions that are computed, which may go
  // on for ever.
  void ExpectPlainTables();
  sqlite3* get() const { return database_; }

 private:
  sqlite3* database_ = nullptr;
  int millions_left_ = 200;  // of SQLite's steps: a film of 3000 shots takes 2
};

class SqliteStatement {
 public:
  SqliteStatement(SqliteDatabase& database, const char* sql);
  ~SqliteStatement() { sqlite3_finalize(statement_); }
  SqliteStatement(const SqliteStatement&) = delete;
  SqliteStatement& operator=(const SqliteStatement&) = delete;

  // Parameters from 1. Texts and bytes are read by the next Step.
  void Bind(int parameter, std::int64_t value);
  void Bind(int parameter, double value);
  void Bind(int parameter, const std::string& value);
  void Bind(int parameter, const std::vector<std::uint8_t>& value);
  // True while there is a row. After the last one the statement may be bound anew.
  bool Step();

  // Columns from 0.
  std::int64_t Integer(int column) const { return sqlite3_column_int64(statement_, column); }
  double Real(int column) const { return sqlite3_column_double(statement_, column); }
  std::string Text(int column) const;
  std::vector<std::uint8_t> Bytes(int column) const;

 private:
  void Check(int code) const;
  void CheckMemory(const void* value) const;  // a column's, null where there was none for it

  SqliteDatabase& database_;
  sqlite3_stmt* statement_ = nullptr;
};

}  // namespace calmframe::host
