#include "apps/calmframe/report_command.h"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/param_text.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "apps/calmframe/solved_clip.h"
#include "apps/report/page.h"
#include "apps/report/picture.h"
#include "host/media/output_file.h"
#include "host/timeline/layer.h"
#include "host/timeline/source.h"
#include "platform/tessel/debug.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

using report::Curve;
using report::Plot;

constexpr int kPictureWidth = 400;   // of the filmstrip, pixels
constexpr std::size_t kMoments = 6;  // of the filmstrip
constexpr int kMostDownsampled = 4;

// The solve's log while this lives, instead of its way to the standard error.
class SolveLog {
 public:
  SolveLog() {
    tessel::debug::SetSink([this](const std::string& text) {
      const std::lock_guard lock(mutex_);
      text_ += text;
    });
  }
  ~SolveLog() {
    tessel::debug::SetSink([](const std::string&) {});
  }
  SolveLog(const SolveLog&) = delete;
  SolveLog& operator=(const SolveLog&) = delete;
  std::string text() const {
    const std::lock_guard lock(mutex_);
    return text_;
  }

 private:
  mutable std::mutex mutex_;
  std::string text_;
};

report::PictureView ViewOf(const host::WorldBuffer& pixels, double pixel_aspect) {
  return {pixels.row<HX_Pixel8>(0), pixels.world().row_bytes, pixels.world().width,
          pixels.world().height, pixel_aspect};
}

// Share of the picture that nothing was drawn on.
double EmptyShare(const host::WorldBuffer& pixels) {
  std::int64_t empty = 0;
  const int width = pixels.world().width, height = pixels.world().height;
  for (int y = 0; y < height; ++y) {
    const HX_Pixel8* row = pixels.row<HX_Pixel8>(y);
    for (int x = 0; x < width; ++x) empty += 255 - row[x].alpha;
  }
  return static_cast<double>(empty) / 255 / (static_cast<double>(width) * height);
}

std::vector<double> Column(const std::vector<report::CameraPlace>& path,
                           double report::CameraPlace::*axis) {
  std::vector<double> values;
  for (const report::CameraPlace& place : path) values.push_back(place.*axis);
  return values;
}

std::vector<double> Numbers(const std::vector<int>& counts) {
  return {counts.begin(), counts.end()};
}

Plot PathPlot(const std::string& id, const std::string& title, const std::string& unit,
              const std::string& about, double least_span,
              const std::vector<report::CameraPlace>& before,
              const std::vector<report::CameraPlace>& after, double report::CameraPlace::*axis) {
  return {id,
          title,
          unit,
          about,
          {{"as shot", Column(before, axis)}, {"steadied", Column(after, axis)}},
          least_span};
}

std::string Percent(double share, int digits) {
  return report::Short(100 * share, digits) + " %";
}

double Mean(const std::vector<double>& values) {
  double sum = 0;
  for (const double value : values) sum += value;
  return values.empty() ? 0 : sum / static_cast<double>(values.size());
}

std::string ModelsText(const std::vector<double>& scores) {
  constexpr const char* kKinds[] = {"none", "shift", "shift, turn and size", "perspective",
                                    "bent grid"};
  std::size_t counts[std::size(kKinds)] = {};
  for (const double score : scores) {
    if (!std::isfinite(score)) continue;
    ++counts[std::clamp<int>(static_cast<int>(std::ceil(score - 1e-9)), 0, 4)];
  }
  std::string text;
  for (std::size_t kind = std::size(kKinds); kind-- > 0;) {
    if (counts[kind] == 0) continue;
    text += (text.empty() ? "" : "; ") + std::string(kKinds[kind]) + ": " +
            std::to_string(counts[kind]) + " frames";
  }
  return text;
}

// Those that a person sets, and of the experts' those that were changed.
std::vector<report::Fact> ControlsOf(SteadyClip& clip) {
  std::vector<report::Fact> facts;
  for (const HX_ParamDef& declared : clip.host().declarations()) {
    const auto param = clip.effect().Param(clip.effect().IndexOf(declared.disk_id));
    if (!param || !IsControl(*param) || (param->ui_flags & HX_PARAM_UI_DISABLED) != 0) continue;
    const std::optional<double> value = host::ValueOf(*param);
    if (!value || (!HasFlag(declared.disk_id) &&
                   static_cast<float>(*value) == static_cast<float>(DefaultOf(declared))))
      continue;
    facts.push_back({declared.name, ValueText(declared, *value)});
  }
  return facts;
}

