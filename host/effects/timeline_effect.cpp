#include "host/effects/timeline_effect.h"

#include <new>
#include <utility>

namespace calmframe::host {
namespace {

constexpr std::size_t kMessages = 100;

std::uint64_t NewReference() {
  static std::atomic<std::uint64_t> last{0};
  return ++last;
}

}  // namespace

TimelineEffect::TimelineEffect(boost::shared_ptr<Layer> layer, std::vector<HX_ParamDef> declared)
    : layer_(std::move(layer)),
      reference_(NewReference()),
      runtime_id_(NewRuntimeId()),
      params_(std::move(declared)) {}

void TimelineEffect::AddMessage(const std::string& text) noexcept {
  try {
    std::lock_guard lock(mutex_);
    if (messages_.size() == kMessages) messages_.erase(messages_.begin());
    messages_.push_back(text);
  } catch (const std::bad_alloc&) {
  }
}

std::vector<std::string> TimelineEffect::TakeMessages() {
  std::lock_guard lock(mutex_);
  return std::exchange(messages_, {});
}

void TimelineEffect::SetPolygon(std::int32_t frame, std::vector<float> xy) {
  std::lock_guard lock(mutex_);
  polygons_[frame] = std::move(xy);
}

std::vector<float> TimelineEffect::PolygonOf(std::int32_t frame) const {
  std::lock_guard lock(mutex_);
  const auto found = polygons_.find(frame);
  return found == polygons_.end() ? std::vector<float>() : found->second;
}

}  // namespace calmframe::host
