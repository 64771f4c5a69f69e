#include "apps/calmframe/project_commands.h"

#include <cstdio>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/film_work.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "apps/calmframe/track_export.h"
#include "host/base/shown_text.h"
#include "host/media/output_file.h"
#include "host/project/project_file.h"
#include "host/stabilize/choice.h"
#include "host/stabilize/steady_clip.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

std::int32_t EndOf(const host::SavedShot& shot) {
  return shot.start_frame + shot.length;
}

}  // namespace

RenderCommand::RenderCommand(CLI::App& program)
    : Command(AddCommand(
          program, "render",
          "Draw saved work, or a part of it\n\n"
          "With --from and --to a part, with its sound, to look at before the whole is drawn. They "
          "count in the clip, as for stabilize; but a whole number alone is a frame.",
          "Examples:\n"
          "  calmframe render --project shaky.calm steady.mp4\n"
          "  calmframe render --project shaky.calm look.mp4 --from 10 --to 20\n"
          "  calmframe render --project whole.calm early.mkv --to 60 --segment\n"
          "  calmframe render --project whole.calm late.mkv --from 60 --segment")) {
  AddFile(parser_, "OUT", output_,
          "The steady clip to write; - for a pipe: raw frames, or Matroska with --codec; "
          "f%04d.png or a folder with / for pictures");
  AddFile(parser_, "--project", project_, "The saved work");
  AddStretchFlags(parser_, stretch_, BareNumber::frame);
  AddOutputFlags(parser_, flags_);
  AddSideBySideFlag(parser_, flags_);
  PutInGroup("Output", {AddSwitch(parser_, "--segment", flags_.encode.video_alone,
                                  "The pictures alone, without sound and all else, for join")});
  AddRunFlags(parser_, run_);
}

void RenderCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  CheckOrder(stretch_);
  const std::unique_ptr<host::Film> film =
      OpenSaved(project_, {.written = {output_, flags_.side_by_side}});
  const media::FrameRange range = RangeOf(*film);
  KeepApart(output_, {project_, film->whole().path});
  const media::ClipInfo written = WrittenAs(media::PartOf(film->whole(), range), flags_);
  const std::unique_ptr<media::ClipWriter> writer =
      media::ClipWriter::Create(output_, written, written.width, written.height, flags_.encode);
  const std::unique_ptr<SideBySide> both =
      MakeSideBySide(flags_, written, output_, {project_, film->whole().path});
  TellLosses(*writer, both.get(), progress);
  SteadyFilm(*film, range, project_, {}, flags_, run_.threads, *writer, both.get(), progress);
}

media::FrameRange RenderCommand::RangeOf(const host::Film& film) const {
  if (!stretch_.is_given()) return film.range();
  media::FrameRange range = FramesOf(stretch_, film.whole());
  const media::FrameRange& worked = film.range();
  if (!stretch_.from) range.first = worked.first;
  if (!stretch_.to) range.end = worked.end;
  if (range.first >= range.end || !worked.Holds(range)) {
    throw UsageFailure(project_ + ": " + WorkedText(film) +
                       ", and --from and --to must lie within");
  }
  return range;
}

InfoCommand::InfoCommand(CLI::App& program)
    : Command(AddCommand(program, "info",
                         "Tell what saved work holds, and whether its clip is still the one",
                         "Examples:\n"
                         "  calmframe info shaky.calm")) {
  AddFile(parser_, "PROJECT", project_, "The saved work");
  AddSwitch(parser_, "--json", json_, "As a JSON object");
}

void InfoCommand::Run() {
  host::Project project = host::LoadProject(project_);
  std::string clip, trouble;
  try {
    clip = FindMovedClip(project_, project);
  } catch (const host::ProjectFailure& failure) {
    trouble = failure.what();
  }
  const double rate =
      static_cast<double>(HX_TICKS_PER_SECOND) / static_cast<double>(project.ticks_per_frame);
  const std::int32_t start = project.shots.front().start_frame;
  const std::int32_t frames = project.end_frame - start;
  const bool is_film = project.shots.size() > 1 || EndOf(project.shots.back()) < project.end_frame;
  std::size_t bytes = 0;
  for (const host::SavedShot& shot : project.shots) bytes += shot.effect.instance.size();
  if (json_) {
    nlohmann::ordered_json json;
    json["clip"] = clip.empty() ? project.clip_path : clip;
    json["fits"] = trouble.empty();
    if (!trouble.empty()) json["trouble"] = trouble;
    json["width"] = project.width;
    json["height"] = project.height;
    json["start_frame"] = start;
    json["frames"] = frames;
    json["rate"] = rate;
    json["instance_bytes"] = bytes;
    nlohmann::ordered_json list = nlohmann::ordered_json::array();
    for (const host::SavedShot& shot : project.shots) {
      nlohmann::ordered_json told;
      told["first_frame"] = shot.start_frame;
      told["end_frame"] = EndOf(shot);
      const auto choice = host::Choice::Parse(shot.choice);
      if (choice) (is_film ? told : json)["choice"] = choice->Json();
      list.push_back(told);
    }
    if (is_film) json["shots"] = list;
    std::printf("%s\n", JsonLine(json).c_str());
    return;
  }
  std::printf("%s: %d frames of %dx%d from %d, %.6g a second, %zu bytes of results\n",
              Shown(clip.empty() ? project.clip_path : clip).c_str(), frames, project.width,
              project.height, start, rate, bytes);
  for (const host::SavedShot& shot : project.shots) {
    const auto choice = host::Choice::Parse(shot.choice);
    if (is_film) {
      std::printf("frames %d to %d%s", shot.start_frame, EndOf(shot), choice ? ": " : "\n");
    }
    if (choice) {
      std::printf("%s\n", Shown(choice->Text() + ": " + choice->best().outcome.Text()).c_str());
    }
  }
  if (EndOf(project.shots.back()) < project.end_frame) {
    std::printf("stopped there, %d frames before the end\n",
                project.end_frame - EndOf(project.shots.back()));
  }
  std::printf("%s\n",
              trouble.empty() ? "the clip is the one that was analysed" : Shown(trouble).c_str());
}

TracksCommand::TracksCommand(CLI::App& program)
    : Command(AddCommand(program, "tracks", "Write the tracks of saved work to a file",
                         "Examples:\n"
                         "  calmframe tracks shaky.calm shaky.trk")) {
  AddFile(parser_, "PROJECT", project_, "The saved work");
  AddFile(parser_, "OUT", output_, "The track file, .trk");
  AddShotFlag(parser_, shot_);
  AddSwitch(parser_, "--overwrite", overwrite_, "Replace OUT where it exists");
  AddSandboxFlag(parser_);
}

void TracksCommand::Run() {
  media::OutputFile file(output_, project_, overwrite_);
  const std::unique_ptr<host::Film> film = OpenSaved(project_, {.written = {output_}});
  KeepApart(output_, {film->whole().path});
  SaveTracks(SavedShotOf(*film, project_, shot_), project_, file.temporary(), output_);
  file.Commit();
}

}  // namespace calmframe
