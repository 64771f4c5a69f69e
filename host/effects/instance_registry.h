#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <shared_mutex>
#include <unordered_map>

#include "platform/hx/hx_types.h"

namespace calmframe::host {

class Instance;

// The instances by the references that plug-ins know them by. A reference is never given twice, so
// that one that is no more finds nothing. Any thread.
class InstanceRegistry {
 public:
  HX_EffectRef Add(const std::shared_ptr<Instance>& instance);
  void Remove(HX_EffectRef effect);
  std::shared_ptr<Instance> Find(HX_EffectRef effect) const;  // null when there is none
  std::size_t size() const;

 private:
  mutable std::shared_mutex mutex_;
  std::unordered_map<std::uintptr_t, std::weak_ptr<Instance>> instances_;  // guarded by mutex_
  std::uintptr_t last_ = 0;                                                // guarded by mutex_
};

}  // namespace calmframe::host
