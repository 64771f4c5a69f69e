#pragma once

#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

// The parser's own header takes longer to read than all else that a command includes.
namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace calmframe {

// A command of the program. The first line of the description is the summary; what follows an empty
// line, and the examples, stand in its help.
CLI::App& AddCommand(CLI::App& program, const std::string& name, const std::string& description,
                     const std::string& examples);

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

// A flag that takes any word; given twice it is an error.
CLI::Option* AddName(CLI::App& command, const std::string& flag, std::string& name,
                     const std::string& description);

// A flag that can be given again and again, each time with a KEY=VALUE; one without the sign is
// refused.
CLI::Option* AddPairs(CLI::App& command, const std::string& flag, std::vector<std::string>& pairs,
                      const std::string& description);

// A flag without a value.
CLI::Option* AddSwitch(CLI::App& command, const std::string& flag, bool& on,
                       const std::string& description);

// A place on the command line, or a flag, that takes a file's name.
enum class Need { optional, required };
CLI::Option* AddFile(CLI::App& command, const std::string& name, std::string& path,
                     const std::string& description, Need need = Need::required);

// A place on the command line that takes one name of a file or more, with all that is left.
CLI::Option* AddFiles(CLI::App& command, const std::string& name, std::vector<std::string>& paths,
                      const std::string& description);

// A place that takes a folder's name; `path` holds the one that is taken without.
CLI::Option* AddFolder(CLI::App& command, const std::string& name, std::string& path,
                       const std::string& description);

// The help shows these flags together, below the title.
void PutInGroup(const std::string& title, std::initializer_list<CLI::Option*> flags);

// The help shows it as what holds without the flag.
void TellDefault(CLI::Option& flag, const std::string& value);

// Not both can be given.
void Exclude(CLI::Option& flag, CLI::Option& other);

}  // namespace calmframe
