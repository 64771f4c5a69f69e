#include "apps/calmframe/stabilize_command.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

constexpr std::int32_t kSafeMargin = HX_ACTION_SAFE_MARGIN.disk_id;
constexpr std::int32_t kMaximumScale = HX_MAXIMUM_SCALE.disk_id;
constexpr std::int32_t kAdditionalScale = HX_ADDITIONAL_SCALE.disk_id;

// The share of the picture that stays black because the controls stop its enlargement, 0 to 1.
double BlackShare(const host::SteadyClip& clip, double width, const host::CropWindow& crop) {
  // Whoever asks for a border or a smaller picture has one.
  if (clip.ValueOf(HX_FRAMING.disk_id) != host::kCropAutoScale || clip.ValueOf(kSafeMargin) > 0 ||
      clip.ValueOf(kAdditionalScale) < 100) {
    return 0;
  }
  const double most = clip.ValueOf(kMaximumScale) / 100 * clip.ValueOf(kAdditionalScale) / 100;
  return 1 - std::min(1.0, most * crop.width / width) *
                 std::min(1.0, most * crop.height / clip.info().height);
}

}  // namespace

CropTrouble CropTroubleOf(host::SteadyClip& clip) {
  if (!host::Crops(clip.ValueOf(HX_FRAMING.disk_id))) return {};
  const std::unique_ptr<host::CropWindow> crop = clip.Crop();
  if (!crop || crop->width <= 0 || crop->height <= 0) {
    return {
        "no part of the picture stays in view; set --framing stabilize-only or adjust other flags",
        true};
  }
  const media::ClipInfo& info = clip.info();
  const double width = static_cast<double>(info.width) *
                       static_cast<double>(info.pixel_aspect.num) /
                       static_cast<double>(info.pixel_aspect.den);
  // Without motion there is nothing to smooth.
  const std::string gentler = clip.ValueOf(HX_RESULT.disk_id) == host::kNoMotion
                                  ? "--result smooth-motion"
                                  : "less --smoothness";
  const std::string window = std::to_string(crop->width) + "x" + std::to_string(crop->height);
  constexpr double kBlack = 0.02;  // of the picture; less is a line at its edge
  if (const double black = BlackShare(clip, width, *crop); black > kBlack) {
    // The additional scale enlarges what the maximum scale has let through.
    const double needed = std::max(width / crop->width, double(info.height) / crop->height) * 100 /
                          clip.ValueOf(kAdditionalScale);
    const double percent = std::ceil(100 * needed);
    const std::string would_fill =
        percent <= HX_MAXIMUM_SCALE.max
            ? " and would fill it at --maximum-scale " + std::to_string(static_cast<int>(percent))
            : "";
    return {std::to_string(std::lround(100 * black)) +
            " % of the picture stays black: the crop window is " + window + would_fill + "; " +
            gentler + " crops less"};
  }
  constexpr double kSmall = 0.4;  // of a side
  if (crop->width >= kSmall * width && crop->height >= kSmall * info.height) return {};
  return {"of " + std::to_string(info.width) + "x" + std::to_string(info.height) + " pixels only " +
          window + " stay in view; " + gentler + " or --framing stabilize-only keeps more"};
}

void CheckCrop(host::SteadyClip& clip, ProgressLine& progress) {
  const CropTrouble trouble = CropTroubleOf(clip);
  if (trouble.nothing_seen) throw SolveFailure(clip.path() + ": " + trouble.line);
  if (!trouble.line.empty()) progress.Warn(trouble.line);
}

void Frame(host::SteadyClip& clip, const WindowFlags& flags, ProgressLine& progress) {
  const auto value = [&clip](const auto& control) { return clip.ValueOf(control.disk_id); };
  const bool may_follow = value(HX_FRAMING) == host::kCropAutoScale &&
                          value(HX_ACTION_SAFE_MARGIN) == 0 && value(HX_ADDITIONAL_SCALE) > 0;
  // Whoever sets how calm the path is has it so, as far as the effect goes.
  const bool as_it_comes =
      value(HX_SMOOTHNESS) == HX_SMOOTHNESS.default_value &&
      value(HX_CROP_LESS_SMOOTH_MORE) == HX_CROP_LESS_SMOOTH_MORE.default_value &&
      value(HX_RESULT) == host::kSmoothMotion;
  const bool asked = flags.kind == WindowFlags::Kind::follow || flags.most_zoom > 0;
  if (asked && !may_follow) {
    throw UsageFailure(
        "a window that follows the picture needs --framing crop-auto-scale and no margin");
  }
  if (flags.kind == WindowFlags::Kind::steady || !may_follow || !(asked || as_it_comes)) {
    return CheckCrop(clip, progress);
  }
  clip.FollowPicture(flags.most_zoom > 0 ? flags.most_zoom : value(HX_MAXIMUM_SCALE) / 100,
                     progress);
}

