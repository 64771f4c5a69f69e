#include "apps/calmframe/film_work.h"

#include <algorithm>
#include <nlohmann/json.hpp>
#include <optional>
#include <sstream>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "apps/calmframe/thumbnails.h"
#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"

namespace calmframe {
namespace {

media::FrameRange Common(const media::FrameRange& a, const media::FrameRange& b) {
  const media::FrameRange both{std::max(a.first, b.first), std::min(a.end, b.end)};
  return both.first < both.end ? both : media::FrameRange{both.first, both.first};
}

std::vector<std::string> Listed(const std::string& text) {
  std::vector<std::string> items;
  std::stringstream stream(text);
  for (std::string item; std::getline(stream, item, ',');) items.push_back(item);
  return items;
}

}  // namespace

void AddShotsFlag(CLI::App& command, host::ShotRequest& shots) {
  using Kind = host::ShotRequest::Kind;
  const auto take = [&shots](const std::string& text) {
    shots = {.kind = text == "one" ? Kind::one : text == "auto" ? Kind::automatic : Kind::list};
    if (shots.kind != Kind::list) return;
    shots.list = [moments = Listed(text)](const media::ClipInfo& clip) {
      std::vector<std::int64_t> frames;
      for (const std::string& moment : moments) {
        const std::size_t frame = FrameAt(*MomentOf(moment, BareNumber::seconds), clip);
        if (frame >= clip.frame_count) {
          throw UsageFailure("--shots " + moment + " lies behind the last frame: the clip has " +
                             std::to_string(clip.frame_count) + " frames and ends at " +
                             TimeText(clip, clip.frame_count));
        }
        frames.push_back(static_cast<std::int64_t>(frame));
      }
      std::sort(frames.begin(), frames.end());
      frames.erase(std::unique(frames.begin(), frames.end()), frames.end());
      return frames;
    };
  };
  const auto check = [](const std::string& text) -> std::string {
    if (text == "auto" || text == "one") return "";
    const std::vector<std::string> moments = Listed(text);
    for (const std::string& moment : moments) {
      if (const std::string trouble = MomentTrouble(moment, BareNumber::seconds);
          !trouble.empty()) {
        return trouble;
      }
    }
    return moments.empty() ? "auto, one, or where shots begin, such as 0:12.4,0:15" : "";
  };
  CLI::Option* const option =
      command
          .add_option_function<std::string>(
              "--shots", take,
              "The shots that are steadied each by itself: auto, as cuts and dissolves are found "
              "in "
              "the frames; one, for the whole; or where shots begin, times and frames as for "
              "--from with commas between, such as 0:12.4,0:15 or 300f,375f")
          ->check(check)
          ->take_last()
          ->type_name("auto|one|LIST");
  TellDefault(*option, "auto");
  PutInGroup("Stretch", {option});
}

void AddShotFlag(CLI::App& command, int& shot) {
  TellDefault(*AddNumber<int>(
                  command, "--shot", [&shot](int number) { shot = number; }, "N", 1, 1000000,
                  "Which shot of a film"),
              std::to_string(shot));
}

host::SteadyClip& SavedShotOf(host::Film& film, const std::string& project, int shot) {
  const std::size_t shots = film.Saved().shots.size();
  if (static_cast<std::size_t>(shot) > shots) {
    throw UsageFailure(project + ": has " + std::to_string(shots) +
                       (shots == 1 ? " shot" : " shots"));
  }
  return *film.Open(static_cast<std::size_t>(shot) - 1);
}

bool WorkOrLeaveAsFilmed(host::Film& film, host::SteadyClip& shot, bool is_all, WorkFile& file,
                         const host::WindowSettings& window, ProgressLine& progress) {
  const auto work = [&] {
    WorkAndLeave(film, shot, file, progress);
    Frame(shot, window, progress);
    if (shot.has_new_choice()) file.Leave(film);
  };
  try {
    work();
  } catch (const SolveFailure& failure) {
    if (is_all) throw;
    progress.Warn(std::string(failure.what()) + "; the shot stays as it was filmed");
    shot.ShowAsFilmed(progress);
    file.Leave(film);  // as it is, so that those behind it keep their places
    return false;
  }
  return true;
}

void FilmOutcome::Add(host::SteadyClip& shot) {
  // That leaves what it leaves.
  if (shot.ValueOf(HX_FRAMING.disk_id) == host::kStabilizeOnly) return;
  Add(film_.number(), shot.range(), shot.Measure(), shot.choice());
}

void FilmOutcome::Add(std::size_t number, const media::FrameRange& range,
                      const host::Outcome& outcome, const host::Choice* choice) {
  Told told{.number = number + 1,
            .range = range,
            .outcome = {.outcome = outcome,
                        .begins = SecondsAt(film_.whole(), range.first) -
                                  SecondsAt(film_.whole(), film_.range().first),
                        .frames = range.size()},
            .line = outcome.Text(),
            .object = outcome.Json()};
  if (choice) {
    told.object["choice"] = choice->Json();
    told.line += "; " + choice->Text();
  }
  shots_.push_back(std::move(told));
}

void FilmOutcome::Tell(ProgressLine& progress) const {
  std::vector<host::ShotOutcome> outcomes;
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  for (std::size_t s = 0; s < shots_.size(); ++s) {
    const Told& told = shots_[s];
    outcomes.push_back(told.outcome);
    nlohmann::ordered_json object;
    object["first_frame"] = told.range.first;
    object["end_frame"] = told.range.end;
    object.update(told.object);
    list.push_back(object);
    if (shots_.size() < 2) continue;
    progress.OfShot(told.number);
    progress.Note(TimeText(film_.whole(), told.range.first) + " to " +
                  TimeText(film_.whole(), told.range.end) + ", " + told.line);
  }
  progress.OfShot(0);
  if (outcomes.empty()) return;
  if (shots_.size() == 1) return progress.End(shots_[0].line, shots_[0].object);
  const host::Outcome film = host::OutcomeOf(outcomes);
  nlohmann::ordered_json object = film.Json();
  object["shots"] = list;
  progress.End(std::to_string(shots_.size()) + " shots: " + film.Text(), object);
}

void TellSavedOutcome(const host::Film& film, ProgressLine& progress) {
  FilmOutcome outcome(film);
  const std::vector<host::SavedShot>& shots = film.Saved().shots;
  for (std::size_t s = 0; s < shots.size(); ++s) {
    const std::optional<host::Choice> choice = host::Choice::Parse(shots[s].choice);
    if (!choice) continue;
    const auto first = static_cast<std::size_t>(shots[s].start_frame);
    outcome.Add(s, {first, first + static_cast<std::size_t>(shots[s].length)},
                choice->best().outcome, &*choice);
  }
  outcome.Tell(progress);
}

void SteadyFilm(host::Film& film, const media::FrameRange& part, const std::string& project,
                const ControlFlags& controls, const OutputFlags& flags, int threads,
                media::ClipWriter& writer, SideBySide* both, ProgressLine& progress) {
  FilmOutcome outcome(film);
  std::optional<std::size_t> thumbnail;
  if (flags.thumbnails) thumbnail = ThumbnailFrame(part.size());
  WorkFile file(project);
  std::size_t drawn = 0;
  while (host::SteadyClip* const shot = NextShot(film, controls)) {
    // A shot that is still to be found ends nobody knows where.
    const bool is_known = film.number() < film.Saved().shots.size();
    if (shot->range().first >= part.end) break;
    if (is_known && Common(part, shot->range()).size() == 0) continue;
    progress.OfShot(film.number() > 0 ? film.number() + 1 : 0);
    const bool steadied =
        WorkOrLeaveAsFilmed(film, *shot, film.is_one_shot(), file, flags.window, progress);
    const media::FrameRange frames = Common(part, shot->range());
    if (frames.size() == 0) continue;
    const std::size_t first = shot->range().first;
    RenderClip(*shot, {frames.first - first, frames.end - first}, SettingsOf(flags, threads), drawn,
               frames.end == part.end, thumbnail, writer, both, progress);
    drawn += frames.size();
    if (steadied) outcome.Add(*shot);
  }
  outcome.Tell(progress);
  file.Throw();
  if (both) both->Throw();
}

}  // namespace calmframe
