#include "host/stabilize/clip_medium.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <numeric>
#include <utility>

#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

// A tracking window of the least size needs that much.
constexpr int kLeastSide = 20;

media::FieldOrder OrderOf(std::int32_t field_type) {
  switch (field_type) {
    case HX_FIELD_FIRST_ORDER:
      return media::FieldOrder::top_first;
    case HX_FIELD_SECOND_ORDER:
      return media::FieldOrder::bottom_first;
    default:
      return media::FieldOrder::progressive;
  }
}

}  // namespace

ClipMedium MediumOf(std::unique_ptr<media::ClipReader> reader) {
  const media::ClipInfo info = reader->info();
  if (info.width < kLeastSide || info.height < kLeastSide) {
    throw media::Failure(media::Failure::Side::input,
                         info.path + ": " + std::to_string(info.width) + " by " +
                             std::to_string(info.height) + " pixels are too few to stabilize");
  }
  const std::shared_ptr<const media::FoundFrames> frames = reader->found();
  return {info, OpenClip(std::move(reader)), frames, info.frame_count};
}

ClipMedium OpenMedium(const std::string& path, Opening opening,
                      const media::ClipReader::Part& part) {
  return MediumOf(opening == Opening::promised ? media::ClipReader::OpenPromised(path, part)
                                               : media::ClipReader::Open(path));
}

ClipMedium StandInFor(const Project& project) {
  SourceInfo source;
  source.width = std::max(project.width, 1);
  source.height = std::max(project.height, 1);
  source.pixel_aspect = project.pixel_aspect;
  source.frame_count = std::int64_t{project.shots.back().start_frame} + project.shots.back().length;
  source.ticks_per_frame = project.ticks_per_frame;
  source.field_type = project.field_type;
  source.content = project.clip_content;
  media::ClipInfo info;
  info.path = project.clip_path;
  info.width = source.width;
  info.height = source.height;
  info.pixel_aspect = {project.pixel_aspect.num, project.pixel_aspect.den};
  const std::int64_t divisor = std::gcd(HX_TICKS_PER_SECOND, project.ticks_per_frame);
  info.frame_rate = {HX_TICKS_PER_SECOND / divisor, project.ticks_per_frame / divisor};
  info.frame_count = static_cast<std::size_t>(std::max<std::int64_t>(source.frame_count, 0));
  info.field_order = OrderOf(project.field_type);
  const auto draw = [](std::int64_t, Picture& picture) {
    std::memset(picture.memory(), 0xff, picture.bytes());
  };
  return {info, MakeDrawnSource(source, draw), nullptr, info.frame_count};
}

}  // namespace calmframe::host
