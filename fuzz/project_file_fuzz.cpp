// Whatever stands in a file of saved work, it is refused with a line or read, and what was read can
// be saved again and is the same.

#include <cstdlib>
#include <optional>
#include <string>

#include "fuzz/saved_work.h"
#include "host/media/frame_list.h"
#include "host/project/project_join.h"
#include "host/project/project_keeper.h"
#include "host/stabilize/choice.h"

namespace {

using namespace calmframe;
using namespace calmframe::host;

// What is made of it where it is opened, short of the clip and the effect.
void LookInto(const Project& project) {
  for (const SavedShot& shot : project.shots) {
    if (const std::optional<Choice> choice = Choice::Parse(shot.choice)) {
      choice->Text();
      choice->Why();
    }
  }
  media::FrameListOf(project.clip_frames, "clip");
  try {
    JoinProjects({{"one", project}, {"two", project}});
  } catch (const ProjectFailure&) {
  }
  try {
    JoinProjects({{"one", project}});
  } catch (const ProjectFailure&) {
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  static const fuzz::ScratchFile file, copy;
  unlink(file.path().c_str());
  if (!fuzz::MakeSavedWork(input, file)) return 0;
  HoldsWork(file.path());
  ProjectKeeper(file.path(), 0).Find(0);
  constexpr std::size_t kMost = 1 << 20;
  try {
    const Project project = LoadProject(file.path(), kMost);
    LookInto(project);
    unlink(copy.path().c_str());
    SaveProject(copy.path(), project);
    const Project again = LoadProject(copy.path());
    if (again.clip_frames != project.clip_frames || again.shots.size() != project.shots.size() ||
        again.end_frame != project.end_frame ||
        again.shots.back().effect.instance != project.shots.back().effect.instance) {
      std::abort();
    }
    SaveProject(file.path(), project);
    ProjectKeeper(file.path(), 0, {}).Keep(0, data, size);
    LoadProject(file.path());
  } catch (const ProjectFailure&) {
  }
  return 0;
}
