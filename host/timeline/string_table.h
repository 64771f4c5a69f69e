#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/hx/hx_types.h"

// Constant.
struct HX_StringRecord {
  std::string utf8;
  std::vector<std::uint16_t> utf16;  // with the terminating zero
};

namespace calmframe::host {

// The strings that are lent. Any thread.
class StringTable {
 public:
  HX_String Make(const std::string& utf8);
  // Null for one that is not lent.
  const HX_StringRecord* Find(HX_String string) const;
  bool Dispose(HX_String string);  // false for one that is not lent
  std::size_t size() const;

 private:
  mutable std::mutex mutex_;
  std::map<HX_String, std::unique_ptr<HX_StringRecord>> strings_;  // guarded by mutex_
};

}  // namespace calmframe::host
