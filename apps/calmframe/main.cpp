#include <malloc.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <filesystem>
#include <functional>
#include <iterator>
#include <new>
#include <nlohmann/json.hpp>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include "apps/calmframe/analyze_command.h"
#include "apps/calmframe/batch_command.h"
#include "apps/calmframe/command.h"
#include "apps/calmframe/demo_command.h"
#include "apps/calmframe/exit_codes.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/manual/help_text.h"
#include "apps/calmframe/manual/man_page.h"
#include "apps/calmframe/manual/shell_completion.h"
#include "apps/calmframe/params_command.h"
#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/project_commands.h"
#include "apps/calmframe/report_command.h"
#include "apps/calmframe/shots_command.h"
#include "apps/calmframe/split_commands.h"
#include "apps/calmframe/stabilize_command.h"
#include "apps/calmframe/studio_command.h"
#include "host/base/nearest_match.h"
#include "host/base/shown_text.h"
#include "host/media/clip.h"

namespace calmframe {
namespace {

// A word that is no command, or no flag of the command that it stands behind, in one line; empty
// where all are known.
std::string UnknownWord(const CLI::App& program, int argc, char** argv) {
  if (argc < 2) return "";
  const std::string first = argv[1];
  std::vector<std::string> names = {"--help", "--version"};
  std::vector<std::string> flags = {"--help"};
  const CLI::App* chosen = nullptr;
  for (const CLI::App* command : program.get_subcommands({})) {
    names.push_back(command->get_name());
    if (command->get_name() != first) continue;
    chosen = command;
    for (const CLI::Option* option : command->get_options()) {
      for (const std::string& name : option->get_lnames()) flags.push_back("--" + name);
    }
  }
  if (!chosen) {
    if (first.rfind('-', 0) == 0) return "the command comes first, then its flags";
    std::error_code ignored;
    if (std::filesystem::exists(first, ignored)) {
      return first + " is no command; to steady a clip: calmframe stabilize IN OUT";
    }
    return "unknown command " + first + NearestHint(first, names);
  }
  for (int i = 2; i < argc; ++i) {
    const std::string word = std::string(argv[i]).substr(0, std::string(argv[i]).find('='));
    const bool flag = word.size() > 1 && word[0] == '-' && !std::isdigit(word[1]);
    if (!flag || word == "-h" || std::find(flags.begin(), flags.end(), word) != flags.end()) {
      continue;
    }
    return "unknown flag " + word + NearestHint(word, flags);
  }
  return "";
}

int Fail(ExitCode code, const std::string& line, bool json = false) {
  if (json) {
    const nlohmann::ordered_json object = {{"error", line}, {"exit_code", code}};
    std::fprintf(stderr, "%s\n", JsonLine(object).c_str());
  } else {
    std::fprintf(stderr, "calmframe: %s\n", Shown(line).c_str());
  }
  return code;
}

std::string KeptText(const Command& command) {
  std::string kept;
  for (const std::string& file : command.Kept()) {
    std::error_code ignored;
    if (!file.empty() && std::filesystem::exists(file, ignored)) kept += ", " + file;
  }
  if (kept.empty()) return "no output was left behind";
  return "kept:" + kept.substr(1) + "; no other output was left behind";
}

int FailUsage(const CLI::App& program, const CLI::ParseError& error, int argc, char** argv) {
  std::string line = error.what();
  std::replace(line.begin(), line.end(), '\n', ' ');
  const bool extra = dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr;
  if (argc < 2) {
    line = "no command given, such as calmframe stabilize IN OUT";
  } else if (extra || dynamic_cast<const CLI::RequiredError*>(&error)) {
    // A misspelt flag's value looks like one word too many, and so on.
    const std::string unknown = UnknownWord(program, argc, argv);
    if (!unknown.empty())
      line = unknown;
    else if (extra)
      line = "one word too many" + line.substr(line.find(':'));
  } else if (dynamic_cast<const CLI::ArgumentMismatch*>(&error)) {
    const std::string flag = line.substr(0, line.find(':'));
    const bool none = line.find("missing") != std::string::npos;
    line = flag + (none ? " takes a value" : " is given more than once");
  }
  const auto parsed = program.get_subcommands();
  const std::string command = parsed.empty() ? "" : parsed[0]->get_name() + " ";
  return Fail(kUsage, line + " (calmframe " + command + "--help tells more)");
}

// Added to the parser but to no list: what the packages bring is written by the program itself.
class WriteCommand final : public Command {
 public:
  using Text = std::function<std::string(const CLI::App& program)>;
  WriteCommand(CLI::App& program, const std::string& name, Text text)
      : Command(*program.add_subcommand(name)->group("")),
        program_(program),
        text_(std::move(text)) {}
  void Run() override { std::fputs(text_(program_).c_str(), stdout); }

