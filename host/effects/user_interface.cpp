#include "host/effects/user_interface.h"

namespace calmframe::host {

std::pair<std::string, std::string> UserInterface::info() const {
  std::lock_guard lock(mutex_);
  return info_;
}

std::uint64_t UserInterface::info_writes() const {
  std::lock_guard lock(mutex_);
  return info_writes_;
}

std::uint64_t UserInterface::refreshes() const {
  std::lock_guard lock(mutex_);
  return refreshes_;
}

std::uint64_t UserInterface::invalidations() const {
  std::lock_guard lock(mutex_);
  return invalidations_;
}

HX_Rect UserInterface::last_invalidated() const {
  std::lock_guard lock(mutex_);
  return last_invalidated_;
}

void UserInterface::SetInfo(const std::string& line1, const std::string& line2) {
  std::lock_guard lock(mutex_);
  info_ = {line1, line2};
  ++info_writes_;
}

void UserInterface::ClearInfo() {
  std::lock_guard lock(mutex_);
  info_ = {};
}

void UserInterface::Refresh() {
  std::lock_guard lock(mutex_);
  ++refreshes_;
}

void UserInterface::Invalidate(const HX_Rect& rect) {
  std::lock_guard lock(mutex_);
  ++invalidations_;
  last_invalidated_ = rect;
}

}  // namespace calmframe::host
