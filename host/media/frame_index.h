#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "host/media/decoder.h"

namespace calmframe::media {

// Hash of a frame's pixels, padding left out. Tells whether decoding from a seek point gave the
// frame that decoding from the start gives.
std::uint64_t Fingerprint(const AVFrame& frame);

struct IndexEntry {
  std::int64_t pts = AV_NOPTS_VALUE;  // as decoded, before any repair
  std::uint64_t fingerprint = 0;
  bool keyframe = false;
};
using FrameIndex = std::vector<IndexEntry>;

IndexEntry EntryOf(const AVFrame& frame);

// How many of a clip's frames are interlaced.
struct FieldCounts {
  std::size_t top_first = 0, bottom_first = 0;
};

// Of the pixels of the decoder's first frame; 0 if it isn't known.
AVRational PixelAspect(const Decoder& decoder, const AVFrame& first);

// What is told of a clip, but for a warning. times: one at least, before any repair. aspect: as
// PixelAspect told when the first frame came.
ClipInfo InfoOf(const std::string& path, const Decoder& decoder, std::vector<FrameTime> times,
                const AVFrame& first, AVRational aspect, const FieldCounts& fields);

// What a pass over a clip's frames, from the first to the last, tells of it.
class FrameScan {
 public:
  // `decoder` is the one that gives the frames; it outlives this.
  FrameScan(const std::string& path, const Decoder& decoder, std::size_t most = kMaximumFrames)
      : path_(path), decoder_(decoder), most_(most) {}

  // Throws Failure (input) where there are too many.
  void Add(const AVFrame& frame);
  // After the decoder's end: the info, with a warning where the stream is damaged, which counts
  // every place only of a decoder with one thread. Throws Failure (input) if there was no frame.
  ClipInfo Finish();
  FrameIndex TakeIndex() { return std::move(index_); }

 private:
  const std::string path_;
  const Decoder& decoder_;
  const std::size_t most_;
  FrameIndex index_;
  std::vector<FrameTime> times_;
  FieldCounts fields_;
  FramePtr first_;
  AVRational aspect_{0, 1};
};

// Decodes everything once: a container's own count and times are promises, this is what is there.
// Decodes a stream that isn't whole again, on one thread: several threads mend or lose a damaged
// frame as it happens, one marks each in time and does the same in every run.
// Fills info, with a warning where the stream is damaged. Throws Failure (input) if no frame
// decodes, or more than `most`.
FrameIndex ScanFrames(const std::string& path, ClipInfo& info, std::size_t most = kMaximumFrames);

// Frames by number. Ascending numbers decode on; others decode from the nearest keyframe whose
// frames prove, by time stamp and fingerprint, to be those of the index, or else from the start.
class FrameFinder {
 public:
  // `index` must outlive this. Frames of a damaged stream come as indexed from one thread alone.
  FrameFinder(const std::string& path, const FrameIndex& index, bool damaged)
      : path_(path), decoder_(path, damaged ? 1 : 0), index_(index) {}

  // Before any frame was asked for: whether the stream and its first frame are those that the index
  // and the info tell of. Not so where it is another clip, or this processor's decoder gives other
  // pixels than that which made the index. Throws Failure (input).
  bool BeginsAs(const ClipInfo& info);

  // Null if `stop` became true. Throws Failure (input) if the frame no longer decodes.
  FramePtr Get(std::size_t frame, const std::atomic<bool>& stop);

  // Number of the frame that comes without seeking.
  std::optional<std::size_t> next() const { return next_; }

 private:
  std::vector<std::size_t> StartsFor(std::size_t frame) const;
  bool SeekTo(std::size_t start, std::size_t frame, const std::atomic<bool>& stop);
  FramePtr Forward(std::size_t frame, const std::atomic<bool>& stop);
  std::optional<std::size_t> NumberOf(const AVFrame& frame, std::size_t near_frame) const;

  const std::string path_;
  Decoder decoder_;
  const FrameIndex& index_;
  std::optional<std::size_t> next_ = 0;
  FramePtr pending_;      // frame *next_ when it is decoded already
  bool verified_ = true;  // decoding from the start; otherwise each frame is compared to the index
};

}  // namespace calmframe::media
