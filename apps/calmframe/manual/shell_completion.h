#pragma once

#include <string>

namespace CLI {
class App;
}

namespace calmframe::manual {

// Scripts that complete commands, flags and the values of flags with choices; where a file is
// wanted, files; where any other value is, nothing.
std::string BashCompletion(const CLI::App& program);
std::string ZshCompletion(const CLI::App& program);
std::string FishCompletion(const CLI::App& program);

}  // namespace calmframe::manual
