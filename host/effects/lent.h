#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>

#include "host/base/shared_by_all.h"
#include "host/effects/handle_store.h"
#include "host/effects/instance_registry.h"
#include "host/effects/opaque_store.h"
#include "host/effects/world_store.h"
#include "platform/hx/hx_effect.h"
#include "platform/tessel/config.h"

namespace calmframe::host {

// The string tables that plug-ins have open, by tokens that are never given twice. Any thread.
class OpenStringTables {
 public:
  std::uint64_t Open(const HX_StringTable& table);
  const char* Get(std::uint64_t token, std::int32_t index) const;  // null for an unknown one
  // One that is not open is a mistake in the Ledger.
  void Close(std::uint64_t token);
  std::size_t count() const;

 private:
  mutable std::mutex mutex_;
  std::map<std::uint64_t, std::unique_ptr<tessel::config::StringTable>> tables_;  // guarded by it
  std::uint64_t last_token_ = 0;                                                  // guarded by it
};

// What all hosts of the process have lent to plug-ins, under names that no two of them give: most
// of the interface's functions don't tell which host they mean.
struct Lent {
  HandleStore handles;
  OpaqueStore opaque_data;
  WorldStore worlds;
  InstanceRegistry instances;
  OpenStringTables strings;

  static Lent* active() { return SharedByAll<Lent>::active(); }  // null when there is no host
};

}  // namespace calmframe::host
