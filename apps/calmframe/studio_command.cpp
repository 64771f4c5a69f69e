#include "apps/calmframe/studio_command.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "apps/calmframe/confinement.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/plugin_path.h"
#include "apps/calmframe/sample_clip.h"
#include "host/media/clip.h"
#include "studio/server/server.h"
#include "studio/worker/worker.h"

extern char** environ;

namespace calmframe {
namespace {

namespace fs = std::filesystem;

constexpr char kWorker[] = "studio-worker", kWorkerFolder[] = "--in", kSample[] = "studio-sample";

std::string Environment(const char* name) {
  const char* const value = std::getenv(name);
  return value ? value : "";
}

// Where the base directory specification of freedesktop.org puts what a program keeps for itself.
std::string SessionFolder() {
  std::string base = Environment("XDG_STATE_HOME");
  if (base.empty()) base = Environment("HOME") + "/.local/state";
  return base + "/calmframe/studio";
}

// Its own line alone, so that a file's last newline is none of it.
std::string PasswordIn(const std::string& path) {
  std::string password;
  std::ifstream file(path);
  if (!std::getline(file, password) || password.size() < 8) {
    throw UsageFailure(path + ": has no password of 8 letters or more in its first line");
  }
  return password;
}

void OpenBrowser(const std::string& address) {
  if (Environment("DISPLAY").empty() && Environment("WAYLAND_DISPLAY").empty()) return;
  std::string opener = "xdg-open", place = address;
  char* const words[] = {opener.data(), place.data(), nullptr};
  posix_spawn_file_actions_t quiet;
  posix_spawn_file_actions_init(&quiet);
  posix_spawn_file_actions_addopen(&quiet, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&quiet, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  pid_t process = 0;
  posix_spawnp(&process, words[0], &quiet, nullptr, words, environ);
  posix_spawn_file_actions_destroy(&quiet);
}

bool IsLoopback(const std::string& address) {
  return address == "::1" || address.rfind("127.", 0) == 0;
}

}  // namespace

StudioCommand::StudioCommand(CLI::App& program)
    : Command(AddCommand(
          program, "studio",
          "Steady clips in a browser\n\n"
          "Prints the address of a page, and opens it where there is a screen: the picture before "
          "and after, the controls, the camera's path, renders. All of it stays on this machine; "
          "the address has a secret, and lets in whoever has it. From another machine: ssh -L "
          "8080:127.0.0.1:8080, with --port 8080. Clips and what was set are kept, also where the "
          "program is killed.\n\n"
          "The page sees the folders of --root and nothing else: at first those of the clips, or "
          "the present one.",
          "Examples:\n"
          "  calmframe studio walk.mp4\n"
          "  calmframe studio --root clips --port 8080 --no-browser")) {
  AddFiles(parser_, "CLIP", clips_, "Clips to open, and saved work")->required(false);
  PutInGroup("Page", {AddNumber<int>(
                          parser_, "--port", [this](int port) { port_ = port; }, "N", 0, 65535,
                          "Port to listen at; at first any that is free"),
                      AddSwitch(parser_, "--no-browser", no_browser_, "Print the address alone")});
  PutInGroup(
      "Files",
      {parser_.add_option("--root", roots_, "A folder that the page may open; repeatable")
           ->type_name("DIR")
           ->allow_extra_args(false),
       AddFile(parser_, "--session", session_,
               "Where clips and what was set are kept; at first ~/.local/state/calmframe/studio",
               Need::optional)});
  PutInGroup(
      "Network",
      {AddName(parser_, "--listen", listen_,
               "Address in numbers to listen at, for other machines; takes "
               "--password-file. What goes there is not encrypted; a tunnel by ssh is"),
       AddFile(parser_, "--password-file", password_file_,
               "A file whose first line is the password", Need::optional),
       AddName(parser_, "--name", name_, "Name of this machine by which others call the page")});
  AddSandboxFlag(parser_);
}

void StudioCommand::Run() {
  studio::ServerSettings settings;
  if (!listen_.empty()) settings.address = listen_;
  if (!password_file_.empty()) settings.studio.password = PasswordIn(password_file_);
  if (!IsLoopback(settings.address) && settings.studio.password.empty()) {
    throw UsageFailure("--listen " + listen_ + " lets other machines in: it takes --password-file");
  }
  settings.port = port_;
  settings.name = name_;
  std::error_code error;
  settings.studio.program = fs::read_symlink("/proc/self/exe", error);
  settings.studio.worker = {kWorker};
  settings.studio.sample = {kSample};
  settings.studio.folder = session_.empty() ? SessionFolder() : fs::absolute(session_).string();
  settings.studio.roots = roots_;
  for (const std::string& clip : clips_) {
    const fs::path place = fs::canonical(clip, error);
    if (error) throw media::Failure(media::Failure::Side::input, clip + ": isn't there");
    settings.clips.push_back(place);
    if (roots_.empty()) settings.studio.roots.push_back(place.parent_path());
  }
  std::vector<std::string>& roots = settings.studio.roots;
  if (roots.empty()) roots.push_back(fs::current_path());
  std::sort(roots.begin(), roots.end());
  roots.erase(std::unique(roots.begin(), roots.end()), roots.end());
  for (const std::string& folder : roots) {
    settings.studio.worker.insert(settings.studio.worker.end(), {kWorkerFolder, folder});
  }
  settings.studio.worker.insert(settings.studio.worker.end(),
                                {kWorkerFolder, settings.studio.WorkFolder()});
  settings.listens = [this](const std::string& address) {
    std::printf("%s\n", address.c_str());
    std::fflush(stdout);
    if (!no_browser_) OpenBrowser(address);
  };
  try {
    studio::Serve(settings);
  } catch (const studio::CannotListen& failure) {
    throw UsageFailure(failure.what());
  } catch (const studio::PathRefused& refused) {
    throw UsageFailure(refused.what());
  }
}

StudioWorkerCommand::StudioWorkerCommand(CLI::App& program)
    : Command(*program.add_subcommand(kWorker)->group("")) {
  parser_.add_option("SOCKET", socket_)->required();
  parser_.add_option(kWorkerFolder, folders_)->allow_extra_args(false);
}

void StudioWorkerCommand::Run() {
  // The studio ends it, and a work that doesn't look up any more is not waited for.
  std::signal(SIGTERM, SIG_DFL);
  std::signal(SIGINT, SIG_IGN);
  fcntl(socket_, F_SETFD, FD_CLOEXEC);
  Confinement{.folders = folders_}.Begin();
  studio::RunWorker(socket_, PluginPath());
}

StudioSampleCommand::StudioSampleCommand(CLI::App& program)
    : Command(*program.add_subcommand(kSample)->group("")) {
  parser_.add_option("OUT", output_)->required();
}

void StudioSampleCommand::Run() {
  ProgressLine progress(ProgressLine::Form::json);
  constexpr int kFrames = 120;  // a person waits for them
  DrawSample(output_, kFrames, {}, 0, progress);
}

}  // namespace calmframe
