#pragma once

#include <memory>
#include <new>

#include "host/base/operations.h"
#include "host/effects/host.h"

// What every C function of the interface does first and last.
namespace calmframe::host {

// body() behind the operation's fault switch; what it throws becomes a code.
template <typename Body>
HX_Err Guarded(const char* operation, Body body) noexcept {
  try {
    if (const HX_Err code = BeginOperation(operation)) return code;
    return body();
  } catch (const std::bad_alloc&) {
    return HX_ERR_MEMORY;
  } catch (...) {
    return HX_ERR_UNKNOWN;
  }
}

// body(host) of the calling host; for what is asked on the loop's thread alone.
template <typename Body>
HX_Err WithHost(const char* operation, Body body) noexcept {
  return Guarded(operation, [&]() -> HX_Err {
    Host* host = Host::calling();
    return host ? body(*host) : HX_ERR_UNKNOWN;
  });
}

// body(lent).
template <typename Body>
HX_Err WithLent(const char* operation, Body body) noexcept {
  return Guarded(operation, [&]() -> HX_Err {
    Lent* lent = Lent::active();
    return lent ? body(*lent) : HX_ERR_UNKNOWN;
  });
}

// Null for an effect that is no more.
inline std::shared_ptr<Instance> FindInstance(HX_EffectRef effect) {
  Lent* lent = Lent::active();
  return lent ? lent->instances.Find(effect) : nullptr;
}

// body(instance); an error for an effect that is no more.
template <typename Body>
HX_Err WithInstance(const char* operation, HX_EffectRef effect, Body body) noexcept {
  return Guarded(operation, [&]() -> HX_Err {
    const std::shared_ptr<Instance> instance = FindInstance(effect);
    return instance ? body(*instance) : HX_ERR_UNKNOWN;
  });
}

}  // namespace calmframe::host
