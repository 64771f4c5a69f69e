#include "apps/calmframe/analyze_command.h"

#include <cstdio>
#include <memory>
#include <nlohmann/json.hpp>
#include <vector>

#include "apps/calmframe/confinement.h"
#include "apps/calmframe/film_work.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/base/shown_text.h"
#include "host/stabilize/framing.h"
#include "host/stabilize/steady_clip.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

struct Analysed {
  media::FrameRange range;
  std::unique_ptr<host::CropWindow> crop;
  std::string text;
};

}  // namespace

AnalyzeCommand::AnalyzeCommand(CLI::App& program)
    : Command(AddCommand(
          program, "analyze",
          "Analyse and solve a clip, without rendering it\n\n"
          "Prints the effect's own crop window and how far it is enlarged. What follows the "
          "picture "
          "in its place is found by stabilize, and shown by report. With --project, these and "
          "render go on from there.\n\n"
          "A long film can be shared by several machines: each analyses some of its shots with "
          "--from, --to and --choose, gather makes one project of theirs, each draws some frames "
          "with render --segment, and join makes one file of them.",
          "Examples:\n"
          "  calmframe analyze shaky.mp4\n"
          "  calmframe analyze shaky.mp4 --project shaky.calm --smoothness 20\n"
          "  calmframe analyze hike.mp4 --choose --to 0:02 --project early.calm\n"
          "  calmframe analyze hike.mp4 --choose --from 0:02 --project late.calm")) {
  AddFile(parser_, "IN", input_,
          "The shaky clip; - for a pipe, f%04d.png, a quoted glob or a folder for pictures");
  AddControlFlags(parser_, controls_);
  AddStretchFlags(parser_, stretch_, BareNumber::seconds);
  AddShotsFlag(parser_, shots_);
  AddWindowFlags(parser_, window_);
  PutInGroup("Window",
             {AddSwitch(parser_, "--choose", chooses_,
                        "Choose as stabilize does, and leave that in the project, too; a stretch "
                        "that can't be solved is left to be drawn as it was filmed")});
  AddProjectFlag(parser_, project_);
  AddRunFlags(parser_, run_);
}

void AnalyzeCommand::Run() {
  Confinement{.read = {input_}, .written = {project_}}.Begin();
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  RunOnPromises([&](host::Opening opening) { Analyze(opening, progress); });
}

void AnalyzeCommand::Analyze(host::Opening opening, ProgressLine& progress) const {
  const std::unique_ptr<host::Film> film = TakeUp(input_, project_, opening, stretch_, shots_);
  const media::ClipInfo info = film->info();
  if (!info.warning.empty()) progress.Warn(info.warning);
  WorkFile file(project_);
  std::vector<Analysed> shots;
  while (host::SteadyClip* const shot = NextShot(*film, controls_)) {
    progress.OfShot(film->number() > 0 ? film->number() + 1 : 0);
    bool follows = true;
    if (chooses_) {
      const bool is_all = film->is_one_shot() && film->range().size() == film->whole().frame_count;
      if (!WorkOrLeaveAsFilmed(*film, *shot, is_all, file, window_, progress)) {
        shots.push_back({shot->range(), nullptr, ""});
        continue;
      }
    } else {
      WorkAndLeave(*film, *shot, file, progress);
      // The effect's own window is no trouble where it isn't what is shown.
      follows = host::Follows(*shot, {});
      if (!follows) TellTrouble(host::CropTroubleOf(*shot), *shot, progress);
    }
    shots.push_back({shot->range(), shot->Crop(),
                     shot->CropText() + (follows ? ", with --window steady" : "")});
  }
  progress.OfShot(0);
  if (run_.json) {
    nlohmann::ordered_json json;
    json["clip"] = input_;
    json["width"] = info.width;
    json["height"] = info.height;
    json["frames"] = info.frame_count;
    nlohmann::ordered_json list = nlohmann::ordered_json::array();
    for (const Analysed& shot : shots) {
      nlohmann::ordered_json told;
      told["first_frame"] = shot.range.first;
      told["end_frame"] = shot.range.end;
      nlohmann::ordered_json& crop_of = shots.size() == 1 ? json : told;
      if (shot.crop) {
        crop_of["crop_width"] = shot.crop->width;
        crop_of["crop_height"] = shot.crop->height;
      }
      list.push_back(told);
    }
    if (shots.size() > 1) json["shots"] = list;
    std::printf("%s\n", JsonLine(json).c_str());
    return file.Throw();
  }
  std::printf("%s: %zu %s of %dx%d\n", Shown(input_).c_str(), info.frame_count,
              info.frame_count == 1 ? "frame" : "frames", info.width, info.height);
  for (std::size_t s = 0; s < shots.size(); ++s) {
    if (shots.size() > 1) {
      std::printf("shot %zu, %s to %s%s", s + 1,
                  TimeText(film->whole(), shots[s].range.first).c_str(),
                  TimeText(film->whole(), shots[s].range.end).c_str(), shots[s].crop ? ": " : "\n");
    }
    if (shots[s].crop) std::printf("%s\n", shots[s].text.c_str());
  }
  file.Throw();
}

}  // namespace calmframe