// What the page tells of tracks, models, path and crop.
void AddSolve(const SolvedClip& solved, const std::vector<double>& scores, report::Page& page) {
  const std::vector<report::CameraPlace> before = report::PathOf(solved.before);
  const std::vector<report::CameraPlace> after = report::PathOf(solved.after);
  using report::CameraPlace;
  const std::string how = ", by a robust fit of a similarity to the tracks of each two frames.";
  page.plots.push_back(PathPlot("path-x", "Camera path, across", "px",
                                "Where the camera points, to the right" + how, 4, before, after,
                                &CameraPlace::x));
  page.plots.push_back(PathPlot("path-y", "Camera path, down", "px",
                                "Where the camera points, downwards" + how, 4, before, after,
                                &CameraPlace::y));
  page.plots.push_back(PathPlot("path-angle", "Camera path, turn", "degrees",
                                "How the camera is turned, clockwise" + how, 0.4, before, after,
                                &CameraPlace::angle));
  page.plots.push_back(PathPlot("path-zoom", "Camera path, closeness", "times",
                                "How close the camera is to what it shows, 1 at first" + how, 0.02,
                                before, after, &CameraPlace::zoom));
  page.plots.push_back({"tracks",
                        "Tracks a frame",
                        "tracks",
                        "Features that are followed, that begin, and that the next frame loses.",
                        {{"begun", Numbers(solved.begun)},
                         {"followed", Numbers(solved.tracked)},
                         {"lost", Numbers(solved.lost)}},
                        10,
                        true});
  if (std::any_of(scores.begin(), scores.end(), [](double s) { return std::isfinite(s); })) {
    page.plots.push_back(
        {"models",
         "Model scores",
         "",
         "What a frame's warp may do: 1 shift it, 2 turn and size it too, 3 "
         "perspective, 4 bend it; between two numbers a blend of both. As a solve of the "
         "saved tracks tells them.",
         {{"score", scores}},
         4,
         true});
    page.facts.push_back({"Warps", ModelsText(scores)});
  }
  if (!solved.window.empty()) {
    std::vector<double> x, y;
    for (const report::Point& place : solved.window) {
      x.push_back(place.x);
      y.push_back(place.y);
    }
    page.plots.push_back({"crop",
                          "Crop path",
                          "px",
                          "Where the centre of the crop window lies beside the frame's centre.",
                          {{"across", x}, {"down", y}},
                          4});
    page.facts.push_back(
        {"Crop window",
         std::to_string(solved.crop_width) + " x " + std::to_string(solved.crop_height) + ", " +
             Percent(static_cast<double>(solved.crop_width) / solved.width, 1) + " of the width"});
  }
  const double shake = report::ShakeOf(before), left = report::ShakeOf(after);
  std::vector<int> tracked = solved.tracked;
  std::sort(tracked.begin(), tracked.end());
  page.facts.push_back({"Shake", report::Short(shake, 2) + " px/frame² as shot, " +
                                     report::Short(left, 2) + " steadied"});
  if (!tracked.empty()) {
    page.facts.push_back({"Tracks", std::to_string(tracked[tracked.size() / 2]) +
                                        " in the middle, " + std::to_string(tracked.front()) +
                                        " at the least"});
  }
}

// Draws the whole clip, small: the filmstrip, and how much of each frame is left empty, percent.
std::vector<double> AddPictures(SteadyClip& clip, int threads, ProgressLine& progress,
                                report::Page& page) {
  const media::ClipInfo& info = clip.info();
  const double aspect =
      static_cast<double>(info.pixel_aspect.num) / static_cast<double>(info.pixel_aspect.den);
  const std::size_t moments = std::min(kMoments, info.frame_count);
  for (std::size_t m = 0; m < moments; ++m) {
    report::FilmFrame moment;
    moment.frame = (2 * m + 1) * info.frame_count / (2 * moments);
    moment.seconds = static_cast<double>(moment.frame) * static_cast<double>(info.frame_rate.den) /
                     static_cast<double>(info.frame_rate.num);
    page.film.push_back(moment);
  }
  std::vector<double> empty;
  std::size_t next = 0;
  RenderSettings settings{.depth = 8, .threads = threads};
  settings.downsample = std::clamp(info.width / kPictureWidth, 1, kMostDownsampled);
  RenderFrames(clip, {0, info.frame_count}, settings, "drawing", progress,
               [&](std::size_t frame, const host::WorldBuffer& pixels) {
                 empty.push_back(100 * EmptyShare(pixels));
                 if (next < moments && frame == page.film[next].frame) {
                   page.film[next++].after = DataUrlOf(ViewOf(pixels, aspect), kPictureWidth);
                 }
               });
  // From the source that has drawn the frames: another reader would search the file for them again.
  const host::SourcePtr source = clip.effect().shared()->layer()->state()->source;
  for (report::FilmFrame& moment : page.film) {
    const host::PicturePtr shot =
        source->Fetch(static_cast<std::int64_t>(moment.frame), host::PixelKind::argb8);
    if (!shot) continue;
    moment.before = report::DataUrlOf(
        {shot->row<HX_Pixel8>(0), shot->row_bytes(), shot->width(), shot->height(), aspect},
        kPictureWidth);
  }
  return empty;
}

