#include "library/session_request.h"

#include <vector>

#include "host/media/ffmpeg.h"
#include "host/timeline/source.h"
#include "library/plugin_place.h"
#include "library/refusal.h"

namespace calmframe::library {
namespace {

void Expect(bool holds, const std::string& line) {
  if (!holds) throw Refusal(CALMFRAME_ERROR_ARGUMENT, line);
}

media::ClipInfo ClipOf(const calmframe_options& options) {
  Expect(options.aspect_num > 0 && options.aspect_den > 0, "the pixel aspect is not above 0");
  Expect(options.rate_num > 0 && options.rate_den > 0, "the frame rate is not above 0");
  Expect(options.field_order >= 0 && options.field_order <= 2, "there is no such field order");
  Expect(options.frame_count > 0 && options.frame_count <= media::kMaximumFrames,
         "frame_count is " + std::to_string(options.frame_count) + ", and 1 to " +
             std::to_string(media::kMaximumFrames) + " go");
  Expect(options.full_range == 0 || options.full_range == 1, "full_range is neither 0 nor 1");
  Expect(options.matrix >= 0 && options.matrix < AVCOL_SPC_NB,
         "matrix " + std::to_string(options.matrix) + ": there is none such");
  Expect(options.chroma_location >= 1 && options.chroma_location <= 6,
         "chroma_location is none of 1 to 6");
  media::ClipInfo clip;
  clip.path = options.clip ? options.clip : "frames";
  clip.width = options.width;
  clip.height = options.height;
  clip.pixel_aspect = {options.aspect_num, options.aspect_den};
  clip.frame_rate = {options.rate_num, options.rate_den};
  clip.frame_count = static_cast<std::size_t>(options.frame_count);
  clip.bit_depth = options.depth;
  clip.colour.matrix = options.matrix;
  clip.colour.range = options.full_range != 0 ? 2 : 1;
  clip.colour.chroma_location = options.chroma_location;
  clip.field_order = static_cast<media::FieldOrder>(options.field_order);
  return clip;
}

tessel::utility::Guid ContentOf(const calmframe_options& options) {
  if (options.clip) return host::ContentOf(options.clip);
  std::string text = "frames";
  for (const std::int32_t number :
       {options.width, options.height, options.rate_num, options.rate_den}) {
    text += " " + std::to_string(number);
  }
  if (options.identity) text += std::string(" ") + options.identity;
  return tessel::utility::Guid::FromText(text);
}

host::ShotRequest ShotsOf(const calmframe_options& options) {
  using Kind = host::ShotRequest::Kind;
  switch (options.shots) {
    case CALMFRAME_SHOTS_BY_SOURCE:
      return {.kind = options.fetch ? Kind::automatic : Kind::one};
    case CALMFRAME_SHOTS_ONE:
      return {.kind = Kind::one};
    case CALMFRAME_SHOTS_FOUND:
      Expect(options.fetch != nullptr,
             "shots are found only where frames are fetched: a border is seen some seconds behind");
      return {.kind = Kind::automatic};
    case CALMFRAME_SHOTS_LIST: {
      Expect(options.shot_starts || options.shot_start_count == 0, "shot_starts is null");
      Expect(options.shot_start_count <= std::size_t{media::kMaximumFrames},
             "too many shot_starts");
      std::vector<std::int64_t> starts(options.shot_starts,
                                       options.shot_starts + options.shot_start_count);
      for (std::size_t i = 0; i < starts.size(); ++i) {
        Expect(starts[i] > (i == 0 ? 0 : starts[i - 1]), "shot_starts must ascend, from above 0");
      }
      return {.kind = Kind::list, .list = [starts](const media::ClipInfo&) { return starts; }};
    }
    default:
      throw Refusal(CALMFRAME_ERROR_ARGUMENT, "there is no such kind of shots");
  }
}

}  // namespace

SessionRequest::SessionRequest(const calmframe_options& options)
    : format(options),
      clip(ClipOf(options)),
      content(ContentOf(options)),
      shots(ShotsOf(options)),
      shots_by_source(options.shots == CALMFRAME_SHOTS_BY_SOURCE),
      fetch(options.fetch),
      user(options.user),
      plugin(options.plugin ? options.plugin : PluginPlace()) {}

}  // namespace calmframe::library