void TellOutcome(host::SteadyClip& clip, ProgressLine& progress) {
  if (!host::Crops(clip.ValueOf(HX_FRAMING.disk_id))) return;
  const host::Outcome outcome = clip.Measure();
  const auto rounded = [](double value) { return std::round(value * 10000) / 10000; };
  nlohmann::ordered_json object;
  object["window"] = outcome.follows ? "follow" : "steady";
  object["bends"] = outcome.bends;
  object["width_kept"] = rounded(outcome.width_kept);
  object["most_zoom"] = rounded(outcome.most_zoom);
  object["most_black"] = rounded(outcome.most_black);
  object["shake_before"] = rounded(outcome.before.mean);
  object["shake_after"] = rounded(outcome.after.mean);
  object["decibels"] = rounded(outcome.decibels());
  object["worst_shake"] = rounded(outcome.after.worst);
  object["worst_at"] = rounded(outcome.after.worst_at);
  progress.End(outcome.Text(), object);
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
}

void AddOutputFlags(CLI::App& command, OutputFlags& flags) {
  CLI::Option* const window = AddChoice(
      command, "--window",
      [&flags](const std::string& name) {
        flags.window.kind =
            name == "follow" ? WindowFlags::Kind::follow : WindowFlags::Kind::steady;
      },
      {"follow", "steady"},
      "What of each frame is shown: a part that follows the picture, which leaves nothing black "
      "and "
      "enlarges no further than it may; or the effect's own window. At first the one that follows, "
      "unless --smoothness, --crop-less-smooth-more, --result or --framing are set");
  CLI::Option* const zoom = AddNumber<double>(
      command, "--zoom-at-most", [&flags](double most) { flags.window.most_zoom = most; }, "ZOOM",
      1, 100, "How far a window that follows may enlarge; at first as far as --maximum-scale, 1.5");
  PutInGroup("Window", {window, zoom});
  CLI::Option* const crf = AddNumber<int>(
      command, "--crf", [&flags](int value) { flags.encode.crf = value; }, "N", 0, 63,
      "How much the encoder may lose: less looks better and makes larger files");
  TellDefault(*crf, std::to_string(flags.encode.crf));
  CLI::Option* const codec =
      AddName(command, "--codec", flags.encode.codec,
              "Encoder, such as libx265, or the name of what it encodes; at first H.264, or what "
              "the kind of file takes");
  CLI::Option* const pixel_format = AddName(
      command, "--pixel-format", flags.encode.pixel_format,
      "Pixel format of the encoder; at first the clip's own alpha, chroma and depth, as far as "
      "the codec has them");
  CLI::Option* const depth = AddChoice(
      command, "--depth", [&flags](const std::string& bits) { flags.depth = std::stoi(bits); },
      {"8", "16", "32"},
      "Bits of a component while frames are drawn; at first 8, or 16 for deeper clips and for "
      "synthesize-edges");
  CLI::Option* const overwrite =
      AddSwitch(command, "--overwrite", flags.encode.overwrite, "Replace OUT where it exists");
  PutInGroup("Output", {crf, codec, pixel_format, depth, overwrite});
}

void Stabilize(const std::string& input, const std::string& output, const std::string& project,
               const ControlFlags& controls, const OutputFlags& flags, int threads,
               ProgressLine& progress) {
  const tessel::threads::ProcessorLimit limit(threads);
  RunOnPromises([&](host::Opening opening) {
    const std::unique_ptr<host::SteadyClip> clip = TakeUp(input, project, controls, opening);
    const media::ClipInfo& info = clip->info();
    if (!info.warning.empty()) progress.Warn(info.warning);
    KeepApart(output, {project});
    // Made first, so that an output that cannot be written costs nobody an analysis.
    const std::unique_ptr<media::ClipWriter> writer =
        media::ClipWriter::Create(output, info, info.width, info.height, flags.encode);
    TellLosses(*writer, progress);
    const Unsaved unsaved = WorkAndLeave(*clip, project, progress);
    Frame(*clip, flags.window, progress);
    RenderClip(*clip, {0, info.frame_count}, {.depth = flags.depth, .threads = threads}, *writer,
               progress);
    TellOutcome(*clip, progress);
    unsaved.Throw();
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
          "  calmframe stabilize talk.mp4 still.mp4 --result no-motion")) {
  AddFile(parser_, "IN", input_,
          "The shaky clip; - for a pipe, f%04d.png, a quoted glob or a folder for pictures");
  AddFile(parser_, "OUT", output_,
          "The steady clip to write; - for a pipe: raw frames, or Matroska with --codec; "
          "f%04d.png or a folder with / for pictures");
  AddControlFlags(parser_, controls_);
  AddOutputFlags(parser_, flags_);
  AddProjectFlag(parser_, project_);
  AddRunFlags(parser_, run_);
}

void StabilizeCommand::Run() {
  ProgressLine progress(run_.progress_form());
  Stabilize(input_, output_, project_, controls_, flags_, run_.threads, progress);
}

}  // namespace calmframe
