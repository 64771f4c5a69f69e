#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "apps/calmframe/confinement.h"
#include "apps/calmframe/controls.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/stretch.h"
#include "host/stabilize/film.h"
#include "host/stabilize/steady_clip.h"

namespace calmframe {

void AddProjectFlag(CLI::App& command, std::string& project);

// The clip or the stretch of it, with the work that the project keeps of it if there is such a
// file; such a clip may not be read in order, so nothing is taken for promised. Throws
// media::Failure when the work is of another clip, UsageFailure when it is of another stretch; one
// that is not given is that of the work.
std::unique_ptr<host::Film> TakeUp(const std::string& clip, const std::string& project,
                                   host::Opening opening, const Stretch& stretch,
                                   const host::ShotRequest& shots);

// The film's next shot, with these controls.
host::SteadyClip* NextShot(host::Film& film, const ControlFlags& controls);

// Calls run(opening): by what the clip's container promises, which spares decoding it once more
// than its analysis does, and where the frames break that from the start once more.
template <class Run>
void RunOnPromises(const Run& run) {
  try {
    return run(host::Opening::promised);
  } catch (const BrokenPromise&) {
  }
  run(host::Opening::decoded);
}

// "holds work from 0:10 to 0:25 of the clip, frames 300 to 750", the end left out.
std::string WorkedText(const host::Film& film);

// Where the clip of saved work lies, which the work's file knows from now on. Throws as
// host::FindClip.
std::string FindMovedClip(const std::string& path, host::Project& project);

// The clip of saved work, found by its name or beside it, opened as the process reaches these two
// and what else `confinement` has from now on. Throws media::Failure, host::ProjectFailure.
std::unique_ptr<host::Film> OpenSaved(const std::string& project, Confinement confinement);

// Nothing of the user's is written over by a result of it: throws media::Failure (output) where
// `output` is one of `inputs` under any name. Empty names stand for no file. `what` one of them is,
// in the message.
void KeepApart(const std::string& output, const std::vector<std::string>& inputs,
               const std::string& what = "an input");

// Where a run leaves its work. A save that fails is told at the end: the work is done all the same,
// and whoever asked for it gets its result first.
class WorkFile {
 public:
  // No project is an empty name; then nothing is saved.
  explicit WorkFile(const std::string& project);

  const std::string& project() const { return project_; }
  // Saves the film's work, that of the open shot with it.
  void Leave(host::Film& film);
  // Throws media::Failure where the last save failed.
  void Throw() const;

 private:
  const std::string project_;
  host::ProjectSaver saver_;
  std::string trouble_;
};

// Does what is left to do of a film's open shot, tells what was reused, and saves what is new.
void WorkAndLeave(host::Film& film, host::SteadyClip& shot, WorkFile& file, ProgressLine& progress);

}  // namespace calmframe
