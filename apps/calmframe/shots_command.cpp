#include "apps/calmframe/shots_command.h"

#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <vector>

#include "apps/calmframe/confinement.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "host/shots/shot_list.h"
#include "host/stabilize/film.h"

namespace calmframe {
namespace {

const char* NameOf(host::ShotBorder::Kind kind) {
  using Kind = host::ShotBorder::Kind;
  return kind == Kind::cut ? "cut" : kind == Kind::dissolve ? "dissolve" : "fade";
}

std::vector<host::ListedShot> Listed(const std::vector<host::ShotBorder>& borders,
                                     const media::FrameRange& range, const media::ClipInfo& clip) {
  std::vector<host::ListedShot> shots;
  const auto begin = [&](std::int64_t frame, const char* how) {
    const double at = SecondsAt(clip, static_cast<std::size_t>(frame));
    if (!shots.empty()) {
      shots.back().end = frame;
      shots.back().ends = at;
    }
    shots.push_back({frame, 0, at, 0, how});
  };
  begin(static_cast<std::int64_t>(range.first), "start");
  for (const host::ShotBorder& border : borders) begin(border.frame, NameOf(border.kind));
  shots.back().end = static_cast<std::int64_t>(range.end);
  shots.back().ends = SecondsAt(clip, range.end);
  return shots;
}

}  // namespace

ShotsCommand::ShotsCommand(CLI::App& program)
    : Command(AddCommand(
          program, "shots",
          "List the shots of a film\n\n"
          "As stabilize finds them while it analyses: each with its frames, its times and how it "
          "begins, by a cut, a dissolve or a fade. The forms csv and edl are for editors, and what "
          "stabilize is to take in its own list's place goes to its --shots.",
          "Examples:\n"
          "  calmframe shots film.mp4\n"
          "  calmframe shots film.mp4 --form edl >film.edl")) {
  AddFile(parser_, "IN", input_,
          "The film; - for a pipe, f%04d.png, a quoted glob or a folder for pictures");
  AddStretchFlags(parser_, stretch_, BareNumber::seconds);
  CLI::Option* const form = AddChoice(
      parser_, "--form", [this](const std::string& name) { form_ = name; },
      {"text", "json", "csv", "edl"}, "How the list is written");
  TellDefault(*form, form_);
  PutInGroup("Output", {form});
  AddRunFlags(parser_, run_);
}

void ShotsCommand::Run() {
  Confinement{.read = {input_}}.Begin();
  ProgressLine progress(run_.progress_form());
  CheckOrder(stretch_);
  RunOnPromises([&](host::Opening opening) { List(opening, progress); });
}

void ShotsCommand::List(host::Opening opening, ProgressLine& progress) const {
  const host::ClipMedium medium = host::OpenMedium(input_, opening, PartFor(stretch_));
  const media::ClipInfo& clip = medium.info;
  if (!clip.warning.empty()) progress.Warn(clip.warning);
  const media::FrameRange range = FramesOf(stretch_, clip);
  const std::vector<host::ListedShot> shots =
      Listed(host::FindShots(medium, range, progress), range, clip);
  const host::ListedFilm film{std::filesystem::path(input_).filename(), clip.frame_rate.num,
                              clip.frame_rate.den};
  if (form_ == "csv" || form_ == "edl") {
    std::fputs((form_ == "csv" ? host::CsvOf(film, shots) : host::EdlOf(film, shots)).c_str(),
               stdout);
    return;
  }
  if (form_ == "json" || run_.json) {
    std::printf("%s\n", JsonLine(host::JsonOf(film, shots)).c_str());
    return;
  }
  for (std::size_t s = 0; s < shots.size(); ++s) {
    std::printf("%zu  %s to %s  frames %lld to %lld  %s\n", s + 1,
                TimeText(clip, static_cast<std::size_t>(shots[s].first)).c_str(),
                TimeText(clip, static_cast<std::size_t>(shots[s].end)).c_str(),
                static_cast<long long>(shots[s].first), static_cast<long long>(shots[s].end),
                shots[s].how.c_str());
  }
}

}  // namespace calmframe
