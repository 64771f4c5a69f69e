#include "apps/calmframe/stabilize_command.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

#include "apps/calmframe/confinement.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/film_work.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "host/batch/machine.h"
#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"
#include "platform/tessel/threads.h"

namespace calmframe {

std::string TroubleText(const host::CropTrouble& trouble, const host::SteadyClip& clip) {
  using Kind = host::CropTrouble::Kind;
  // Without motion there is nothing to smooth.
  const std::string gentler = clip.ValueOf(HX_RESULT.disk_id) == host::kNoMotion
                                  ? "--result smooth-motion"
                                  : "less --smoothness";
  const std::string window =
      std::to_string(trouble.window.width) + "x" + std::to_string(trouble.window.height);
  switch (trouble.kind) {
    case Kind::none:
      return "";
    case Kind::nothing_seen:
      return "no part of the picture stays in view; set --framing stabilize-only or adjust other "
             "flags";
    case Kind::black: {
      const std::string would_fill =
          trouble.needed_percent <= HX_MAXIMUM_SCALE.max
              ? " and would fill it at --maximum-scale " +
                    std::to_string(static_cast<int>(trouble.needed_percent))
              : "";
      return std::to_string(std::lround(100 * trouble.black)) +
             " % of the picture stays black: the crop window is " + window + would_fill + "; " +
             gentler + " crops less";
    }
    default:
      return "of " + std::to_string(clip.info().width) + "x" + std::to_string(clip.info().height) +
             " pixels only " + window + " stay in view; " + gentler +
             " or --framing stabilize-only keeps more";
  }
}

void TellTrouble(const host::CropTrouble& trouble, const host::SteadyClip& clip,
                 ProgressLine& progress) {
  const std::string line = TroubleText(trouble, clip);
  if (trouble.kind == host::CropTrouble::Kind::nothing_seen) {
    throw SolveFailure(clip.path() + ": " + line);
  }
  if (!line.empty()) progress.Warn(line);
}

host::CropTrouble Choose(host::SteadyClip& clip, const host::WindowSettings& window,
                         ProgressLine& progress) {
  try {
    return host::ChooseFraming(clip, window, progress);
  } catch (const host::WindowRefused&) {
    throw UsageFailure(
        "a window that follows the picture needs --framing crop-auto-scale or synthesize-edges, "
        "and no margin");
  }
}

void Frame(host::SteadyClip& clip, const host::WindowSettings& window, ProgressLine& progress) {
  TellTrouble(Choose(clip, window, progress), clip, progress);
}

void AddRunFlags(CLI::App& command, RunFlags& flags) {
  CLI::Option* const threads = AddNumber<int>(
      command, "--threads", [&flags](int count) { flags.threads = count; }, "N", 1, 1024,
      "Processors to use; all at first");
  CLI::Option* const quiet =
      AddSwitch(command, "--quiet", flags.quiet,
                "Show no progress; warnings and errors still, and with --json what came out");
  CLI::Option* const json = AddSwitch(command, "--json", flags.json,
                                      "Show progress, warnings, errors and what came out as JSON "
                                      "objects, one a line, for programs");
  PutInGroup("Running", {threads, quiet, json});
  AddSandboxFlag(command);
}

void AddWindowFlags(CLI::App& command, host::WindowSettings& window) {
  CLI::Option* const kind = AddChoice(
      command, "--window",
      [&window](const std::string& name) {
        window.kind = name == "follow" ? host::WindowSettings::Kind::follow
                                       : host::WindowSettings::Kind::steady;
      },
      {"follow", "steady"},
      "What of each frame is shown: a part that follows the picture, which leaves nothing black "
      "and enlarges no further than it may; or the effect's own window. At first the one that "
      "follows, unless --smoothness, --crop-less-smooth-more or --result are set; --framing crop "
      "and stabilize-only have the effect's own alone");
  CLI::Option* const zoom = AddNumber<double>(
      command, "--zoom-at-most", [&window](double most) { window.most_zoom = most; }, "ZOOM", 1,
      100, "How far a window that follows may enlarge; at first as far as --maximum-scale, 1.5");
  CLI::Option* const zoom_speed = AddNumber<double>(
      command, "--zoom-speed", [&window](double speed) { window.zoom_speed = speed; }, "PERCENT", 0,
      1000,
      "How fast a window that follows may change its zoom, in percent a second, beside what the "
      "camera itself does; more only where nothing else keeps black out of the picture");
  TellDefault(*zoom_speed, "5");
  CLI::Option* const steady = AddChoice(
      command, "--steady",
      [&window](const std::string& name) {
        window.still = name == "background" ? host::Still::background
                       : name == "subject"  ? host::Still::subject
                                            : host::Still::automatic;
      },
      {"auto", "background", "subject"},
      "What is to stand still where somebody near moves against what is behind: the background, or "
      "that subject. At first the background, where it fills enough of the frame");
  CLI::Option* const as_set = AddSwitch(
      command, "--as-set", window.as_set,
      "Choose nothing for the clip: the controls as they are set, or as they come, and the "
      "effect's own window");
  PutInGroup("Window", {kind, zoom, zoom_speed, steady, as_set});
}

void AddOutputFlags(CLI::App& command, OutputFlags& flags) {
  AddWindowFlags(command, flags.window);
  CLI::Option* const crf = AddNumber<int>(
      command, "--crf", [&flags](int value) { flags.encode.crf = value; }, "N", 0, 63,
      "How much the encoder may lose: less looks better and makes larger files");
  TellDefault(*crf, std::to_string(flags.encode.crf));
  CLI::Option* const codec =
      AddName(command, "--codec", flags.encode.codec,
              "Encoder, such as libx265, or the name of what it encodes; at first H.264, or what "
              "the kind of file takes");
  CLI::Option* const preset = AddName(
      command, "--preset", flags.encode.preset,
      "What the encoder calls its preset or speed, or for any that has such a setting ultrafast to "
      "veryslow; draft for a quick look: half of each side, encoded fast");
  CLI::Option* const options =
      AddPairs(command, "--encoder-option", flags.encode.options,
               "An option of the encoder's own, by FFmpeg's name, such as tune=grain; repeatable");
  CLI::Option* const pixel_format = AddName(
      command, "--pixel-format", flags.encode.pixel_format,
      "Pixel format of the encoder; at first the clip's own alpha, chroma and depth, as far as "
      "the codec has them");
  CLI::Option* const depth = AddChoice(
      command, "--depth", [&flags](const std::string& bits) { flags.depth = std::stoi(bits); },
      {"8", "16", "32"},
      "Bits of a component while frames are drawn; at first 8, or 16 for deeper clips and for "
      "synthesize-edges");
  CLI::Option* const banner = AddSwitch(
      command, "--warning-banner", flags.warning_banner,
      "Draw a banner over frames that could not be steadied as asked; what it says is told in a "
      "line in any case");
  CLI::Option* const overwrite =
      AddSwitch(command, "--overwrite", flags.encode.overwrite, "Replace OUT where it exists");
  PutInGroup("Output", {crf, codec, preset, options, pixel_format, depth, banner, overwrite});
}

void AddSideBySideFlag(CLI::App& command, OutputFlags& flags) {
  PutInGroup("Output", {AddFile(command, "--side-by-side", flags.side_by_side,
                                "Write before and after beside each other to this file too; the "
                                "other flags of the output count for it as well",
                                Need::optional)});
}

media::ClipInfo WrittenAs(const media::ClipInfo& clip, const OutputFlags& flags) {
  media::ClipInfo written = clip;
  if (flags.is_draft()) {
    // Even, or players would have to show 4:4:4.
    for (int* side : {&written.width, &written.height}) *side = std::max(1, *side / 4 * 2);
    written.field_order = media::FieldOrder::progressive;  // the lines of both fields are mixed
  }
  return written;
}

RenderSettings SettingsOf(const OutputFlags& flags, int threads) {
  return {.depth = flags.depth,
          .downsample = flags.is_draft() ? 2 : 1,
          .threads = threads,
          .warning_banner = flags.warning_banner};
}

std::unique_ptr<SideBySide> MakeSideBySide(const OutputFlags& flags, const media::ClipInfo& info,
                                           const std::string& output,
                                           const std::vector<std::string>& inputs) {
  const std::string& path = flags.side_by_side;
  if (path.empty()) return nullptr;
  KeepApart(path, inputs);
  KeepApart(path, {output}, "the other output");
  return std::make_unique<SideBySide>(path, info, flags.encode, flags.labels_sides);
}

void Stabilize(const std::string& input, const std::string& output, const std::string& project,
               const Stretch& stretch, const host::ShotRequest& shots, const ControlFlags& controls,
               const OutputFlags& flags, int threads, ProgressLine& progress) {
  const tessel::threads::ProcessorLimit limit(threads);
  RunOnPromises([&](host::Opening opening) {
    const std::unique_ptr<host::Film> film = TakeUp(input, project, opening, stretch, shots);
    const media::ClipInfo info = film->info();
    film->KeepDecoded(static_cast<std::size_t>(
        batch::BytesToKeep(batch::ThisMachine(), threads,
                           static_cast<double>(info.width) * info.height, info.bit_depth > 8)));
    if (!info.warning.empty()) progress.Warn(info.warning);
    KeepApart(output, {project});
    // Made first, so that an output that cannot be written costs nobody an analysis.
    const media::ClipInfo written = WrittenAs(info, flags);
    const std::unique_ptr<media::ClipWriter> writer =
        media::ClipWriter::Create(output, written, written.width, written.height, flags.encode);
    const std::unique_ptr<SideBySide> both = MakeSideBySide(flags, written, output, {project});
    TellLosses(*writer, both.get(), progress);
    SteadyFilm(*film, film->range(), project, controls, flags, threads, *writer, both.get(),
               progress);
  });
}

StabilizeCommand::StabilizeCommand(CLI::App& program)
    : Command(AddCommand(
          program, "stabilize",
          "Steady a clip\n\n"
          "Writes the clip IN to OUT with its shake smoothed away; sound, subtitles and time "
          "stamps "
          "stay as they were. It needs no flag. Where the result isn't yet as you want it, reach "
          "for --smoothness first, then for --framing.\n\n"
          "OUT's extension picks the kind of file. OUT is there when it is whole: a run that fails "
          "or is stopped leaves none.",
          "Examples:\n"
          "  calmframe stabilize shaky.mp4 steady.mp4\n"
          "  calmframe stabilize walk.mp4 calm.mp4 --smoothness 100\n"
          "  calmframe stabilize talk.mp4 still.mp4 --result no-motion\n"
          "  calmframe stabilize hike.mp4 summit.mp4 --from 0:02 --to 0:12")) {
  AddFile(parser_, "IN", input_,
          "The shaky clip; - for a pipe, f%04d.png, a quoted glob or a folder for pictures");
  AddFile(parser_, "OUT", output_,
          "The steady clip to write; - for a pipe: raw frames, or Matroska with --codec; "
          "f%04d.png or a folder with / for pictures");
  AddControlFlags(parser_, controls_);
  AddStretchFlags(parser_, stretch_, BareNumber::seconds);
  AddShotsFlag(parser_, shots_);
  AddOutputFlags(parser_, flags_);
  AddSideBySideFlag(parser_, flags_);
  AddProjectFlag(parser_, project_);
  AddRunFlags(parser_, run_);
  PutInGroup("", {AddSwitch(parser_, "--thumbnails", flags_.thumbnails,
                            "Tell what a frame looks like before and after, for batch's page")});
}

void StabilizeCommand::Run() {
  Confinement{.read = {input_}, .written = {output_, flags_.side_by_side, project_}}.Begin();
  ProgressLine progress(run_.progress_form());
  Stabilize(input_, output_, project_, stretch_, shots_, controls_, flags_, run_.threads, progress);
}

}  // namespace calmframe
