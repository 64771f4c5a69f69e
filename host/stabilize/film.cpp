#include "host/stabilize/film.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <utility>

#include "host/stabilize/choice.h"
#include "host/stabilize/failures.h"

namespace calmframe::host {
namespace {

ShotBorder CutAt(std::int64_t frame) {
  ShotBorder border;
  border.frame = border.first = border.last = frame;
  return border;
}

// What was worked of a saved clip; a layer may reach beyond it.
media::FrameRange RangeOf(const Project& project, const media::ClipInfo& clip) {
  const auto count = static_cast<std::int64_t>(clip.frame_count);
  const std::int64_t first =
      std::clamp<std::int64_t>(project.shots.front().start_frame, 0, count - 1);
  const std::int64_t end = std::clamp<std::int64_t>(project.end_frame, first + 1, count);
  return {static_cast<std::size_t>(first), static_cast<std::size_t>(end)};
}

// The frames behind the first one at which shots begin.
std::vector<std::int64_t> StartsOf(const Project& project) {
  std::vector<std::int64_t> starts;
  for (std::size_t s = 1; s < project.shots.size(); ++s) {
    starts.push_back(project.shots[s].start_frame);
  }
  return starts;
}

std::int64_t EndOf(const SavedShot& shot) {
  return std::int64_t{shot.start_frame} + shot.length;
}

// The same as a request has them; none where they are to be found.
std::optional<std::vector<std::int64_t>> StartsAsked(const ShotRequest& request,
                                                     const media::ClipInfo& clip,
                                                     const media::FrameRange& range) {
  if (request.kind == ShotRequest::Kind::automatic) return {};
  std::vector<std::int64_t> starts;
  if (request.kind == ShotRequest::Kind::list) starts = request.list(clip);
  std::erase_if(starts, [&range](std::int64_t frame) {
    return frame <= static_cast<std::int64_t>(range.first) ||
           frame >= static_cast<std::int64_t>(range.end);
  });
  return starts;
}

// Whether the saved shots are the first of these.
bool Begins(const Project& project, const std::vector<std::int64_t>& starts) {
  const std::vector<std::int64_t> worked = StartsOf(project);
  if (worked.size() > starts.size() || !std::equal(worked.begin(), worked.end(), starts.begin())) {
    return false;
  }
  const std::int64_t next =
      worked.size() < starts.size() ? starts[worked.size()] : std::int64_t{project.end_frame};
  return EndOf(project.shots.back()) == next;
}

// The controls that somebody gave the saved shot, without what was chosen beside them.
ParamValues GivenOf(const SavedShot& shot) {
  ParamValues given = shot.effect.values;
  if (const std::optional<Choice> choice = Choice::Parse(shot.choice)) {
    for (const auto& [disk_id, value] : choice->given) given[disk_id] = value;
  }
  return given;
}

}  // namespace

std::vector<ShotBorder> FindShots(const ClipMedium& medium, const media::FrameRange& range,
                                  Watcher& watcher) {
  ShotSource source(medium.source, range, {});
  Progress shown{.stage = "looking", .total = static_cast<double>(range.size()), .unit = "frames"};
  for (std::size_t frame = range.first; frame < range.end; ++frame) {
    if (watcher.Stops()) throw Interrupted();
    shown.done = static_cast<double>(frame - range.first);
    watcher.Show(shown);
    try {
      source.Fetch(static_cast<std::int64_t>(frame), PixelKind::argb8);
    } catch (const std::runtime_error& error) {
      if (medium.found && medium.found->standing() == media::Standing::broken) {
        throw BrokenPromise();
      }
      if (dynamic_cast<const media::Failure*>(&error)) throw;
      throw media::Failure(media::Failure::Side::input, error.what());
    }
  }
  // Decoding may have come upon more frames than were promised.
  if (medium.found && medium.found->standing() != media::Standing::decoded) throw BrokenPromise();
  shown.done = shown.total;
  shown.ends = true;
  watcher.Show(shown);
  return source.borders();
}

std::vector<std::size_t> ShotStarts(const ClipMedium& medium, const ShotRequest& request,
                                    Watcher& watcher) {
  const media::FrameRange all{0, medium.info.frame_count};
  std::vector<std::size_t> starts = {0};
  if (const auto asked = StartsAsked(request, medium.info, all)) {
    starts.insert(starts.end(), asked->begin(), asked->end());
    return starts;
  }
  for (const ShotBorder& border : FindShots(medium, all, watcher)) {
    starts.push_back(static_cast<std::size_t>(border.frame));
  }
  return starts;
}

Film::Film(const std::string& plugin, const std::string& path, Opening opening,
           const media::ClipReader::Part& part, const ShotRequest& request)
    : Film(plugin, OpenMedium(path, opening, part), part, request) {}

Film::Film(const std::string& plugin, const Project& project, const std::string& path,
           const ShotRequest& request)
    : Film(plugin, MediumOf(media::ClipReader::Open(path, project.clip_frames)), project, request) {
}

Film::Film(const std::string& plugin, const Project& project)
    : Film(plugin, StandInFor(project), project, {}) {}

Film::Film(const std::string& plugin, const ClipMedium& medium, const media::ClipReader::Part& part,
           const ShotRequest& request)
    : Film(plugin, medium, part ? part(medium.info) : media::FrameRange{0, medium.info.frame_count},
           nullptr, request) {}

Film::Film(const std::string& plugin, const ClipMedium& medium, const ShotRequest& request)
    : Film(plugin, medium, media::ClipReader::Part(), request) {}

Film::Film(const std::string& plugin, const ClipMedium& medium, const Project& project,
           const ShotRequest& request)
    : Film(plugin, medium, RangeOf(project, medium.info), &project, request) {}

Film::Film(const std::string& plugin, const ClipMedium& medium, const media::FrameRange& range,
           const Project* project, const ShotRequest& request)
    : plugin_(plugin), medium_(medium), range_(range) {
  medium_.end = range_.end;
  saved_.shots.clear();
  std::optional<std::vector<std::int64_t>> starts = StartsAsked(request, medium_.info, range_);
  std::size_t looks_from = range_.first;
  if (project) {
    if (!starts || Begins(*project, *starts)) {
      saved_ = *project;
      const std::int64_t end = EndOf(project->shots.back());
      looks_from = static_cast<std::size_t>(std::clamp(end, static_cast<std::int64_t>(range_.first),
                                                       static_cast<std::int64_t>(range_.end)));
      if (!starts && looks_from == range_.end) starts = StartsOf(*project);
    }
    given_ = GivenOf(project->shots.front());
  }
  std::optional<std::vector<ShotBorder>> borders;
  if (starts) {
    borders.emplace();
    for (const std::int64_t frame : *starts) borders->push_back(CutAt(frame));
  }
  medium_.source = boost::make_shared<ShotSource>(
      medium_.source, media::FrameRange{looks_from, range_.end}, std::move(borders));
  next_ = range_.first;
}

SteadyClip* Film::Next() {
  if (shot_) {
    next_ = shot_->range().end;
    ++number_;
    shot_.reset();  // ahead of the next: a film takes the memory of one shot
  }
  if (next_ >= range_.end) return nullptr;
  if (number_ < saved_.shots.size()) return Open(number_);
  const std::size_t first = next_;
  const std::int64_t end = std::min(medium_.source->EndOfShot(static_cast<std::int64_t>(first)),
                                    static_cast<std::int64_t>(range_.end));
  shot_ = std::make_unique<SteadyClip>(plugin_, medium_,
                                       media::FrameRange{first, static_cast<std::size_t>(end)});
  shot_->TakeControls(given_);
  return shot_.get();
}

SteadyClip* Film::Open(std::size_t number) {
  shot_.reset();
  number_ = number;
  shot_ = std::make_unique<SteadyClip>(plugin_, medium_, saved_, number_);
  return shot_.get();
}

bool Film::is_one_shot() const {
  return number_ == 0 && shot_ && shot_->range().end >= range_.end;
}

void Film::Keep() {
  const auto state = shot_->effect().shared()->layer()->state();
  saved_.clip_path = medium_.info.path;
  saved_.clip_content = state->source->info().content;
  if (medium_.found && !has_frames_) {
    saved_.clip_frames = medium_.found->Bytes();
    has_frames_ = medium_.found->standing() == media::Standing::decoded;
  }
  saved_.width = medium_.info.width;
  saved_.height = medium_.info.height;
  saved_.pixel_aspect = state->source->info().pixel_aspect;
  saved_.ticks_per_frame = state->ticks_per_frame;
  saved_.field_type = state->field_type;
  saved_.end_frame = std::max(saved_.end_frame, static_cast<std::int32_t>(range_.end));
  if (number_ >= saved_.shots.size()) saved_.shots.resize(number_ + 1);
  saved_.shots[number_] = shot_->Saved();
}

}  // namespace calmframe::host
