#include "apps/calmframe/manual/man_page.h"

#include <algorithm>
#include <cctype>
#include <sstream>
#include <vector>

#include "apps/calmframe/manual/command_outline.h"

namespace calmframe::manual {
namespace {

// Text that roff prints as it stands.
std::string Plain(const std::string& text) {
  std::string plain;
  for (const char c : text) {
    const bool begins_line = plain.empty() || plain.back() == '\n';
    if (begins_line && (c == '.' || c == '\'')) plain += "\\&";
    if (c == '\\')
      plain += "\\e";
    else if (c == '-')
      plain += "\\-";
    else if (c == '\'')
      plain += "\\(aq";
    else if (c == '`')
      plain += "\\(ga";
    else
      plain += c;
  }
  return plain;
}

std::string Upper(std::string text) {
  std::transform(text.begin(), text.end(), text.begin(),
                 [](unsigned char c) { return static_cast<char>(std::toupper(c)); });
  return text;
}

std::string Paragraphs(const std::string& text) {
  std::string page;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    page += line.empty() ? ".PP\n" : Plain(line) + "\n";
  }
  return page;
}

std::string Item(const Argument& argument) {
  const bool place = argument.name[0] != '-';
  std::string page = ".TP\n" + std::string(place ? ".I " : ".B ") + Plain(argument.name);
  if (!place && !argument.value.empty()) {
    page.replace(page.rfind(".B "), 3, ".BI ");
    page += " \" " + Plain(argument.value) + "\"";
  }
  return page + "\n" + Plain(DescriptionOf(argument)) + "\n";
}

// A footer's sections, each under the macro that fits its depth.
std::string Footer(const std::string& footer, const std::string& macro) {
  std::string page;
  bool open = false;
  std::istringstream lines(footer);
  for (std::string line; std::getline(lines, line);) {
    if (line.empty()) continue;
    if (line[0] != ' ') {
      if (open) page += ".fi\n";
      const std::string title = line.substr(0, line.find(':'));
      page += macro + " " + (macro == ".SH" ? Upper(title) : title) + "\n.nf\n";
      open = true;
    } else {
      page += Plain(line.substr(std::min<std::size_t>(2, line.size()))) + "\n";
    }
  }
  return open ? page + ".fi\n" : page;
}

}  // namespace

std::string ManPage(const CLI::App& program, const std::string& version) {
  const Command outline = OutlineOf(program);
  const std::vector<Command> commands = CommandsOf(program);
  std::string page = ".TH " + Upper(outline.name) + " 1 \"\" \"" + outline.name + " " + version +
                     "\" \"User Commands\"\n.SH NAME\n" + outline.name + " \\- " +
                     Plain(outline.summary) + "\n.SH SYNOPSIS\n";
  for (const Command& command : commands) {
    page += (&command == &commands[0] ? "" : ".br\n") + Plain(command.synopsis) + "\n";
  }
  page += ".SH DESCRIPTION\n" + Paragraphs(outline.details) + ".SH COMMANDS\n";
  for (const Command& command : commands) {
    page += ".SS " + Plain(command.synopsis) + "\n" + Plain(command.summary) + ".\n";
    page += Paragraphs(command.details);
    for (const Argument& place : command.places) page += Item(place);
    std::string others;
    for (const Group& group : command.groups) {
      if (group.title == kOwnGroup) {
        for (const Argument& flag : group.flags) page += Item(flag);
      } else {
        others += (others.empty() ? "" : ", ") + group.title;
      }
    }
    if (!others.empty()) page += ".PP\nFurther flags, below: " + Plain(others) + ".\n";
    if (command.footer.rfind("Examples:\n", 0) == 0) {
      page += ".PP\n.nf\n.RS\n" + Plain(command.footer.substr(command.footer.find('\n') + 1)) +
              "\n.RE\n.fi\n";
    }
  }
  page += ".SH FLAGS\n";
  for (const Group& group : SharedGroups(commands)) {
    page += ".SS " + Plain(group.title) + "\n";
    for (const Argument& flag : group.flags) page += Item(flag);
  }
  return page + Footer(outline.footer, ".SH");
}

}  // namespace calmframe::manual
