#include "apps/calmframe/report_command.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "apps/calmframe/film_work.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/plugin_path.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "apps/report/data_url.h"
#include "apps/report/model_scores.h"
#include "apps/report/page.h"
#include "apps/report/plot.h"
#include "apps/report/shown_section.h"
#include "apps/report/solve_figures.h"
#include "apps/report/solve_section.h"
#include "host/base/param_text.h"
#include "host/effects/param_table.h"
#include "host/media/output_file.h"
#include "host/timeline/layer.h"
#include "host/timeline/source.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

namespace fs = std::filesystem;

constexpr int kPictureWidth = 400;   // of the filmstrip, pixels
constexpr std::size_t kMoments = 6;  // of the filmstrip
constexpr int kMostDownsampled = 4;

media::PictureView ViewOf(const host::WorldBuffer& pixels) {
  return {pixels.row<HX_Pixel8>(0), pixels.world().row_bytes, pixels.world().width,
          pixels.world().height};
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

// Those that a person sets, and of the experts' those that were changed.
std::vector<report::Fact> ControlsOf(host::SteadyClip& clip) {
  std::vector<report::Fact> facts;
  for (const HX_ParamDef& declared : clip.host().declarations()) {
    const auto param = clip.effect().Param(clip.effect().IndexOf(declared.disk_id));
    if (!param || !IsControl(*param) || (param->ui_flags & HX_PARAM_UI_DISABLED) != 0) continue;
    const std::optional<double> value = host::ValueOf(*param);
    if (!value || (!HasFlag(declared.disk_id) && !IsChanged(declared, *value))) continue;
    const bool percent = declared.kind == HX_PARAM_FLOAT_SLIDER && (declared.u.fs.display & 1) != 0;
    facts.push_back({declared.name, ValueText(declared, *value) + (percent ? " %" : "")});
  }
  return facts;
}

double PixelAspectOf(const media::ClipInfo& info) {
  return static_cast<double>(info.pixel_aspect.num) / static_cast<double>(info.pixel_aspect.den);
}

report::SolveFigures FiguresOf(host::SteadyClip& clip) {
  report::SolveFigures figures = report::FiguresOf(clip.Solved());
  if (clip.info().field_order != media::FieldOrder::progressive) figures.row = "field";
  return figures;
}

// Moments in even steps, pictures to be had.
std::vector<report::FilmFrame> Moments(const media::ClipInfo& info) {
  std::vector<report::FilmFrame> film;
  const std::size_t moments = std::min(kMoments, info.frame_count);
  for (std::size_t m = 0; m < moments; ++m) {
    report::FilmFrame moment;
    moment.frame = (2 * m + 1) * info.frame_count / (2 * moments);
    moment.seconds = static_cast<double>(moment.frame) * static_cast<double>(info.frame_rate.den) /
                     static_cast<double>(info.frame_rate.num);
    film.push_back(moment);
  }
  return film;
}

// Draws the whole clip, small: how much of each frame is left empty, percent, the pictures of the
// film's moments, and what the effect says of frames.
std::vector<double> Draw(host::SteadyClip& clip, int threads, ProgressLine& progress,
                         std::vector<report::FilmFrame>& film, std::vector<std::string>& said) {
  const media::ClipInfo& info = clip.info();
  const double aspect = PixelAspectOf(info);
  std::vector<double> empty;
  std::size_t next = 0;
  RenderSettings settings{.depth = 8, .threads = threads};
  settings.downsample = std::clamp(info.width / kPictureWidth, 1, kMostDownsampled);
  said = RenderFrames(clip, {0, info.frame_count}, settings, "drawing", progress,
                      [&](std::size_t frame, const DrawnFrame& drawn) {
                        empty.push_back(100 * EmptyShare(*drawn.pixels));
                        if (next < film.size() && frame == film[next].frame) {
                          film[next++].after =
                              report::DataUrlOf(ViewOf(*drawn.pixels), aspect, kPictureWidth);
                        }
                      });
  // From the source that has drawn the frames: another reader would search the file for them again.
  const host::SourcePtr source = clip.effect().shared()->layer()->state()->source;
  for (report::FilmFrame& moment : film) {
    const host::PicturePtr shot = source->Fetch(
        static_cast<std::int64_t>(clip.range().first + moment.frame), host::PixelKind::argb8);
    if (!shot) continue;
    moment.before = report::DataUrlOf(
        {shot->row<HX_Pixel8>(0), shot->row_bytes(), shot->width(), shot->height()}, aspect,
        kPictureWidth);
  }
  return empty;
}

// The film of saved work, or where its clip is gone a stand-in for it, and a line that says so.
std::unique_ptr<host::Film> OpenForReport(const std::string& path, Confinement confinement,
                                          std::string* gone) {
  host::Project project = host::LoadProject(path);
  std::string clip;
  try {
    clip = FindMovedClip(path, project);
  } catch (const host::ProjectFailure& failure) {
    *gone = failure.what();
    return std::make_unique<host::Film>(PluginPath(), project);
  }
  confinement.read.push_back(clip);
  confinement.Begin();
  return std::make_unique<host::Film>(PluginPath(), project, clip);
}

std::string NameOf(const std::string& path) {
  return fs::path(path).filename().string();
}

}  // namespace

