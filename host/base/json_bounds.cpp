#include "host/base/json_bounds.h"

#include <array>
#include <cstddef>

namespace calmframe {

bool ExceedsBounds(std::string_view json) {
  constexpr std::size_t kDeepest = 100;
  constexpr int kMostMembers = 1000;
  std::array<int, kDeepest + 1> members{};  // by depth, of the object that is open there
  std::size_t depth = 0;
  bool is_text = false;
  for (std::size_t at = 0; at < json.size(); ++at) {
    const char c = json[at];
    if (c == '"') is_text = !is_text;
    if (is_text) {
      if (c == '\\') ++at;
    } else if (c == '[' || c == '{') {
      if (++depth > kDeepest) return true;
      members[depth] = 0;
    } else if (c == ']' || c == '}') {
      if (depth > 0) --depth;
    } else if (c == ':' && ++members[depth] > kMostMembers) {
      return true;
    }
  }
  return false;
}

}  // namespace calmframe
