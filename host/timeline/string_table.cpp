#include "host/timeline/string_table.h"

#include "platform/tessel/utility.h"

namespace calmframe::host {

HX_String StringTable::Make(const std::string& utf8) {
  auto record = std::make_unique<HX_StringRecord>();
  const std::u16string units = tessel::utility::ToUTF16(utf8);
  record->utf8 = utf8;
  record->utf16.assign(units.begin(), units.end());
  record->utf16.push_back(0);
  const HX_String string = record.get();
  std::lock_guard lock(mutex_);
  strings_.emplace(string, std::move(record));
  return string;
}

const HX_StringRecord* StringTable::Find(HX_String string) const {
  std::lock_guard lock(mutex_);
  const auto found = strings_.find(string);
  return found == strings_.end() ? nullptr : found->second.get();
}

bool StringTable::Dispose(HX_String string) {
  std::lock_guard lock(mutex_);
  return strings_.erase(string) == 1;
}

std::size_t StringTable::size() const {
  std::lock_guard lock(mutex_);
  return strings_.size();
}

}  // namespace calmframe::host
