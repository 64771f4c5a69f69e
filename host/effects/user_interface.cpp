#include "host/effects/user_interface.h"

namespace calmframe::host {

std::pair<std::string, std::string> UserInterface::info() const {
  std::lock_guard lock(mutex_);
  return info_;
}

void UserInterface::SetInfo(const std::string& line1, const std::string& line2) {
  std::lock_guard lock(mutex_);
  info_ = {line1, line2};
}

}  // namespace calmframe::host
