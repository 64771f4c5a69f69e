#include "host/timeline/frame_maker.h"

#include <boost/make_shared.hpp>
#include <cstring>
#include <exception>
#include <new>

#include "host/pixels/world_buffer.h"

namespace calmframe::host {

using tessel::utility::Guid;

namespace {

constexpr std::size_t kNumberBytes = 4;

}  // namespace

Guid IdentifierOf(const FrameRequest& request, std::uint32_t number) {
  const std::int64_t parts[] = {request.picture.frame, request.picture.parity,
                                static_cast<std::int64_t>(request.kind), request.width,
                                request.height};
  Guid::Bytes bytes =
      tessel::utility::MixHash(IdentityOf(request.node), parts, sizeof parts).bytes();
  for (std::size_t i = 0; i < kNumberBytes; ++i) {
    bytes[bytes.size() - kNumberBytes + i] = static_cast<std::uint8_t>(number >> (8 * i));
  }
  return Guid(bytes);
}

std::uint32_t NumberOf(const Guid& identifier) {
  const Guid::Bytes& bytes = identifier.bytes();
  std::uint32_t number = 0;
  for (std::size_t i = 0; i < kNumberBytes; ++i) {
    number |= std::uint32_t{bytes[bytes.size() - kNumberBytes + i]} << (8 * i);
  }
  return number;
}

PicturePtr FrameMaker::Get(const FrameRequest& request, const FrameLayout& layout) {
  const Guid identifier = Identifier(request);
  std::unique_lock lock(mutex_);
  if (const PicturePtr cached = cache_.Find(identifier)) return cached;
  if (const auto under_way = makings_.find(identifier); under_way != makings_.end()) {
    const boost::shared_ptr<Making> making = under_way->second;
    made_.wait(lock, [&] { return making->done; });
    if (making->out_of_memory) throw std::bad_alloc();
    // It may have left the cache already, before a reference came that is to keep it.
    return making->picture ? cache_.Insert(identifier, making->picture) : nullptr;
  }
  const auto making = boost::make_shared<Making>();
  makings_.emplace(identifier, making);
  lock.unlock();
  PicturePtr picture;
  bool out_of_memory = false;
  try {
    picture = Make(request, layout);
    if (picture) picture = cache_.Insert(identifier, picture);
  } catch (const std::bad_alloc&) {
    out_of_memory = true;
  } catch (const std::exception& error) {
    Keep(error.what());
  } catch (...) {
    Keep("a frame could not be made");
  }
  lock.lock();
  making->picture = picture;
  making->out_of_memory = out_of_memory;
  making->done = true;
  makings_.erase(identifier);
  made_.notify_all();
  if (out_of_memory) throw std::bad_alloc();
  return picture;
}

PicturePtr FrameMaker::Make(const FrameRequest& request, const FrameLayout& layout) {
  const LayerState& layer = *request.node.layer;
  const PictureNumber& number = request.picture;
  const PicturePtr whole = layer.source->Fetch(number.frame, request.kind);
  if (!whole) return nullptr;
  boost::shared_ptr<Picture> own;  // a copy, as soon as there is something to change
  const auto writable = [&]() -> Picture& {
    if (!own) own = Copy(*whole, {});
    return *own;
  };
  for (std::size_t i = 0; i < request.node.level; ++i) {
    if (layer.effects[i].draw) layer.effects[i].draw(number.frame, writable());
  }
  if (number.parity >= 0) KeepField(writable(), number.parity);
  PicturePtr picture = own ? own : whole;
  if (picture->width() != request.width || picture->height() != request.height) {
    const auto scaled = pool_->NewPicture(request.kind, request.width, request.height);
    ScalePicture(*picture, *scaled);
    picture = scaled;
  }
  if (layout.padding != 0 || !layout.top_down) picture = Copy(*picture, layout);
  return picture;
}

boost::shared_ptr<Picture> FrameMaker::Copy(const Picture& picture, const FrameLayout& layout) {
  const boost::shared_ptr<Picture> copy = pool_->NewPicture(
      picture.kind(), picture.width(), picture.height(), layout.padding, layout.top_down);
  const std::size_t bytes = static_cast<std::size_t>(BytesPerPixel(FormatOf(picture.kind()))) *
                            static_cast<std::size_t>(picture.width());
  for (int y = 0; y < picture.height(); ++y) {
    std::memcpy(copy->row<std::uint8_t>(y), picture.row<std::uint8_t>(y), bytes);
  }
  return copy;
}

std::string FrameMaker::failure() const {
  std::lock_guard lock(mutex_);
  return failure_;
}

void FrameMaker::Keep(const char* line) noexcept {
  try {
    std::lock_guard lock(mutex_);
    if (failure_.empty()) failure_ = line;
  } catch (const std::bad_alloc&) {  // those who wait for the frame must hear of it all the same
  }
}

}  // namespace calmframe::host
