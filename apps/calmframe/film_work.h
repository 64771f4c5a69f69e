#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "apps/calmframe/controls.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/stabilize/film.h"

namespace calmframe {

// Adds --shots.
void AddShotsFlag(CLI::App& command, host::ShotRequest& shots);

// Adds --shot, of one of saved work's, counted from 1.
void AddShotFlag(CLI::App& command, int& shot);
// Opens that one. Throws UsageFailure where there is none.
host::SteadyClip& SavedShotOf(host::Film& film, const std::string& project, int shot);

// Works and frames the film's open shot, and leaves it in the project, as WorkAndLeave does. One
// that can't be solved stays as it was filmed, with a warning; then false. Not so where it `is_all`
// there is: throws SolveFailure. Throws as SteadyFilm.
bool WorkOrLeaveAsFilmed(host::Film& film, host::SteadyClip& shot, bool is_all, WorkFile& file,
                         const host::WindowSettings& window, ProgressLine& progress);

// What a film's shots show, told behind all else that a run says.
class FilmOutcome {
 public:
  explicit FilmOutcome(const host::Film& film) : film_(film) {}
  // Of the film's open shot, after it was framed.
  void Add(host::SteadyClip& shot);
  // Of the film's shot of that number, from 0. choice: null where nothing was to choose.
  void Add(std::size_t number, const media::FrameRange& range, const host::Outcome& outcome,
           const host::Choice* choice);
  void Tell(ProgressLine& progress) const;

 private:
  struct Told {
    std::size_t number = 0;  // of the shot, from 1
    media::FrameRange range;
    host::ShotOutcome outcome;
    std::string line;
    nlohmann::ordered_json object;
  };
  const host::Film& film_;
  std::vector<Told> shots_;
};

// The same of a film whose shots are saved with what was chosen for them; those without are left
// out.
void TellSavedOutcome(const host::Film& film, ProgressLine& progress);

// Works, frames and draws the film shot by shot, those that have frames of `part`, which is of the
// whole clip and goes to the writers. `project`: where the work is left; empty for none. Throws
// SolveFailure, media::Failure, UsageFailure, Interrupted, BrokenPromise.
void SteadyFilm(host::Film& film, const media::FrameRange& part, const std::string& project,
                const ControlFlags& controls, const OutputFlags& flags, int threads,
                media::ClipWriter& writer, SideBySide* both, ProgressLine& progress);

}  // namespace calmframe
