#pragma once

#include <string>

namespace CLI {
class App;
}

namespace calmframe::manual {

// What --help prints, in lines of at most 80 characters: of the program its commands, of a command
// its flags.
std::string HelpText(const CLI::App& command);

}  // namespace calmframe::manual