// One value for each row of the other curves, also where a frame has two fields.
void AddEmptyShares(const std::vector<double>& empty, std::size_t rows, report::Page& page) {
  const double most = empty.empty() ? 0 : *std::max_element(empty.begin(), empty.end());
  page.facts.push_back({"Left empty", Percent(Mean(empty) / 100, 2) + " on the mean, " +
                                          Percent(most / 100, 2) + " at the most"});
  Curve curve{"uncovered", {}};
  for (std::size_t row = 0; row < rows; ++row) {
    curve.values.push_back(empty[row * empty.size() / rows]);
  }
  page.plots.push_back(
      {"empty",
       "Uncovered share",
       "%",
       "How much of the picture shows nothing, as it is drawn with these controls.",
       {curve},
       1,
       true});
}

std::string NameOf(const std::string& path) {
  return std::filesystem::path(path).filename().string();
}

}  // namespace

ReportCommand::ReportCommand(CLI::App& program)
    : command_(program.add_subcommand("report",
                                      "Show saved work as a page\n\n"
                                      "Camera path before and after, tracks, models, crop, what is "
                                      "left empty, and a filmstrip, "
                                      "in one file for any browser.")) {
  AddFile(*command_, "PROJECT", project_, "The saved work")->required();
  AddFile(*command_, "OUT", output_, "The page to write, .html")->required();
  command_->add_flag("--overwrite", overwrite_, "Replace an existing file")->group("Output");
  AddRunFlags(*command_, run_);
  command_->footer(
      "Examples:\n"
      "  calmframe report shaky.calm report.html");
}

void ReportCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  media::OutputFile file(output_, project_, overwrite_);
  ControlFlags controls;
  controls.experimental = true;  // tracks and the solve's log are for experts
  const std::unique_ptr<SteadyClip> clip = OpenSaved(project_, controls);
  KeepApart(output_, {clip->path()});
  const media::ClipInfo& info = clip->info();
  const double rate =
      static_cast<double>(info.frame_rate.num) / static_cast<double>(info.frame_rate.den);

  report::Page page;
  page.title = NameOf(clip->path());
  page.facts = {
      {"Clip", std::to_string(info.width) + " x " + std::to_string(info.height) + ", " +
                   report::Short(rate, 3) + " frames a second"},
      {"Length", std::to_string(info.frame_count) + " frames, " +
                     report::Short(static_cast<double>(info.frame_count) / rate, 2) + " s"}};
  if (!info.warning.empty()) page.notes.push_back(info.warning);

  {
    const SolveLog solve_log;
    const bool saved = clip->Work(progress).solve;
    page.controls = ControlsOf(*clip);
    const SolvedClip solved = ReadSolve(*clip, project_);
    const std::size_t rows = std::max<std::size_t>(solved.tracked.size(), 1);
    page.seconds_a_value = static_cast<double>(info.frame_count) / rate / static_cast<double>(rows);
    const std::vector<double> empty = AddPictures(*clip, run_.threads, progress, page);
    // Saved work doesn't keep how the models were chosen: a solve of the same tells it again. It
    // comes last, since tracks are saved in steps of 1/32 pixel, which moves its warps a little.
    if (saved) clip->SolveAnew(progress);
    AddSolve(solved, ScoresIn(solve_log.text(), rows), page);
    AddEmptyShares(empty, rows, page);
  }

  std::ofstream out(file.temporary(), std::ios::binary | std::ios::trunc);
  out << report::HtmlOf(page);
  out.close();
  if (!out) {
    throw media::Failure(media::Failure::Side::output, output_ + ": could not be written");
  }
  file.Commit();
}

}  // namespace calmframe
