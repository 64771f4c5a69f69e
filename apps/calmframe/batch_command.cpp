#include "apps/calmframe/batch_command.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <system_error>
#include <utility>

#include "apps/calmframe/batch_results.h"
#include "apps/calmframe/confinement.h"
#include "apps/calmframe/exit_codes.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/film_work.h"
#include "apps/calmframe/plugin_path.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/thumbnails.h"
#include "host/base/shown_text.h"
#include "host/batch/clip_names.h"
#include "host/batch/clip_search.h"
#include "host/batch/local_batch.h"
#include "host/batch/machine.h"
#include "host/batch/plan.h"
#include "host/batch/slurm_batch.h"
#include "host/batch/split_film.h"
#include "host/effects/host.h"
#include "host/media/output_file.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

namespace fs = std::filesystem;

static_assert(batch::kUsageCode == kUsage && batch::kInputCode == kInput &&
              batch::kOutputCode == kOutput && batch::kWorkCode == kSolveFailed);

// The folder, which is made.
std::string MadeFolder(const std::string& path) {
  std::string cause = "is not a folder";
  try {
    media::MakeFolders(path);
    const fs::path place = fs::canonical(path);
    if (fs::is_directory(place)) return place.string();
  } catch (const std::system_error& error) {
    cause = error.code().message();
  }
  throw media::Failure(media::Failure::Side::output, Shown(path) + ": " + cause);
}

// What is wrong with them would be wrong for each clip.
void CheckParams(const ControlFlags& controls) {
  if (controls.params.empty()) return;
  try {
    const host::Host host(PluginPath());
    ResolveControls(controls, host.declarations());
  } catch (const host::PluginError& error) {
    throw SolveFailure(error.what());
  }
}

// The frame that stands for a clip, 8 bits deep.
class ThumbnailSource {
 public:
  explicit ThumbnailSource(const std::string& path) {
    std::size_t shown = 0;
    const auto reader = media::ClipReader::OpenPromised(path, [&](const media::ClipInfo& clip) {
      shown = ThumbnailFrame(clip.frame_count);
      return media::FrameRange{shown, shown + 1};
    });
    info_ = reader->info();
    pixels_.resize(static_cast<std::size_t>(info_.width) * static_cast<std::size_t>(info_.height));
    reader->Read(std::min(shown, info_.frame_count - 1), pixels_.data(), row_bytes());
  }
  media::PictureView view() const {
    return {pixels_.data(), row_bytes(), info_.width, info_.height};
  }
  const media::Ratio& pixel_aspect() const { return info_.pixel_aspect; }

 private:
  std::ptrdiff_t row_bytes() const {
    return info_.width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8));
  }
  media::ClipInfo info_;
  std::vector<HX_Pixel8> pixels_;
};

}  // namespace

BatchCommand::BatchCommand(CLI::App& program)
    : Command(AddCommand(
          program, "batch",
          "Steady many clips\n\n"
          "Each clip IN is steadied as stabilize would with the same flags, several at a time, "
          "into the folder that --to names, with its project beside it. IN is a file, a folder "
          "for the clips in it, a quoted pattern, or @LIST for the names in a file, one a line. "
          "A clip that fails doesn't stop the others.\n\n"
          "A second run goes on where the first one ended: what is done, of clips and with flags "
          "that haven't changed, is left as it is. Several runs may work on one folder; none does "
          "a clip that another one does. batch.html in the folder shows what became of all.",
          "Examples:\n"
          "  calmframe batch shaky.mp4 walk.mp4 --to steady\n"
          "  calmframe batch clips --recursive --to calmer --smoothness 80\n"
          "  calmframe batch 'v*.mp4' --to small --name \"{stem}-small.mp4\" --crf 28\n"
          "  calmframe batch film.mp4 --to steady --split")),
      program_(program) {
  parser_.add_option("IN", inputs_, "Clips: files, folders, quoted patterns, @LIST")
      ->type_name("FILE")
      ->required();
  AddFolder(parser_, "--to", folder_, "Where the steady clips go; made where it isn't there")
      ->required()
      ->default_str("");
  AddSwitch(parser_, "--recursive", recursive_,
            "Take the clips of folders within folders too; outputs keep these folders' names");
  TellDefault(*AddName(parser_, "--name", name_,
                       "What outputs are called: {stem} stands for the clip's name without its "
                       "extension, {ext} for that with its dot"),
              name_);
  AddNumber<int>(
      parser_, "--jobs", [this](int jobs) { jobs_ = jobs; }, "N", 1, 1024,
      "Clips at a time; at first as many as processors and memory allow");
  AddSwitch(parser_, "--reports", reports_,
            "Make a page of each clip too, as report does, which takes about a fifth longer");
  CLI::Option* const on = AddChoice(
      parser_, "--on", [this](const std::string& name) { on_ = name; }, {"here", "slurm"},
      "Where clips are worked: on this machine, or as jobs of Slurm on machines that see the "
      "clips, DIR and this program under the same names");
  TellDefault(*on, on_);
  CLI::Option* const flags = AddName(parser_, "--sbatch-args", sbatch_args_,
                                     "Further flags for sbatch, such as \"--partition=long "
                                     "--cpus-per-task=4 --mem=2G\"");
  CLI::Option* const clips = AddNumber<int>(
      parser_, "--clips-a-job", [this](int count) { clips_a_job_ = count; }, "N", 1, 1000,
      "Clips that a job does; at first as many as make some minute's work");
  CLI::Option* const detach =
      AddSwitch(parser_, "--detach", detaches_,
                "Don't wait for the jobs; the same command tells later what became of them");
  CLI::Option* const split = AddSwitch(
      parser_, "--split", splits_,
      "Work each clip in pieces that machines or processors share, for films of hours: its shots "
      "are analysed apart, its frames drawn in stretches and joined without being encoded again");
  CLI::Option* const piece = AddNumber<int>(
      parser_, "--frames-a-piece",
      [this](int frames) { frames_a_piece_ = static_cast<std::size_t>(frames); }, "N", 1, 1000000,
      "Frames of such a stretch; at first 250, or more of a long film");
  Exclude(*split, *detach);
  PutInGroup("Machines", {on, flags, clips, detach, split, piece});
  const std::size_t own = parser_.get_options().size();
  AddControlFlags(parser_, controls_);
  AddShotsFlag(parser_, shots_);
  AddOutputFlags(parser_, flags_);
  for (std::size_t o = own; o < parser_.get_options().size(); ++o) {
    const CLI::Option* const option = parser_.get_options()[o];
    if (!option->check_lname("overwrite")) given_on_.push_back(option);
  }
  AddRunFlags(parser_, run_);
}

