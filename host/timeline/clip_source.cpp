#include <algorithm>
#include <array>
#include <boost/make_shared.hpp>
#include <deque>
#include <fstream>
#include <limits>
#include <memory>
#include <mutex>
#include <numeric>
#include <utility>
#include <vector>

#include "host/media/clip.h"
#include "host/media/clip_files.h"
#include "host/timeline/source.h"

namespace calmframe::host {
namespace {

using tessel::utility::Guid;
using tessel::utility::MixHash;

// Threads that work on neighbouring frames ask for them in a slightly wrong order. A frame this far
// ahead is reached by reading those between, which are kept: they are wanted next, and going back
// for them would cost a seek each.
constexpr std::int64_t kReadAhead = 4;
// An analysis and a preview each read on from where they are.
constexpr std::size_t kCursors = 2;
constexpr std::size_t kRecentFrames = 6;
constexpr std::size_t kRecentBytes = std::size_t{128} << 20;

// Two clips of one camera differ in their sizes, indices and last frames, wherever the container
// keeps its index.
constexpr std::streamoff kHashedBytes = 64 << 10;

[[noreturn]] void Unreadable(const std::string& path) {
  throw media::Failure(media::Failure::Side::input, path + ": cannot be read");
}

std::int64_t TicksPerFrame(const media::Ratio& rate) {
  if (rate.num <= 0 || rate.den <= 0) return SourceInfo{}.ticks_per_frame;
  const __int128 twice = (__int128{HX_TICKS_PER_SECOND} * rate.den * 2) / rate.num;
  const __int128 ticks = (twice + 1) / 2;
  return static_cast<std::int64_t>(
      std::clamp<__int128>(ticks, 1, std::numeric_limits<std::int32_t>::max()));
}

HX_Ratio AspectOf(media::Ratio aspect) {
  if (aspect.num <= 0 || aspect.den <= 0) return {1, 1};
  const std::int64_t divisor = std::gcd(aspect.num, aspect.den);
  aspect.num /= divisor;
  aspect.den /= divisor;
  while (std::max(aspect.num, aspect.den) > std::numeric_limits<std::int32_t>::max()) {
    aspect.num = std::max<std::int64_t>(aspect.num / 2, 1);
    aspect.den = std::max<std::int64_t>(aspect.den / 2, 1);
  }
  return {static_cast<std::int32_t>(aspect.num), static_cast<std::uint32_t>(aspect.den)};
}

std::int32_t FieldTypeOf(media::FieldOrder order) {
  switch (order) {
    case media::FieldOrder::top_first:
      return HX_FIELD_FIRST_ORDER;
    case media::FieldOrder::bottom_first:
      return HX_FIELD_SECOND_ORDER;
    default:
      return HX_FIELD_PROGRESSIVE;
  }
}

class ClipSource final : public Source {
 public:
  explicit ClipSource(std::unique_ptr<media::ClipReader> reader) : pool_(PicturePool::Make()) {
    cursors_.push_back({std::move(reader)});
    const media::ClipInfo& clip = cursors_[0].reader->info();
    info_ = SourceInfoOf(clip);
    info_.content = ContentOf(clip.path);
  }

  const SourceInfo& info() const override { return info_; }

  PicturePtr Fetch(std::int64_t frame, PixelKind kind) override {
    if (frame < 0 || frame >= info_.frame_count) return nullptr;
    std::lock_guard lock(mutex_);
    for (const Recent& recent : recent_) {
      if (recent.frame == frame && recent.picture->kind() == kind) return recent.picture;
    }
    Cursor& cursor = CursorFor(frame);
    cursor.used = ++uses_;
    PicturePtr picture;
    for (std::int64_t f = IsNear(cursor, frame) ? cursor.last + 1 : frame; f <= frame; ++f) {
      picture = Read(cursor, f, kind);
    }
    return picture;
  }

  void KeepDecoded(std::size_t bytes) override {
    std::lock_guard lock(mutex_);
    cursors_[0].reader->KeepDecoded(bytes);
  }

