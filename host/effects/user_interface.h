#pragma once

#include <mutex>
#include <string>
#include <utility>

namespace calmframe::host {

// What plug-ins did to the host's windows. Any thread.
class UserInterface {
 public:
  // The information panel: two lines, both empty when it is clear.
  std::pair<std::string, std::string> info() const;
  void SetInfo(const std::string& line1, const std::string& line2);

 private:
  mutable std::mutex mutex_;
  std::pair<std::string, std::string> info_;  // guarded by mutex_
};

}  // namespace calmframe::host
