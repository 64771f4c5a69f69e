#include <algorithm>
#include <optional>
#include <stdexcept>
#include <utility>

#include "host/media/clip.h"
#include "host/media/decode_ahead.h"
#include "host/media/decoder.h"
#include "host/media/first_pass.h"
#include "host/media/frame_index.h"
#include "host/media/frame_list.h"
#include "host/media/kept_frames.h"
#include "host/media/pixel_conversion.h"

namespace calmframe::media {
namespace {

// A jump ahead that is shorter is decoded through: seeking goes back to a keyframe anyway.
constexpr std::size_t kSkippedAtMost = 8;

class FfmpegReader final : public ClipReader {
 public:
  explicit FfmpegReader(std::shared_ptr<const FrameList> list,
                        std::shared_ptr<KeptFrames> kept = std::make_shared<KeptFrames>())
      : info_(list->info), list_(std::move(list)), to_pixels_(info_), kept_(std::move(kept)) {}
  explicit FfmpegReader(std::unique_ptr<FirstPass> first_pass)
      : info_(first_pass->promised()),
        promised_(first_pass->frames()),
        to_pixels_(info_),
        first_pass_(std::move(first_pass)),
        kept_(std::make_shared<KeptFrames>()) {}

  std::unique_ptr<ClipReader> Again() override {
    LeaveFirstPass();
    return std::make_unique<FfmpegReader>(list_, kept_);
  }

  const ClipInfo& info() const override { return info_; }
  std::shared_ptr<const FoundFrames> found() const override {
    if (promised_) return promised_;
    return list_;
  }
  bool BeginsAsListed() {
    Find();
    return finder_->BeginsAs(info_);
  }

  void KeepDecoded(std::size_t bytes) override { kept_->SetBound(bytes); }

  void Read(std::size_t frame, HX_Pixel8* pixels, std::ptrdiff_t row_bytes) override {
    ReadAs(frame, pixels, row_bytes);
  }
  void Read(std::size_t frame, HX_Pixel16* pixels, std::ptrdiff_t row_bytes) override {
    ReadAs(frame, pixels, row_bytes);
  }
  void Read(std::size_t frame, HX_PixelFloat* pixels, std::ptrdiff_t row_bytes) override {
    ReadAs(frame, pixels, row_bytes);
  }

 private:
  template <class Pixel>
  void ReadAs(std::size_t frame, Pixel* pixels, std::ptrdiff_t row_bytes) {
    if (frame >= info_.frame_count) {
      throw Failure(Failure::Side::input, info_.path + ": has no frame " + std::to_string(frame));
    }
    try {
      Fetch(frame);
      to_pixels_.Convert(*last_, pixels, row_bytes);
    } catch (const Failure&) {
      throw;
    } catch (const std::bad_alloc&) {
      throw;
    } catch (const std::exception& error) {
      throw Failure(Failure::Side::input, info_.path + ": " + error.what());
    }
  }

  // Leaves the frame in last_.
  void Fetch(std::size_t frame) {
    if (last_ && last_number_ == frame) return;
    if (FramePtr kept = found()->standing() != Standing::broken ? kept_->Take(frame) : nullptr) {
      last_ = std::move(kept);
      last_number_ = frame;
      return;
    }
    Decode(frame);
    kept_->Keep(frame, *last_);
  }

  void Decode(std::size_t frame) {
    const std::size_t begin = first_pass_ ? first_pass_->range().first : 0;
    const bool ascending = last_ ? frame == last_number_ + 1 : frame == begin;
    last_.reset();
    if (ahead_ && (frame < ahead_->next() || frame > ahead_->next() + kSkippedAtMost ||
                   frame >= ahead_->end())) {
      ahead_.reset();
    }
    if (!ahead_ && first_pass_ && (frame != begin || first_pass_->begun())) LeaveFirstPass();
    if (!first_pass_ && !finder_) Find();
    if (!ahead_ && ascending) {
      ahead_.emplace(
          [this](std::size_t number, const std::atomic<bool>& stop) {
            return first_pass_ ? first_pass_->Get(number, stop) : finder_->Get(number, stop);
          },
          frame, EndAhead(frame));
    }
    if (ahead_) {
      while (ahead_->next() < frame) ahead_->Pop();
      last_ = ahead_->Pop();
    } else {
      const std::atomic<bool> never = false;
      last_ = finder_->Get(frame, never);
    }
    last_number_ = frame;
  }

  // Nobody decodes ahead of himself into what isn't known, or what is decoded.
  std::size_t EndAhead(std::size_t frame) const {
    const std::size_t known = first_pass_ ? first_pass_->range().end : list_->known.end;
    const std::size_t end = frame < known ? known : info_.frame_count;
    return std::min(end, kept_->From(frame).value_or(end));
  }

  void LeaveFirstPass() {
    if (!first_pass_) return;
    ahead_.reset();
    list_ = first_pass_->Complete();
    first_pass_.reset();
  }

  void Find() { finder_.emplace(info_.path, list_->index, !list_->info.warning.empty()); }

  const ClipInfo info_;
  std::shared_ptr<const PromisedFrames> promised_;  // null of a clip that was decoded at once
  std::shared_ptr<const FrameList> list_;           // null during the first pass
  FrameToPixels to_pixels_;
  std::unique_ptr<FirstPass> first_pass_;
  std::optional<FrameFinder> finder_;       // from the first frame on that is decoded behind that
  const std::shared_ptr<KeptFrames> kept_;  // never null
  FramePtr last_;
  std::size_t last_number_ = 0;
  std::optional<DecodeAhead> ahead_;  // last: it uses one of these until it is gone
};

}  // namespace

ClipInfo PartOf(const ClipInfo& clip, const FrameRange& range) {
  if (range.size() == clip.frame_count) return clip;
  ClipInfo part = clip;
  part.frame_count = range.size();
  part.cut = Cut{range.first, 0};
  if (clip.times.empty()) return part;
  const auto begin = clip.times.begin() + static_cast<std::ptrdiff_t>(range.first);
  part.cut->pts = begin->pts;
  part.times.assign(begin, begin + static_cast<std::ptrdiff_t>(range.size()));
  for (FrameTime& time : part.times) time.pts -= part.cut->pts;
  return part;
}

std::unique_ptr<ClipReader> ClipReader::OpenPromised(const std::string& path, const Part& part) {
  if (auto first_pass = FirstPass::Begin(path, part)) {
    return std::make_unique<FfmpegReader>(std::move(first_pass));
  }
  return Open(path);
}

std::unique_ptr<ClipReader> ClipReader::Open(const std::string& path,
                                             const std::vector<std::uint8_t>& found) {
  if (!found.empty()) {
    if (std::optional<FrameList> list = FrameListOf(found, path)) {
      auto reader =
          std::make_unique<FfmpegReader>(std::make_shared<const FrameList>(std::move(*list)));
      if (reader->BeginsAsListed()) return reader;
    }
  }
  FrameList list;
  list.index = ScanFrames(path, list.info);
  list.known.end = list.index.size();
  return std::make_unique<FfmpegReader>(std::make_shared<const FrameList>(std::move(list)));
}

}  // namespace calmframe::media
