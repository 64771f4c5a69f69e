#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <string>

#include "host/media/clip.h"
#include "host/timeline/picture.h"
#include "platform/hx/hx_types.h"
#include "platform/tessel/guid.h"

namespace calmframe::host {

struct SourceInfo {
  int width = 0, height = 0;    // as shown
  HX_Ratio pixel_aspect{1, 1};  // width : height of one pixel as shown
  std::int64_t frame_count = 0;
  std::int64_t ticks_per_frame = HX_TICKS_PER_SECOND / 25;
  std::int32_t field_type =
      HX_FIELD_PROGRESSIVE;  // first order: the top field (lines 0, 2 ...) was shot first
  int bit_depth = 8;         // of a component as stored
  // Identity of the contents: equal for equal contents, in every process and under every name.
  tessel::utility::Guid content;
};

// Where frames come from. Any thread.
class Source {
 public:
  virtual ~Source() = default;

  // Constant.
  virtual const SourceInfo& info() const = 0;

  // Frame 0 .. frame_count - 1, whole, top-down; null outside. Frames in about ascending order are
  // cheapest, also from several threads. Throws std::runtime_error, one line that names the file
  // and the cause.
  virtual PicturePtr Fetch(std::int64_t frame, PixelKind kind) = 0;

  // Where the shot that holds the frame ends, as far as is known from what was fetched: the first
  // frame of the next, or kNoEnd. Never grows.
  virtual std::int64_t EndOfShot(std::int64_t /*frame*/) const { return kNoEnd; }
  static constexpr std::int64_t kNoEnd = std::numeric_limits<std::int64_t>::max();

  // Of frames that are fetched in about ascending order, and then once more; see ClipReader.
  virtual void KeepDecoded(std::size_t /*bytes*/) {}
};

using SourcePtr = boost::shared_ptr<Source>;

// What a clip's info tells of its frames; the content is the caller's.
SourceInfo SourceInfoOf(const media::ClipInfo& clip);

// Identity of a clip's contents, from the sizes, the first and the last bytes of its files: equal
// for copies under any name. Throws media::Failure if it can't be read.
tessel::utility::Guid ContentOf(const std::string& path);

// A video file. Throws media::Failure (a std::runtime_error, one line) if it can't be read.
SourcePtr OpenClip(const std::string& path);
// The same of a clip that is open: its frames have been found, which costs decoding all of it.
SourcePtr OpenClip(std::unique_ptr<media::ClipReader> reader);

// Frames that are drawn when asked for, at once from several threads. info.content tells what is
// drawn.
SourcePtr MakeDrawnSource(const SourceInfo& info,
                          std::function<void(std::int64_t frame, Picture& picture)> draw);

// `source` at another size, which is part of its identity.
SourcePtr MakeResizedSource(SourcePtr source, int width, int height);

}  // namespace calmframe::host
