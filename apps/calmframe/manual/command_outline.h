#pragma once

#include <string>
#include <vector>

namespace CLI {
class App;
}

// What can be typed, read off the parser, which is the one place where it is said. The help, the
// manual page and the shells' completions are written from this.
namespace calmframe::manual {

struct Argument {
  std::string name;                  // "--smoothness"; of a place on the line its name, "IN"
  std::string value;                 // what a flag takes, "PERCENT"; empty for a switch
  std::vector<std::string> choices;  // all that it takes; empty where that is no list
  std::string default_value;         // empty: none to tell
  std::string description;
  bool required = false;
  bool takes_file = false;
};

struct Group {
  std::string title;
  std::vector<Argument> flags;
};

struct Command {
  std::string name;
  std::string summary;  // one line
  std::string details;  // paragraphs with an empty line between them; may be empty
  std::string footer;   // sections as they stand, each a title with a colon and indented lines
  std::vector<Argument> places;
  std::vector<Group> groups;  // the command's own first, then those that it shares with others

  // "calmframe stabilize IN OUT [FLAGS]"
  std::string synopsis;
};

// A command's summary is the first line of its description, what follows after an empty line its
// details. A value's name with bars lists its choices; FILE and DIR stand for files.
Command OutlineOf(const CLI::App& command);

// The commands of a program that its help lists, in that order.
std::vector<Command> CommandsOf(const CLI::App& program);

// A group that several commands share, with what any of them has in it.
std::vector<Group> SharedGroups(const std::vector<Command>& commands);

// Title of the group that is a command's own.
inline constexpr char kOwnGroup[] = "Flags";

// A paragraph broken into lines of at most `width`, each behind `indent` spaces but the first.
std::string Wrapped(const std::string& paragraph, std::size_t indent, std::size_t width = 80);

// "How ... crops more; 0 to 1000 (default 50)"
std::string DescriptionOf(const Argument& argument);

// The description's first clause.
std::string BriefOf(const Argument& argument);

// "--smoothness PERCENT"
std::string UsageOf(const Argument& argument);

}  // namespace calmframe::manual
