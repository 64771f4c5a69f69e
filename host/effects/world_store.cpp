#include "host/effects/world_store.h"

#include <cstring>
#include <new>
#include <stdexcept>
#include <utility>

#include "host/base/operations.h"

namespace calmframe::host {
namespace {

constexpr int kUnclear = 0x5a;

}  // namespace

HX_Err WorldStore::New(int width, int height, bool clear, std::uint32_t format, HX_World* world) {
  std::unique_ptr<WorldBuffer> buffer;
  try {
    buffer = std::make_unique<WorldBuffer>(width, height, format, padding_);
  } catch (const std::bad_alloc&) {
    return HX_ERR_MEMORY;
  } catch (const std::invalid_argument&) {
    return HX_ERR_UNKNOWN;
  }
  // A buffer that nobody promised to clear isn't: a plug-in that relies on it is found out.
  if (!clear) {
    for (int y = 0; y < height; ++y) {
      std::memset(buffer->row<std::uint8_t>(y), kUnclear,
                  static_cast<std::size_t>(width) * BytesPerPixel(format));
    }
  }
  *world = buffer->world();
  std::lock_guard lock(mutex_);
  worlds_[world->data] = std::move(buffer);
  return HX_ERR_NONE;
}

HX_Err WorldStore::Dispose(HX_World* world) {
  std::unique_ptr<WorldBuffer> buffer;
  {
    std::lock_guard lock(mutex_);
    const auto found = worlds_.find(world->data);
    if (found == worlds_.end()) {
      Ledger::Get().Mistake("World.DisposeWorld: unknown world");
      return HX_ERR_UNKNOWN;
    }
    buffer = std::move(found->second);
    worlds_.erase(found);
  }
  if (!buffer->PaddingIntact()) Ledger::Get().Mistake("world: written behind its rows");
  *world = {};
  return HX_ERR_NONE;
}

std::size_t WorldStore::count() const {
  std::lock_guard lock(mutex_);
  return worlds_.size();
}

}  // namespace calmframe::host
