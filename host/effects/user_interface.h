#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <utility>

#include "platform/hx/hx_types.h"

namespace calmframe::host {

// What plug-ins did to the host's windows. Any thread.
class UserInterface {
 public:
  // The information panel: two lines, both empty when it is clear.
  std::pair<std::string, std::string> info() const;
  // Each write, clears left out, counts one.
  std::uint64_t info_writes() const;
  std::uint64_t refreshes() const;      // of all windows
  std::uint64_t invalidations() const;  // of a part of one
  HX_Rect last_invalidated() const;

  void SetInfo(const std::string& line1, const std::string& line2);
  void ClearInfo();
  void Refresh();
  void Invalidate(const HX_Rect& rect);

 private:
  mutable std::mutex mutex_;
  std::pair<std::string, std::string> info_;  // all guarded by mutex_
  std::uint64_t info_writes_ = 0, refreshes_ = 0, invalidations_ = 0;
  HX_Rect last_invalidated_{};
};

}  // namespace calmframe::host
