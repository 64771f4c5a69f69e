#include <optional>
#include <stdexcept>
#include <utility>

#include "host/media/clip.h"
#include "host/media/decode_ahead.h"
#include "host/media/decoder.h"
#include "host/media/frame_index.h"
#include "host/media/frame_list.h"
#include "host/media/pixel_conversion.h"

namespace calmframe::media {
namespace {

// A jump ahead that is shorter is decoded through: seeking goes back to a keyframe anyway.
constexpr std::size_t kSkippedAtMost = 8;

class FfmpegReader final : public ClipReader {
 public:
  explicit FfmpegReader(std::shared_ptr<const FrameList> list)
      : list_(std::move(list)), to_pixels_(info()), finder_(info().path, list_->index) {}

  std::unique_ptr<ClipReader> Again() const override {
    return std::make_unique<FfmpegReader>(list_);
  }

  const ClipInfo& info() const override { return list_->info; }
  std::shared_ptr<const FoundFrames> found() const override { return list_; }
  bool BeginsAsListed() { return finder_.BeginsAs(info()); }

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
    if (frame >= info().frame_count) {
      throw Failure(Failure::Side::input, info().path + ": has no frame " + std::to_string(frame));
    }
    try {
      Fetch(frame);
      to_pixels_.Convert(*last_, pixels, row_bytes);
    } catch (const Failure&) {
      throw;
    } catch (const std::bad_alloc&) {
      throw;
    } catch (const std::exception& error) {
      throw Failure(Failure::Side::input, info().path + ": " + error.what());
    }
  }

  // Leaves the frame in last_.
  void Fetch(std::size_t frame) {
    if (last_ && last_number_ == frame) return;
    const bool ascending = last_ ? frame == last_number_ + 1 : frame == 0;
    last_.reset();
    if (ahead_ && (frame < ahead_->next() || frame > ahead_->next() + kSkippedAtMost)) {
      ahead_.reset();
    }
    if (!ahead_ && ascending) ahead_.emplace(finder_, frame, info().frame_count);
    if (ahead_) {
      while (ahead_->next() < frame) ahead_->Pop();
      last_ = ahead_->Pop();
    } else {
      const std::atomic<bool> never = false;
      last_ = finder_.Get(frame, never);
    }
    last_number_ = frame;
  }

  const std::shared_ptr<const FrameList> list_;
  FrameToPixels to_pixels_;
  FrameFinder finder_;
  FramePtr last_;
  std::size_t last_number_ = 0;
  std::optional<DecodeAhead> ahead_;  // last: it uses the finder until it is gone
};

}  // namespace

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
  {
    Decoder decoder(path);
    list.index = ScanFrames(path, decoder, list.info);
  }
  return std::make_unique<FfmpegReader>(std::make_shared<const FrameList>(std::move(list)));
}

}  // namespace calmframe::media
