#include "apps/calmframe/manual/help_text.h"

#include <vector>

#include "apps/calmframe/manual/command_outline.h"

namespace calmframe::manual {
namespace {

// Two columns: a name, or on a line of its own where it is long, and what it means.
std::string Row(const std::string& name, const std::string& meaning, std::size_t column) {
  std::string row = "  " + name;
  if (row.size() + 2 > column)
    row.append(1, '\n').append(column, ' ');
  else
    row.resize(column, ' ');
  return row + Wrapped(meaning, column) + "\n";
}

}  // namespace

std::string HelpText(const CLI::App& command) {
  const Command outline = OutlineOf(command);
  const std::vector<Command> commands = CommandsOf(command);
  constexpr std::size_t kColumn = 26;
  std::string text = outline.summary + "\n\nUsage: " + outline.synopsis +
                     (commands.empty() ? "" : " COMMAND ...") + "\n";
  if (!outline.details.empty()) {
    std::size_t begin = 0;
    while (begin != std::string::npos) {
      const std::size_t end = outline.details.find("\n\n", begin);
      text.append("\n").append(Wrapped(outline.details.substr(begin, end - begin), 0)).append("\n");
      begin = end == std::string::npos ? end : end + 2;
    }
  }
  const auto add = [&](const std::string& title, const std::vector<Argument>& arguments) {
    text += title.empty() ? "\n" : "\n" + title + ":\n";
    for (const Argument& argument : arguments) {
      text += Row(UsageOf(argument), DescriptionOf(argument), kColumn);
    }
  };
  if (!outline.places.empty()) add("", outline.places);
  if (!commands.empty()) {
    text += "\nCommands:\n";
    for (const Command& one : commands) text += Row(one.name, one.summary, 14);
  }
  for (const Group& group : outline.groups) add(group.title, group.flags);
  if (outline.groups.empty()) text += "\n";
  text += Row("-h, --help", commands.empty() ? "Show this" : "Show this, or a command's flags",
              kColumn);
  if (!outline.footer.empty()) text += "\n" + outline.footer + "\n";
  return text;
}

}  // namespace calmframe::manual
