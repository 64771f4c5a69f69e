#include "host/base/shown_text.h"

#include <cstdio>

namespace calmframe {

std::string Shown(const std::string& text) {
  std::string shown;
  for (std::size_t at = 0; at < text.size(); ++at) {
    const char c = text[at];
    const auto byte = static_cast<unsigned char>(c);
    const auto next = static_cast<unsigned char>(at + 1 < text.size() ? text[at + 1] : 0);
    char code[8] = "";
    if (c == '\n') {
      shown += "\\n";
    } else if (c == '\t') {
      shown += "\\t";
    } else if (byte < 32 || byte == 127) {
      std::snprintf(code, sizeof code, "\\x%02x", byte);
      shown += code;
    } else if (byte == 0xc2 && next >= 0x80 && next < 0xa0) {  // terminals obey these, too
      std::snprintf(code, sizeof code, "\\u%04x", next);
      shown += code;
      ++at;
    } else {
      shown += c;
    }
  }
  return shown;
}

}  // namespace calmframe
