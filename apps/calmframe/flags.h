#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <string>
#include <vector>

namespace calmframe {

// A flag that takes a number, of type double or int, in [least, most]; nan is none. The range is
// told to whoever gives another and in the help. `unit` stands for the number in the help. Of a
// flag given twice the last one counts, as of the one with choices.
template <class Number>
CLI::Option* AddNumber(CLI::App& command, const std::string& flag,
                       const std::function<void(Number)>& take, const std::string& unit,
                       Number least, Number most, const std::string& description);

// A flag that takes one of a few words; another one is answered with the nearest.
CLI::Option* AddChoice(CLI::App& command, const std::string& flag,
                       const std::function<void(const std::string&)>& take,
                       const std::vector<std::string>& choices, const std::string& description);

// A place on the command line that takes a file's name.
CLI::Option* AddFile(CLI::App& command, const std::string& name, std::string& path,
                     const std::string& description);

// "'perspectiv' is none of position, perspective; did you mean perspective?"
std::string NoneOf(const std::string& text, const std::vector<std::string>& names);

}  // namespace calmframe
