#include "apps/calmframe/side_by_side.h"

#include "apps/calmframe/caption.h"
#include "apps/calmframe/render_clip.h"
#include "host/pixels/world_operations.h"

namespace calmframe {
namespace {

constexpr int kSeam = 8;  // pixels of black where labelled halves meet

}  // namespace

SideBySide::SideBySide(const std::string& path, const media::ClipInfo& info,
                       const media::EncodeSettings& encode, bool labelled)
    : labelled_(labelled), width_(info.width), height_(info.height) {
  try {
    writer_ = media::ClipWriter::Create(path, info, 2 * width_, height_, encode);
  } catch (const media::Failure& failure) {
    const std::string whole = std::to_string(2 * width_) + " x " + std::to_string(height_);
    media::ClipInfo half = info;
    half.field_order = media::FieldOrder::progressive;  // the lines of both fields are mixed
    width_ /= 2;
    height_ /= 2;
    try {
      writer_ = media::ClipWriter::Create(path, half, 2 * width_, height_, encode);
    } catch (const media::Failure&) {
      throw failure;
    }
    warnings_.push_back(path + ": its encoder takes no frames of " + whole + "; both halves are " +
                        std::to_string(width_) + " x " + std::to_string(height_));
  }
}

template <class Work>
void SideBySide::Attempt(const Work& work) {
  if (!writer_) return;
  try {
    work();
  } catch (const media::Failure& failure) {
    failure_ = failure.what();
    writer_.reset();
  }
}

void SideBySide::Label(host::WorldBuffer& both) const {
  int left = 0;
  for (const char* word : {"SHAKY", "STEADY"}) {
    const std::unique_ptr<host::WorldBuffer> caption = Caption(word, height_);
    const HX_Rect place{left, 0, left + caption->world().width, caption->world().height};
    host::CopyWorld(caption->world(), both.world(), nullptr, &place);
    left = width_;
  }
  host::WorldBuffer black(1, 1, HX_FORMAT_ARGB8);
  *black.row<HX_Pixel8>(0) = {255, 0, 0, 0};
  const HX_Rect seam{width_ - kSeam / 2, 0, width_ + kSeam / 2, height_};
  host::CopyWorld(black.world(), both.world(), nullptr, &seam);
}

void SideBySide::Write(std::size_t frame, const host::Picture& before,
                       const host::WorldBuffer& after) {
  Attempt([&] {
    host::WorldBuffer both(2 * width_, height_, after.world().format);
    const HX_Rect left{0, 0, width_, height_}, right{width_, 0, 2 * width_, height_};
    host::CopyWorld(WorldOf(before), both.world(), nullptr, &left);
    host::CopyWorld(after.world(), both.world(), nullptr, &right);
    if (labelled_) Label(both);
    calmframe::Write(*writer_, frame, both);
  });
}

void SideBySide::Finish() {
  Attempt([this] { writer_->Finish(); });
}

std::vector<std::string> SideBySide::warnings() const {
  std::vector<std::string> all = warnings_;
  if (writer_) all.insert(all.end(), writer_->warnings().begin(), writer_->warnings().end());
  return all;
}

void SideBySide::Throw() const {
  if (!failure_.empty()) throw media::Failure(media::Failure::Side::output, failure_);
}

}  // namespace calmframe
