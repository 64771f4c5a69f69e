#pragma once

#include <atomic>
#include <cstddef>
#include <memory>
#include <string>

#include "host/media/frame_list.h"

namespace calmframe::media {

// What is promised of a clip's frames, and then found.
class PromisedFrames final : public FoundFrames {
 public:
  Standing standing() const override { return standing_; }
  std::vector<std::uint8_t> Bytes() const override;

  // Once it stands decoded; null before.
  std::shared_ptr<const FrameList> list() const;
  void Keep(FrameList list);
  void Break() { standing_ = Standing::broken; }

 private:
  std::atomic<Standing> standing_ = Standing::promised;
  std::shared_ptr<const FrameList> list_;  // written once, before standing_ says so
};

// A clip's frames in order, for the first time, each held against what the container's packets
// promised; so a clip that is to be read anyway need not be decoded before. After the last frame
// there is all that ScanFrames would have told, and it is the same, or the promise is broken. Or
// the frames of a part, from the keyframe before it on, which are known after the last of them as
// ScanFrames would know them, while the rest is as promised. One thread at a time.
class FirstPass {
 public:
  // Null where nothing is promised that can be believed. Throws Failure (input), and what `part`
  // throws.
  static std::unique_ptr<FirstPass> Begin(const std::string& path, const ClipReader::Part& part);

  const ClipInfo& promised() const { return promised_; }
  std::shared_ptr<const PromisedFrames> frames() const { return frames_; }
  const FrameRange& range() const { return range_; }
  bool begun() const { return begun_; }

  // Frames of the range in ascending order, none left out. Null if `stop` became true. Throws
  // Failure (input), from the first that breaks the promise on; whoever sees it broken opens the
  // clip anew.
  FramePtr Get(std::size_t frame, const std::atomic<bool>& stop);
  // Gets all that are left. Throws as Get.
  std::shared_ptr<const FrameList> Complete();

 private:
  FirstPass(const std::string& path, std::unique_ptr<Decoder> decoder, FramePtr first,
            const ClipInfo& promised, const FrameRange& range);
  bool IsWhole() const { return range_.size() == promised_.frame_count; }
  // Goes to the keyframe before the range; false where none is found.
  bool Seek();
  FramePtr Next();
  [[noreturn]] void Break();
  void End();
  FrameList ListOfPart();

  const std::string path_;
  const ClipInfo promised_;
  const FrameRange range_;
  const std::shared_ptr<PromisedFrames> frames_;
  const std::unique_ptr<Decoder> decoder_;
  FrameScan scan_;
  const IndexEntry frame_0_;
  FramePtr first_;        // until it was got
  std::size_t lead_ = 0;  // the frame that is decoded first
  std::size_t next_ = 0;
  bool begun_ = false;
};

}  // namespace calmframe::media
