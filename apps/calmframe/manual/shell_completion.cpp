#include "apps/calmframe/manual/shell_completion.h"

#include <map>
#include <vector>

#include "apps/calmframe/manual/command_outline.h"

namespace calmframe::manual {
namespace {

std::string Joined(const std::vector<std::string>& words) {
  std::string joined;
  for (const std::string& word : words) {
    if (!joined.empty()) joined += ' ';
    joined += word;
  }
  return joined;
}

std::vector<Argument> FlagsOf(const Command& command) {
  std::vector<Argument> flags;
  for (const Group& group : command.groups) {
    flags.insert(flags.end(), group.flags.begin(), group.flags.end());
  }
  return flags;
}

// `text` with a backslash before each of `special`.
std::string Escaped(const std::string& text, const std::string& special) {
  std::string escaped;
  for (const char c : text) {
    if (special.find(c) != std::string::npos) escaped += '\\';
    escaped += c;
  }
  return escaped;
}

// Text within single quotes of a shell that knows no escapes in them.
std::string Quoted(const std::string& text) {
  std::string quoted = "'";
  for (const char c : text) quoted += c == '\'' ? "'\\''" : std::string(1, c);
  return quoted + "'";
}

}  // namespace

std::string BashCompletion(const CLI::App& program) {
  const std::string& name = OutlineOf(program).name;
  std::vector<std::string> commands;
  std::string cases;
  std::map<std::string, Argument> with_value;  // a flag means the same in all commands
  for (const Command& command : CommandsOf(program)) {
    commands.push_back(command.name);
    std::vector<std::string> flags = {"--help"};
    for (const Argument& flag : FlagsOf(command)) {
      flags.push_back(flag.name);
      if (!flag.value.empty()) with_value[flag.name] = flag;
    }
    cases += "    " + command.name + ") flags='" + Joined(flags) + "' ;;\n";
  }
  std::string files, others, values;
  for (const auto& [flag, argument] : with_value) {
    if (!argument.choices.empty()) {
      values += "    " + flag + ") COMPREPLY=($(compgen -W '" + Joined(argument.choices) +
                "' -- \"$word\")); return ;;\n";
    } else {
      std::string& list = argument.takes_file ? files : others;
      list += (list.empty() ? "" : "|") + flag;
    }
  }
  return "# bash completion of " + name + "\n_" + name + R"(() {
  local word=${COMP_WORDS[COMP_CWORD]} before=${COMP_WORDS[COMP_CWORD-1]} flags command
  # The shell makes words of their own of the signs in --flag=value.
  [ "$word" = = ] && word=
  [ "$before" = = ] && before=${COMP_WORDS[COMP_CWORD-2]}
  command=${COMP_WORDS[1]}
  COMPREPLY=()
  if [ "$COMP_CWORD" -eq 1 ]; then
    COMPREPLY=($(compgen -W ')" +
         Joined(commands) + R"( --help --version' -- "$word"))
    return
  fi
  case $before in
)" + values +
         "    " + others + R"() return ;;
    )" + files +
         R"() ;;
    *)
      if [[ $word == -* ]]; then
        case $command in
)" + cases +
         R"(        esac
        COMPREPLY=($(compgen -W "$flags" -- "$word"))
        return
      fi ;;
  esac
  compopt -o filenames 2>/dev/null
  local IFS=$'\n'
  COMPREPLY=($(compgen -f -- "$word"))
}
complete -F _)" +
         name + " " + name + "\n";
}

std::string ZshCompletion(const CLI::App& program) {
  const std::string& name = OutlineOf(program).name;
  std::string commands, cases;
  for (const Command& command : CommandsOf(program)) {
    commands += "    " + Quoted(command.name + ":" + command.summary) + "\n";
    cases += "    " + command.name + ")\n      _arguments";
    for (const Argument& flag : FlagsOf(command)) {
      std::string spec = flag.name + "[" + Escaped(BriefOf(flag), "[]:\\") + "]";
      if (!flag.value.empty()) {
        spec += ":" + flag.value + ":";
        if (flag.takes_file) spec += "_files";
        if (!flag.choices.empty()) spec.append("(").append(Joined(flag.choices)).append(")");
      }
      cases += " \\\n        " + Quoted(spec);
    }
    cases += " \\\n        '--help[Show the flags]' \\\n        '*:file:_files' ;;\n";
  }
  return "#compdef " + name + "\nlocal -a commands\ncommands=(\n" + commands +
         ")\nif (( CURRENT == 2 )); then\n  _describe command commands\nelse\n"
         "  local command=$words[2]\n  shift words\n  (( CURRENT-- ))\n  case $command in\n" +
         cases + "  esac\nfi\n";
}

std::string FishCompletion(const CLI::App& program) {
  const std::string& name = OutlineOf(program).name;
  const auto quoted = [](const std::string& text) {
    return std::string("'").append(Escaped(text, "'\\")).append("'");
  };
  std::string script = "complete -c " + name + " -n __fish_use_subcommand -f\n";
  for (const Command& command : CommandsOf(program)) {
    script += "complete -c " + name + " -n __fish_use_subcommand -a " + command.name + " -d " +
              quoted(command.summary) + "\n";
    for (const Argument& flag : FlagsOf(command)) {
      script += "complete -c " + name + " -n '__fish_seen_subcommand_from " + command.name +
                "' -l " + flag.name.substr(2);
      if (!flag.value.empty()) script += flag.takes_file ? " -rF" : " -x";
      if (!flag.choices.empty()) script += " -a " + quoted(Joined(flag.choices));
      script += " -d " + quoted(BriefOf(flag)) + "\n";
    }
  }
  return script;
}

}  // namespace calmframe::manual
