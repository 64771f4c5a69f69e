#include "apps/calmframe/flags.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <limits>

#include "host/base/nearest_match.h"
#include "host/base/param_text.h"

namespace calmframe {

CLI::App& AddCommand(CLI::App& program, const std::string& name, const std::string& description,
                     const std::string& examples) {
  CLI::App& command = *program.add_subcommand(name, description);
  command.footer(examples);
  return command;
}

template <class Number>
CLI::Option* AddNumber(CLI::App& command, const std::string& flag,
                       const std::function<void(Number)>& take, const std::string& unit,
                       Number least, Number most, const std::string& description) {
  const std::string range =
      NumberText(least) +
      (most == std::numeric_limits<Number>::max() ? " or more" : " to " + NumberText(most));
  // CLI::Range lets "nan" through.
  const auto check = [least, most, range](const std::string& text) {
    Number number{};
    if (!CLI::detail::lexical_cast(text, number)) return "'" + text + "' is no number";
    return number >= least && number <= most ? "" : text + " is out of range: " + range;
  };
  return command.add_option_function<Number>(flag, take, description + "; " + range)
      ->check(check)
      ->take_last()
      ->type_name(unit);
}
template CLI::Option* AddNumber(CLI::App&, const std::string&, const std::function<void(int)>&,
                                const std::string&, int, int, const std::string&);
template CLI::Option* AddNumber(CLI::App&, const std::string&, const std::function<void(double)>&,
                                const std::string&, double, double, const std::string&);

CLI::Option* AddChoice(CLI::App& command, const std::string& flag,
                       const std::function<void(const std::string&)>& take,
                       const std::vector<std::string>& choices, const std::string& description) {
  const auto check = [choices](const std::string& text) {
    const bool known = std::find(choices.begin(), choices.end(), text) != choices.end();
    return known ? "" : NoneOf(text, choices);
  };
  return command.add_option_function<std::string>(flag, take, description)
      ->check(check)
      ->take_last()
      ->type_name(CLI::detail::join(choices, "|"));
}

CLI::Option* AddName(CLI::App& command, const std::string& flag, std::string& name,
                     const std::string& description) {
  return command.add_option(flag, name, description)->type_name("NAME");
}

CLI::Option* AddPairs(CLI::App& command, const std::string& flag, std::vector<std::string>& pairs,
                      const std::string& description) {
  const auto check = [](const std::string& text) {
    const std::size_t sign = text.find('=');
    return sign != 0 && sign != std::string::npos ? "" : "'" + text + "' is no KEY=VALUE";
  };
  return command.add_option(flag, pairs, description)
      ->check(check)
      ->type_name("KEY=VALUE")
      ->allow_extra_args(false);
}

CLI::Option* AddSwitch(CLI::App& command, const std::string& flag, bool& on,
                       const std::string& description) {
  return command.add_flag(flag, on, description);
}

CLI::Option* AddFile(CLI::App& command, const std::string& name, std::string& path,
                     const std::string& description, Need need) {
  return command.add_option(name, path, description)
      ->type_name("FILE")
      ->required(need == Need::required);
}

CLI::Option* AddFiles(CLI::App& command, const std::string& name, std::vector<std::string>& paths,
                      const std::string& description) {
  return command.add_option(name, paths, description)
      ->type_name("FILE")
      ->required()
      ->expected(1, -1);
}

CLI::Option* AddFolder(CLI::App& command, const std::string& name, std::string& path,
                       const std::string& description) {
  return command.add_option(name, path, description)->type_name("DIR")->capture_default_str();
}

void PutInGroup(const std::string& title, std::initializer_list<CLI::Option*> flags) {
  for (CLI::Option* flag : flags) flag->group(title);
}

void TellDefault(CLI::Option& flag, const std::string& value) {
  flag.default_str(value);
}

void Exclude(CLI::Option& flag, CLI::Option& other) {
  flag.excludes(&other);
}

}  // namespace calmframe