ReportCommand::ReportCommand(CLI::App& program)
    : Command(AddCommand(
          program, "report",
          "Show saved work as a page\n\n"
          "What stabilize shows of it with the same flags of the window: what was chosen, of what, "
          "and why, the window's path, the camera path before and after, tracks, models, what is "
          "left empty, and a filmstrip, in one file for any browser. Where the clip is gone the "
          "page has all but the "
          "filmstrip. Work is saved by stabilize and analyze with --project.",
          "Examples:\n"
          "  calmframe report shaky.calm report.html")) {
  AddFile(parser_, "PROJECT", project_, "The saved work");
  AddFile(parser_, "OUT", output_, "The page to write, .html");
  AddShotFlag(parser_, shot_);
  AddWindowFlags(parser_, window_);
  PutInGroup("Output",
             {AddSwitch(parser_, "--overwrite", overwrite_, "Replace OUT where it exists")});
  AddRunFlags(parser_, run_);
}

void ReportCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  media::OutputFile file(output_, project_, overwrite_);
  std::string gone;
  const std::unique_ptr<host::Film> film =
      OpenForReport(project_, {.written = {output_, project_}}, &gone);
  host::SteadyClip* const clip = &SavedShotOf(*film, project_, shot_);
  KeepApart(output_, {clip->path()});
  const media::ClipInfo& info = clip->info();
  const double rate =
      static_cast<double>(info.frame_rate.num) / static_cast<double>(info.frame_rate.den);

  report::Page page;
  page.title = NameOf(clip->path());
  page.facts = {
      {"Clip", std::to_string(info.width) + " x " + std::to_string(info.height) + ", " +
                   report::Short(rate, 3) + " frames a second" +
                   (info.field_order == media::FieldOrder::progressive ? "" : ", interlaced")},
      {"Length", std::to_string(info.frame_count) +
                     (info.frame_count == 1 ? " frame, " : " frames, ") +
                     report::Short(static_cast<double>(info.frame_count) / rate, 2) + " s" +
                     (info.cut ? ", from " + TimeText(clip->whole(), clip->range().first) : "")}};
  if (film->Saved().shots.size() > 1) {
    page.facts[1].name =
        "Shot " + std::to_string(shot_) + " of " + std::to_string(film->Saved().shots.size());
    const auto time = [&film](std::int32_t frame) {
      return TimeText(film->whole(), static_cast<std::size_t>(std::max(frame, 0)));
    };
    report::AddShots(film->Saved().shots, film->number(), time, page);
  }
  const auto note = [&](const std::string& line) {
    if (line.empty()) return;
    progress.Warn(line);
    page.notes.push_back(line);
  };
  if (!gone.empty()) note(gone + "; the page has no pictures");
  note(info.warning);

  {
    const report::SolveLog solve_log;
    const bool saved = clip->Work(progress).solve;
    const host::CropTrouble trouble = Choose(*clip, window_, progress);
    const bool nothing_seen = trouble.kind == host::CropTrouble::Kind::nothing_seen;
    note(TroubleText(trouble, *clip));
    const host::Choice* const choice = clip->choice();
    report::SolveFigures figures = FiguresOf(*clip);
    host::ShownPath path;
    if (choice) {
      path = clip->Path();
      figures.before = host::MotionsOf(path.source);
      figures.after = host::MotionsOf(path.output);
      figures.window.clear();  // the effect's own, which is not shown
      report::AddChoice(*choice, page);
    } else {
      const std::string crop = clip->CropText();
      page.lead = nothing_seen   ? "Not steadied: nothing stays in view"
                  : crop.empty() ? "Steadied, the whole frame kept"
                                 : "Steadied: " + crop;
      if (!nothing_seen && !crop.empty()) {
        page.shown.words = {"The effect's own crop window: " + clip->Measure().Text() + "."};
      }
    }
    page.controls = ControlsOf(*clip);
    const std::size_t rows = std::max<std::size_t>(figures.tracked.size(), 1);
    page.seconds_a_value = static_cast<double>(info.frame_count) / rate / static_cast<double>(rows);
    std::vector<report::FilmFrame> moments = Moments(info);
    std::vector<std::string> said;
    const std::vector<double> empty = Draw(*clip, run_.threads, progress, moments, said);
    for (const std::string& line : said) {
      if (!nothing_seen) note(line);
    }
    if (gone.empty()) page.film = std::move(moments);
    // Saved work doesn't keep how the models were chosen: a solve of the same tells it again. It
    // comes last, since tracks are saved in steps of 1/32 pixel, which moves its warps a little.
    std::vector<double> scores;
    if (!choice || (choice->best().follows && choice->best().outcome.bends)) {
      if (saved || choice) clip->SolveAnew(progress);
      scores = solve_log.Scores(rows);
    }
    report::AddCameraPath(figures, page);
    if (choice) {
      const host::Outcome& outcome = choice->best().outcome;
      report::NoteWhatIsLeft(outcome.before.mean, outcome.after.mean, host::ChoiceWeights().seen,
                             figures, page);
      report::AddWindows(path, page);
    } else {
      report::AddShake(figures, page);
    }
    report::AddSolve(figures, scores, page);
    report::AddEmptyShares(empty, rows, page);
    if (rows < 2) page.plots.clear();  // of points nothing can be read
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
