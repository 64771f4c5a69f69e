#include "apps/calmframe/manual/command_outline.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <sstream>

namespace calmframe::manual {
namespace {

Argument ArgumentOf(const CLI::Option& option) {
  Argument argument;
  argument.name = option.get_positional() ? option.get_name(true) : "--" + option.get_lnames()[0];
  if (option.get_items_expected_max() > 0) argument.value = option.get_type_name();
  if (argument.value.find('|') != std::string::npos) {
    argument.choices = CLI::detail::split(argument.value, '|');
    if (argument.value.size() > 10) argument.value = "NAME";
  }
  argument.default_value = option.get_default_str();
  argument.description = option.get_description();
  argument.required = option.get_required();
  argument.takes_file = argument.value == "FILE" || argument.value == "DIR";
  return argument;
}

std::vector<Argument>& FlagsOf(std::vector<Group>& groups, const std::string& title) {
  const auto found = std::find_if(groups.begin(), groups.end(),
                                  [&](const Group& group) { return group.title == title; });
  if (found != groups.end()) return found->flags;
  return groups.emplace_back(Group{title, {}}).flags;
}

}  // namespace

Command OutlineOf(const CLI::App& command) {
  Command outline;
  outline.name = command.get_name();
  const std::string description = command.get_description();
  const std::size_t end = description.find("\n\n");
  outline.summary = description.substr(0, end);
  if (end != std::string::npos) outline.details = description.substr(end + 2);
  outline.footer = command.get_footer();
  const CLI::App* const parent = command.get_parent();
  outline.synopsis = (parent ? parent->get_name() + " " : "") + outline.name;
  FlagsOf(outline.groups, kOwnGroup);
  for (const CLI::Option* option : command.get_options()) {
    if (option == command.get_help_ptr() || option->get_group().empty()) continue;
    const Argument argument = ArgumentOf(*option);
    if (option->get_positional()) {
      outline.places.push_back(argument);
      continue;
    }
    const bool own = option->get_group() == "Options";
    FlagsOf(outline.groups, own ? kOwnGroup : option->get_group()).push_back(argument);
    if (argument.required) outline.synopsis += " " + UsageOf(argument);
  }
  outline.groups.erase(std::remove_if(outline.groups.begin(), outline.groups.end(),
                                      [](const Group& group) { return group.flags.empty(); }),
                       outline.groups.end());
  for (const Argument& place : outline.places) {
    outline.synopsis += place.required ? " " + place.name : " [" + place.name + "]";
  }
  if (parent && !outline.groups.empty()) outline.synopsis += " [FLAGS]";
  return outline;
}

std::vector<Command> CommandsOf(const CLI::App& program) {
  std::vector<Command> commands;
  for (const CLI::App* command : program.get_subcommands({})) {
    if (!command->get_group().empty()) commands.push_back(OutlineOf(*command));
  }
  return commands;
}

std::vector<Group> SharedGroups(const std::vector<Command>& commands) {
  std::vector<Group> shared;
  for (const Command& command : commands) {
    for (const Group& group : command.groups) {
      if (group.title == kOwnGroup) continue;
      std::vector<Argument>& flags = FlagsOf(shared, group.title);
      for (const Argument& flag : group.flags) {
        if (std::none_of(flags.begin(), flags.end(),
                         [&](const Argument& known) { return known.name == flag.name; })) {
          flags.push_back(flag);
        }
      }
    }
  }
  return shared;
}

std::string Wrapped(const std::string& paragraph, std::size_t indent, std::size_t width) {
  std::istringstream words(paragraph);
  std::string text;
  std::size_t column = indent;
  for (std::string word; words >> word;) {
    if (column > indent && column + 1 + word.size() > width) {
      text += "\n" + std::string(indent, ' ');
      column = indent;
    } else if (column > indent) {
      text += " ";
      ++column;
    }
    text += word;
    column += word.size();
  }
  return text;
}

std::string DescriptionOf(const Argument& argument) {
  const std::string& given = argument.default_value;
  return argument.description + (given.empty() ? "" : " (default " + given + ")");
}

std::string BriefOf(const Argument& argument) {
  return argument.description.substr(0, argument.description.find_first_of(":;"));
}

std::string UsageOf(const Argument& argument) {
  const bool place = argument.name[0] != '-';
  return place || argument.value.empty() ? argument.name : argument.name + " " + argument.value;
}

}  // namespace calmframe::manual
