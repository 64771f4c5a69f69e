#include "host/project/project_join.h"

#include <algorithm>
#include <cstdint>
#include <iterator>

#include "host/media/frame_list.h"

namespace calmframe::host {
namespace {

std::int32_t FirstOf(const Project& project) {
  return project.shots.front().start_frame;
}

bool IsOfOneClip(const Project& a, const Project& b) {
  return a.clip_content == b.clip_content && a.width == b.width && a.height == b.height &&
         a.pixel_aspect.num == b.pixel_aspect.num && a.pixel_aspect.den == b.pixel_aspect.den &&
         a.ticks_per_frame == b.ticks_per_frame && a.field_type == b.field_type;
}

}  // namespace

Project JoinProjects(std::vector<NamedProject> parts) {
  std::sort(parts.begin(), parts.end(), [](const NamedProject& a, const NamedProject& b) {
    return FirstOf(a.project) < FirstOf(b.project);
  });
  Project whole = parts.at(0).project;
  whole.shots.clear();
  std::vector<std::vector<std::uint8_t>> found;
  std::int32_t end = FirstOf(parts[0].project);
  for (NamedProject& part : parts) {
    const Project& project = part.project;
    if (!IsOfOneClip(project, parts[0].project)) {
      throw ProjectFailure(part.name + ": is of another clip than " + parts[0].name);
    }
    if (FirstOf(project) != end) {
      throw ProjectFailure(part.name + ": begins at frame " + std::to_string(FirstOf(project)) +
                           ", and what is before it ends at " + std::to_string(end));
    }
    end = project.end_frame;
    const SavedShot& last = project.shots.back();
    if (last.start_frame + last.length != end) {
      throw ProjectFailure(part.name + ": was stopped at frame " +
                           std::to_string(last.start_frame + last.length) + " of " +
                           std::to_string(end));
    }
    found.push_back(project.clip_frames);
    whole.shots.insert(whole.shots.end(), std::make_move_iterator(part.project.shots.begin()),
                       std::make_move_iterator(part.project.shots.end()));
    part.project.shots.resize(1);
  }
  whole.end_frame = end;
  whole.clip_frames = media::JoinFound(found);
  return whole;
}

}  // namespace calmframe::host
