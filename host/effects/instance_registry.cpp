#include "host/effects/instance_registry.h"

#include <mutex>

namespace calmframe::host {

HX_EffectRef InstanceRegistry::Add(const std::shared_ptr<Instance>& instance) {
  std::unique_lock lock(mutex_);
  instances_[++last_] = instance;
  return reinterpret_cast<HX_EffectRef>(last_);
}

void InstanceRegistry::Remove(HX_EffectRef effect) {
  std::unique_lock lock(mutex_);
  instances_.erase(reinterpret_cast<std::uintptr_t>(effect));
}

std::shared_ptr<Instance> InstanceRegistry::Find(HX_EffectRef effect) const {
  std::shared_lock lock(mutex_);
  const auto found = instances_.find(reinterpret_cast<std::uintptr_t>(effect));
  return found == instances_.end() ? nullptr : found->second.lock();
}

std::size_t InstanceRegistry::size() const {
  std::shared_lock lock(mutex_);
  return instances_.size();
}

}  // namespace calmframe::host