 private:
  const CLI::App& program_;
  const Text text_;
};

constexpr char kDescription[] =
    "Steadies shaky video\n\n"
    "A clip goes in, a steady clip comes out. To see what it does without a clip of your own, run "
    "calmframe demo.";

constexpr char kFooter[] =
    "Examples:\n"
    "  calmframe stabilize shaky.mp4 steady.mp4\n"
    "  calmframe stabilize --help\n"
    "\n"
    "Exit codes:\n"
    "  0    done\n"
    "  2    usage: an unknown word, or a value out of range\n"
    "  3    input: a clip or project that can't be read\n"
    "  4    output: it exists already, or can't be written\n"
    "  5    the clip could not be analysed or solved\n"
    "  6    some clips of a batch failed, as their lines say\n"
    "  130  interrupted\n"
    "\n"
    "Environment:\n"
    "  CALMFRAME_PLUGIN  the plug-in to load in place of the one that came along\n"
    "  CALMFRAME_NO_SANDBOX  not empty: as --no-sandbox for all that is run";

int Run(int argc, char** argv) {
  CLI::App program(kDescription, "calmframe");
  program.formatter_fn([](const CLI::App* command, const std::string&, CLI::AppFormatMode) {
    return manual::HelpText(*command);
  });
  program.set_version_flag("--version", "calmframe " CALMFRAME_VERSION, "Show the version");
  program.footer(kFooter);
  program.require_subcommand(1);
  StabilizeCommand stabilize(program);
  StudioCommand studio(program);
  BatchCommand batch(program);
  DemoCommand demo(program);
  AnalyzeCommand analyze(program);
  ParamsCommand params(program);
  ShotsCommand shots(program);
  GatherCommand gather(program);
  RenderCommand render(program);
  JoinCommand join(program);
  InfoCommand info(program);
  TracksCommand tracks(program);
  ReportCommand report(program);
  StudioWorkerCommand studio_worker(program);
  StudioSampleCommand studio_sample(program);
  BatchJobCommand batch_job(program);
  BatchGlancesCommand batch_glances(program);
  BatchPicturesCommand batch_pictures(program);
  BatchShotsCommand batch_shots(program);
  WriteCommand man_page(program, "write-man-page", [](const CLI::App& app) {
    return manual::ManPage(app, CALMFRAME_VERSION);
  });
  WriteCommand bash(program, "write-bash-completion", manual::BashCompletion);
  WriteCommand zsh(program, "write-zsh-completion", manual::ZshCompletion);
  WriteCommand fish(program, "write-fish-completion", manual::FishCompletion);
  Command* const commands[] = {&stabilize,   &studio,    &batch,         &demo,
                               &analyze,     &params,    &shots,         &render,
                               &info,        &tracks,    &report,        &gather,
                               &join,        &man_page,  &batch_glances, &batch_pictures,
                               &batch_shots, &batch_job, &studio_worker, &studio_sample,
                               &bash,        &zsh,       &fish};
  char help_flag[] = "--help";
  if (argc > 1 && std::string(argv[1]) == "help") {
    argv[1] = argc > 2 ? argv[2] : help_flag;
    if (argc > 2) {
      argv[2] = help_flag;
      const std::string unknown = UnknownWord(program, argc, argv);
      if (!unknown.empty()) return Fail(kUsage, unknown + " (calmframe --help tells more)");
    }
  }
  try {
    program.parse(argc, argv);
  } catch (const CLI::Success& success) {
    return program.exit(success);
  } catch (const CLI::ParseError& error) {
    return FailUsage(program, error, argc, argv);
  }

  // The parser has seen to it that there is one.
  Command& command = **std::find_if(std::begin(commands), std::end(commands),
                                    [](const Command* one) { return one->parser().parsed(); });
  const bool json = command.json();
  const auto interrupted = [&] {
    return Fail(kInterrupted, "interrupted; " + KeptText(command), json);
  };
  CatchInterrupts();
  std::signal(SIGXFSZ, SIG_IGN);  // a file that may not grow is one that can't be written
  try {
    command.Run();
    return kDone;
  } catch (const UsageFailure& failure) {
    return Fail(kUsage, failure.what(), json);
  } catch (const ClipsFailed& failure) {
    return Fail(kClipsFailed, failure.what(), json);
  } catch (const Interrupted&) {
    return interrupted();
  } catch (const media::Failure& failure) {
    const bool input = failure.side == media::Failure::Side::input;
    if (input && InterruptAsked()) return interrupted();  // while it waited for a pipe
    return Fail(input ? kInput : kOutput, failure.what(), json);
  } catch (const host::ProjectFailure& failure) {
    return Fail(kInput, failure.what(), json);
  } catch (const SolveFailure& failure) {
    return Fail(kSolveFailed, failure.what(), json);
  } catch (const std::bad_alloc&) {
    throw;
  } catch (const std::system_error& error) {
    const bool none = error.code() == std::errc::resource_unavailable_try_again;
    return Fail(kSolveFailed, none ? "no thread can be started: too little memory" : error.what(),
                json);
  } catch (const std::exception& error) {
    return Fail(kSolveFailed, error.what(), json);
  }
}

// Without memory of its own.
int FailForMemory(int argc, char** argv) {
  const bool json =
      std::any_of(argv, argv + argc, [](const char* word) { return !std::strcmp(word, "--json"); });
  std::fputs(
      json ? "{\"error\":\"out of memory\",\"exit_code\":5}\n" : "calmframe: out of memory\n",
      stderr);
  return kSolveFailed;
}

}  // namespace
}  // namespace calmframe

// A frame is freed soon after it is made, and pages that come fresh from the system for the next
// one cost as much as half of its work. So what is freed is kept, for all but frames beyond 4K.
static void KeepFreedMemory() {
#ifdef __GLIBC__
  constexpr int kOwnMapping = 32 << 20;  // bytes; no more is taken
  constexpr int kKept = 1 << 30;
  mallopt(M_MMAP_THRESHOLD, kOwnMapping);
  mallopt(M_TRIM_THRESHOLD, kKept);
#endif
}

int main(int argc, char** argv) {
  KeepFreedMemory();
  // The plug-in has it use the calling thread only, but what it starts as it is loaded takes 128
  // MiB of address space a processor, and goes round for ever where they are not to be had.
  setenv("OPENBLAS_NUM_THREADS", "1", 0);
  try {
    return calmframe::Run(argc, argv);
  } catch (const std::bad_alloc&) {
    return calmframe::FailForMemory(argc, argv);
  }
}