std::vector<std::string> BatchCommand::Settings() const {
  std::vector<std::string> words;
  for (const CLI::Option* option : given_on_) {
    if (option->count() == 0) continue;
    const std::string name = "--" + option->get_lnames()[0];
    const bool is_switch = option->get_items_expected_max() == 0;
    for (const std::string& value : option->reduced_results()) {
      words.push_back(is_switch ? name : name + "=" + value);
    }
  }
  // Those of one name stay in their order, where the last one counts.
  std::stable_sort(words.begin(), words.end(), [](const std::string& a, const std::string& b) {
    return a.substr(0, a.find('=')) < b.substr(0, b.find('='));
  });
  return words;
}

void BatchCommand::Run() {
  ProgressLine progress(run_.progress_form());
  if (const std::string trouble = batch::TemplateTrouble(name_); !trouble.empty()) {
    throw UsageFailure("--name " + Shown(trouble));
  }
  CheckParams(controls_);
  const batch::FoundClips found = batch::FindClips(inputs_, recursive_);
  batch::Plan plan{.program = fs::read_symlink("/proc/self/exe").string(),
                   .folder = MadeFolder(folder_),
                   .settings = Settings(),
                   .overwrites = flags_.encode.overwrite,
                   .reports = reports_};
  if (found.outputs > 0) {
    progress.Note("left out " + std::to_string(found.outputs) +
                  (found.outputs == 1 ? " file that is an output of a batch"
                                      : " files that are outputs of a batch"));
  }
  batch::AddTasks(found.clips, name_, plan);
  batch::Appraise(plan, InterruptAsked);

  BatchResults results(plan, progress);
  if (!InterruptAsked() && !RunTasks(plan, results)) return;
  results.Tell();
  if (!run_.quiet && !run_.json) std::fputs(results.Table().c_str(), stdout);
  results.WritePage();
  if (results.ended() < plan.tasks.size()) throw Interrupted();
  if (results.failed() > 0) {
    throw ClipsFailed(std::to_string(results.failed()) + " of " +
                      std::to_string(plan.tasks.size()) +
                      (plan.tasks.size() == 1 ? " clip failed" : " clips failed"));
  }
}

std::vector<std::string> BatchCommand::SettingsTakenBy(const std::string& command) const {
  const CLI::App& taker = *program_.get_subcommand(command);
  std::vector<std::string> words = Settings();
  std::erase_if(words, [&](const std::string& word) {
    return !taker.get_option_no_throw(word.substr(0, word.find('=')));
  });
  return words;
}

void BatchCommand::RunAll(const batch::Plan& plan, batch::BatchWatcher& watcher) const {
  if (on_ == "here") {
    const batch::Machine machine = batch::ThisMachine();
    const int processors = run_.threads > 0 ? run_.threads : machine.processors;
    batch::RunLocally(plan, batch::SettingsFor(processors, machine.memory, jobs_), watcher);
    return;
  }
  batch::SlurmBatch cluster(plan, Cluster(), watcher);
  cluster.Submit();
  cluster.Wait();
}

