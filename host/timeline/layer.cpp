#include "host/timeline/layer.h"

#include <algorithm>
#include <atomic>
#include <boost/make_shared.hpp>
#include <limits>
#include <new>
#include <stdexcept>

namespace calmframe::host {

std::uint32_t NewRuntimeId() {
  static std::atomic<std::uint32_t> next = 1;
  return next++;
}

Layer::Layer(const SourcePtr& source) {
  const SourceInfo& info = source->info();
  auto state = boost::make_shared<LayerState>();
  state->source = source;
  state->length = static_cast<std::int32_t>(
      std::min<std::int64_t>(info.frame_count, std::numeric_limits<std::int32_t>::max()));
  state->ticks_per_frame = info.ticks_per_frame;
  state->field_type = info.field_type;
  state_ = state;
}

boost::shared_ptr<const LayerState> Layer::state() const {
  std::lock_guard lock(mutex_);
  return state_;
}

void Layer::Change(const std::function<void(LayerState& state)>& change) {
  std::lock_guard one(changing_);
  const auto changed = boost::make_shared<LayerState>(*state());
  std::erase_if(changed->effects, [this](const EffectOperator& effect) {
    return std::count(leaving_.begin(), leaving_.end(), effect.runtime_id) > 0;
  });
  change(*changed);
  if (!changed->source || changed->ticks_per_frame < 1) {
    throw std::invalid_argument("a layer needs a source and a frame duration");
  }
  leaving_.clear();
  boost::shared_ptr<const LayerState> state = changed;  // goes with the old one, unlocked
  std::lock_guard lock(mutex_);
  state_.swap(state);
}

void Layer::ReplaceMedia(const SourcePtr& source) {
  Change([&](LayerState& state) {
    state.source = source;
    state.ticks_per_frame = source->info().ticks_per_frame;
    state.field_type = source->info().field_type;
  });
}

void Layer::Resize(int width, int height) {
  Change([&](LayerState& state) { state.source = MakeResizedSource(state.source, width, height); });
}

void Layer::InsertEffect(std::size_t position, const EffectOperator& effect) {
  Change([&](LayerState& state) {
    leaving_.reserve(leaving_.size() + state.effects.size() + 1);
    const std::size_t place = std::min(position, state.effects.size());
    state.effects.insert(state.effects.begin() + static_cast<std::ptrdiff_t>(place), effect);
  });
}

void Layer::RemoveEffect(std::uint32_t runtime_id) noexcept {
  try {
    Change([&](LayerState& state) {
      std::erase_if(state.effects,
                    [&](const EffectOperator& effect) { return effect.runtime_id == runtime_id; });
    });
  } catch (const std::bad_alloc&) {
    std::lock_guard one(changing_);
    if (leaving_.size() < leaving_.capacity()) leaving_.push_back(runtime_id);
  }
}

void Layer::SetParameters(std::uint32_t runtime_id, const std::string& parameters) {
  Change([&](LayerState& state) {
    for (EffectOperator& effect : state.effects) {
      if (effect.runtime_id == runtime_id) effect.parameters = parameters;
    }
  });
}

}  // namespace calmframe::host
