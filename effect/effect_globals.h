#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <mutex>

#include "effect/handle.h"
#include "effect/host_context.h"

namespace kelp::analysis::effect {
class BannerCache;
}

namespace kelp::effect {

// The one block of the whole plug-in, in a handle of the host's. The host moves the block while it
// is unlocked, which shared pointers bear.
struct EffectGlobals {
  std::uint64_t string_token;
  boost::shared_ptr<analysis::effect::BannerCache> banner_cache;  // guarded by *banner_cache_lock
  boost::shared_ptr<std::mutex> banner_cache_lock;  // constant from StartPlugin to StopPlugin
};
static_assert(sizeof(EffectGlobals) == 40);

// The global data of the context, for its scope. Throws HX_ERR_HANDLE_LOCK when there is none.
class GlobalsLock {
 public:
  explicit GlobalsLock(const HostContext& context)
      : lock_(*context.in->cb, context.in->global_data) {}
  EffectGlobals* operator->() const { return lock_.as<EffectGlobals>(); }

 private:
  HandleLock lock_;
};

// Opens the string table, makes the global data, and tells the host what the effect is. On failure
// nothing is left behind: "Calmframe could not be initialized." is the message, and the host's code
// or HX_ERR_MEMORY is thrown.
void OpenPlugin(const HostContext& context, const HX_StringTable& strings);

// Takes back what OpenPlugin made; nothing when there is no global data.
void ClosePlugin(const HostContext& context);

}  // namespace kelp::effect
