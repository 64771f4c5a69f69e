#include "host/base/json_depth.h"

#include <cstddef>

namespace calmframe {

bool NestsTooDeep(std::string_view json) {
  constexpr int kDeepest = 100;
  int depth = 0;
  bool is_text = false;
  for (std::size_t at = 0; at < json.size(); ++at) {
    const char c = json[at];
    if (c == '"') is_text = !is_text;
    if (is_text) {
      if (c == '\\') ++at;
    } else if ((c == '[' || c == '{') && ++depth > kDeepest) {
      return true;
    } else if (c == ']' || c == '}') {
      --depth;
    }
  }
  return false;
}

}  // namespace calmframe
