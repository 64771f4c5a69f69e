#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <new>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "apps/calmframe/analyze_command.h"
#include "apps/calmframe/demo_command.h"
#include "apps/calmframe/exit_codes.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/nearest_match.h"
#include "apps/calmframe/params_command.h"
#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/project_commands.h"
#include "apps/calmframe/report_command.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/media/clip.h"

namespace calmframe {
namespace {

// The chosen command's flags and the commands' names, for a hint at a misspelt one.
std::vector<std::string> KnownNames(const CLI::App& program) {
  std::vector<std::string> names;
  for (const CLI::App* command : program.get_subcommands({})) {
    names.push_back(command->get_name());
    for (const CLI::Option* option : command->get_options()) {
      if (!option->get_lnames().empty()) names.push_back("--" + option->get_lnames()[0]);
    }
  }
  return names;
}

int Fail(ExitCode code, const std::string& line, bool json = false) {
  if (json) {
    const nlohmann::ordered_json object = {{"error", line}, {"exit_code", code}};
    std::fprintf(stderr, "%s\n",
                 object.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace).c_str());
  } else {
    std::fprintf(stderr, "calmframe: %s\n", line.c_str());
  }
  return code;
}

int FailUsage(const CLI::App& program, const CLI::ParseError& error, int argc, char** argv) {
  std::string line = error.what();
  for (char& c : line) {
    if (c == '\n') c = ' ';
  }
  if (dynamic_cast<const CLI::ExtrasError*>(&error) ||
      dynamic_cast<const CLI::RequiredError*>(&error)) {
    const std::vector<std::string> names = KnownNames(program);
    for (int i = 1; i < argc; ++i) {
      const std::string word = std::string(argv[i]).substr(0, std::string(argv[i]).find('='));
      const bool may_be_name = i == 1 || word.rfind("--", 0) == 0;
      if (!may_be_name || std::find(names.begin(), names.end(), word) != names.end()) continue;
      const std::string nearest = NearestMatch(word, names);
      line = "unknown " + word + (nearest.empty() ? "" : "; did you mean " + nearest + "?");
      break;
    }
  }
  return Fail(kUsage, line + " (calmframe --help tells more)");
}

int Run(int argc, char** argv) {
  CLI::App program("Steadies shaky video.", "calmframe");
  program.require_subcommand(1);
  StabilizeCommand stabilize(program);
  DemoCommand demo(program);
  AnalyzeCommand analyze(program);
  ParamsCommand params(program);
  RenderCommand render(program);
  InfoCommand info(program);
  TracksCommand tracks(program);
  ReportCommand report(program);
  try {
    program.parse(argc, argv);
  } catch (const CLI::Success& success) {
    return program.exit(success);
  } catch (const CLI::ParseError& error) {
    return FailUsage(program, error, argc, argv);
  }

  const bool json =
      stabilize.json() || demo.json() || analyze.json() || render.json() || report.json();
  CatchInterrupts();
  try {
    if (stabilize.chosen()) stabilize.Run();
    if (demo.chosen()) demo.Run();
    if (analyze.chosen()) analyze.Run();
    if (params.chosen()) params.Run();
    if (render.chosen()) render.Run();
    if (info.chosen()) info.Run();
    if (tracks.chosen()) tracks.Run();
    if (report.chosen()) report.Run();
    return kDone;
  } catch (const UsageFailure& failure) {
    return Fail(kUsage, failure.what(), json);
  } catch (const Interrupted&) {
    return Fail(kInterrupted, "interrupted; nothing was written", json);
  } catch (const media::Failure& failure) {
    return Fail(failure.side == media::Failure::Side::input ? kInput : kOutput, failure.what(),
                json);
  } catch (const host::ProjectFailure& failure) {
    return Fail(kInput, failure.what(), json);
  } catch (const SolveFailure& failure) {
    return Fail(kSolveFailed, failure.what(), json);
  } catch (const std::bad_alloc&) {
    return Fail(kSolveFailed, "out of memory", json);
  } catch (const std::exception& error) {
    return Fail(kSolveFailed, error.what(), json);
  }
}

}  // namespace
}  // namespace calmframe

int main(int argc, char** argv) {
  return calmframe::Run(argc, argv);
}
