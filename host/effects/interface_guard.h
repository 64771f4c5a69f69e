#pragma once

#include <memory>
#include <new>

#include "host/base/operations.h"
#include "host/effects/host.h"

// What every C function of the interface does first and last.
namespace calmframe::host {

// body(host) behind the operation's fault switch; what it throws becomes a code.
template <typename Body>
HX_Err WithHost(const char* operation, Body body) noexcept {
  try {
    if (const HX_Err code = BeginOperation(operation)) return code;
    Host* host = Host::active();
    return host ? body(*host) : HX_ERR_UNKNOWN;
  } catch (const std::bad_alloc&) {
    return HX_ERR_MEMORY;
  } catch (...) {
    return HX_ERR_UNKNOWN;
  }
}

// body(host, instance); an error for an effect that is no more.
template <typename Body>
HX_Err WithInstance(const char* operation, HX_EffectRef effect, Body body) noexcept {
  return WithHost(operation, [&](Host& host) -> HX_Err {
    const std::shared_ptr<Instance> instance = host.instances().Find(effect);
    return instance ? body(host, *instance) : HX_ERR_UNKNOWN;
  });
}

}  // namespace calmframe::host