bool BatchCommand::RunTasks(const batch::Plan& plan, BatchResults& results) const {
  if (splits_) {
    RunInPieces(plan, results);
  } else if (!detaches_ || on_ == "here") {
    RunAll(plan, results);
  } else {
    batch::SlurmBatch cluster(plan, Cluster(), results);
    if (cluster.Submit()) return false;
    cluster.Wait();
  }
  return true;
}

void BatchCommand::RunInPieces(const batch::Plan& plan, BatchResults& results) const {
  const auto without = [](std::vector<std::string> words, const std::string& flag) {
    std::erase_if(words, [&](const std::string& word) { return word.starts_with(flag + "="); });
    return words;
  };
  // Each shot is one that is told.
  const batch::SplitSettings settings{.looking = SettingsTakenBy("batch-shots"),
                                      .analysis = without(SettingsTakenBy("analyze"), "--shots"),
                                      .drawing = SettingsTakenBy("render"),
                                      .frames_a_piece = frames_a_piece_};
  std::vector<double> shares(plan.tasks.size());
  for (std::size_t film = 0; film < plan.tasks.size() && !results.Stops(); ++film) {
    batch::SteadyInPieces(
        plan, film, settings,
        [this](const batch::Plan& stage, batch::BatchWatcher& watcher) { RunAll(stage, watcher); },
        shares, results);
  }
}

batch::SlurmSettings BatchCommand::Cluster() const {
  return {.flags = CLI::detail::split_up(sbatch_args_), .clips_a_job = clips_a_job_};
}

BatchShotsCommand::BatchShotsCommand(CLI::App& program)
    : Command(*program.add_subcommand("batch-shots")->group("")) {
  AddFile(parser_, "IN", input_, "");
  AddFile(parser_, "OUT", output_, "");
  AddShotsFlag(parser_, shots_);
  AddRunFlags(parser_, run_);
}

void BatchShotsCommand::Run() {
  Confinement{.read = {input_}, .written = {output_}}.Begin();
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  RunOnPromises([&](host::Opening opening) { Find(opening, progress); });
}

void BatchShotsCommand::Find(host::Opening opening, ProgressLine& progress) const {
  const host::ClipMedium medium = host::OpenMedium(input_, opening);
  if (!medium.info.warning.empty()) progress.Warn(medium.info.warning);
  const std::vector<std::size_t> begins = host::ShotStarts(medium, shots_, progress);
  auto shots = nlohmann::ordered_json::array();
  for (std::size_t s = 0; s < begins.size(); ++s) {
    const std::size_t end = s + 1 < begins.size() ? begins[s + 1] : medium.info.frame_count;
    shots.push_back({{"first_frame", begins[s]}, {"end_frame", end}});
  }
  const nlohmann::ordered_json object = {{"shots", shots}};
  if (!batch::WriteWhole(output_, object.dump() + "\n")) {
    throw media::Failure(media::Failure::Side::output, output_ + ": can't be written");
  }
}

BatchJobCommand::BatchJobCommand(CLI::App& program)
    : Command(*program.add_subcommand("batch-job")->group("")) {
  AddFile(parser_, "PLAN", plan_, "");
}

void BatchJobCommand::Run() {
  const auto number_in = [](const char* name) {
    const char* const text = std::getenv(name);
    return text ? std::atoi(text) : -1;
  };
  const int group = number_in("SLURM_ARRAY_TASK_ID");
  if (group < 0) throw UsageFailure("batch-job is run by a cluster");
  class Watcher final : public batch::TaskWatcher {
    void Show(double, const std::string&) override {}
    bool Stops() override { return InterruptAsked(); }
  } watcher;
  // Of the machine the job may have some processors alone, also where nothing keeps it to them.
  const int given = number_in("SLURM_CPUS_ON_NODE");
  batch::RunGroup(plan_, static_cast<std::size_t>(group),
                  given > 0 ? given : batch::ThisMachine().processors, watcher);
  if (InterruptAsked()) throw Interrupted();
}

BatchGlancesCommand::BatchGlancesCommand(CLI::App& program)
    : Command(*program.add_subcommand(batch::kGlancesCommand)->group("")) {
  AddFiles(parser_, "IN", inputs_, "");
}

void BatchGlancesCommand::Run() {
  Confinement{.read = inputs_}.Begin();
  for (const std::string& input : inputs_) {
    std::printf("%s\n", batch::GlanceText(input).c_str());
    std::fflush(stdout);
  }
}

BatchPicturesCommand::BatchPicturesCommand(CLI::App& program)
    : Command(*program.add_subcommand("batch-pictures")->group("")) {
  AddFile(parser_, "BEFORE", before_, "");
  AddFile(parser_, "AFTER", after_, "");
}

void BatchPicturesCommand::Run() {
  Confinement{.read = {before_, after_}}.Begin();
  const ThumbnailSource before(before_), after(after_);
  std::printf("%s\n",
              Thumbnails(before.view(), after.view(), before.pixel_aspect()).dump().c_str());
}

}  // namespace calmframe
