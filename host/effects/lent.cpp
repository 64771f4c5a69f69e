#include "host/effects/lent.h"

#include <utility>

#include "host/base/operations.h"

namespace calmframe::host {

std::uint64_t OpenStringTables::Open(const HX_StringTable& table) {
  auto strings = std::make_unique<tessel::config::StringTable>(table.literals, table.count);
  std::lock_guard lock(mutex_);
  tables_[++last_token_] = std::move(strings);
  return last_token_;
}

const char* OpenStringTables::Get(std::uint64_t token, std::int32_t index) const {
  std::lock_guard lock(mutex_);
  const auto found = tables_.find(token);
  return found == tables_.end() ? nullptr : found->second->Get(index);
}

void OpenStringTables::Close(std::uint64_t token) {
  std::lock_guard lock(mutex_);
  if (tables_.erase(token) == 0) Ledger::Get().Mistake("close_strings: not open");
}

std::size_t OpenStringTables::count() const {
  std::lock_guard lock(mutex_);
  return tables_.size();
}

}  // namespace calmframe::host