 private:
  struct Cursor {
    std::unique_ptr<media::ClipReader> reader;
    std::int64_t last = -1;  // frame read last
    std::uint64_t used = 0;  // by the source's count of uses
  };
  struct Recent {
    std::int64_t frame;
    PicturePtr picture;
  };

  static bool IsNear(const Cursor& cursor, std::int64_t frame) {
    return frame > cursor.last && frame - cursor.last <= kReadAhead;
  }

  // One that reads on, or else the one whose place is worth least.
  Cursor& CursorFor(std::int64_t frame) {
    for (Cursor& cursor : cursors_) {
      if (frame == cursor.last || IsNear(cursor, frame)) return cursor;
    }
    for (Cursor& cursor : cursors_) {
      if (cursor.last < 0 || cursor.last == info_.frame_count - 1) return cursor;
    }
    if (cursors_.size() < kCursors) {
      cursors_.push_back({cursors_[0].reader->Again()});
      return cursors_.back();
    }
    return *std::min_element(cursors_.begin(), cursors_.end(),
                             [](const Cursor& a, const Cursor& b) { return a.used < b.used; });
  }

  PicturePtr Read(Cursor& cursor, std::int64_t frame, PixelKind kind) {
    const boost::shared_ptr<Picture> picture = pool_->NewPicture(kind, info_.width, info_.height);
    const auto read = [&]<class Pixel>(Pixel* top) {
      cursor.reader->Read(static_cast<std::size_t>(frame), top, picture->row_bytes());
    };
    switch (kind) {
      case PixelKind::argb8:
        read(picture->row<HX_Pixel8>(0));
        break;
      case PixelKind::argb16:
        read(picture->row<HX_Pixel16>(0));
        break;
      case PixelKind::argbf:
        read(picture->row<HX_PixelFloat>(0));
        break;
    }
    cursor.last = frame;
    recent_.push_back({frame, picture});
    while (recent_.size() > kRecentFrames ||
           (recent_.size() > 2 && recent_.size() * picture->bytes() > kRecentBytes)) {
      recent_.pop_front();
    }
    return picture;
  }

  SourceInfo info_;
  const boost::shared_ptr<PicturePool> pool_;
  std::mutex mutex_;             // guards all below
  std::vector<Cursor> cursors_;  // 1 to kCursors
  std::uint64_t uses_ = 0;
  std::deque<Recent> recent_;  // the oldest first
};

Guid ContentOfFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  file.seekg(0, std::ios::end);
  const std::int64_t size = file.tellg();
  if (!file) Unreadable(path);
  Guid guid = MixHash(Guid(), &size, sizeof size);
  std::array<char, kHashedBytes> bytes;
  const std::streamoff part = std::min<std::int64_t>(size, kHashedBytes);
  for (const std::streamoff start : {std::streamoff{0}, size - part}) {
    file.seekg(start);
    if (!file.read(bytes.data(), part)) Unreadable(path);
    guid = MixHash(guid, bytes.data(), static_cast<std::size_t>(part));
  }
  return guid;
}

}  // namespace

SourceInfo SourceInfoOf(const media::ClipInfo& clip) {
  SourceInfo info;
  info.width = clip.width;
  info.height = clip.height;
  info.pixel_aspect = AspectOf(clip.pixel_aspect);
  info.frame_count = static_cast<std::int64_t>(clip.frame_count);
  info.ticks_per_frame = TicksPerFrame(clip.frame_rate);
  info.field_type = FieldTypeOf(clip.field_order);
  info.bit_depth = clip.bit_depth;
  return info;
}

Guid ContentOf(const std::string& path) {
  const media::ClipFiles files = media::FilesOf(path);
  if (files.pattern.empty()) return ContentOfFile(files.paths[0]);
  Guid guid;
  for (const std::string& picture : files.paths) {
    const Guid content = ContentOfFile(picture);
    guid = MixHash(guid, &content, sizeof content);
  }
  return guid;
}

SourcePtr OpenClip(const std::string& path) {
  return OpenClip(media::ClipReader::Open(path));
}

SourcePtr OpenClip(std::unique_ptr<media::ClipReader> reader) {
  return boost::make_shared<ClipSource>(std::move(reader));
}

}  // namespace calmframe::host
