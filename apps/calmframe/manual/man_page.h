#pragma once

#include <string>

namespace CLI {
class App;
}

namespace calmframe::manual {

// The manual page of the program, section 1, in the roff macros of man(7). `version`: as the
// page's foot shows it.
std::string ManPage(const CLI::App& program, const std::string& version);

}  // namespace calmframe::manual
