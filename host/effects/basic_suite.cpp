#include <cstdio>

#include "host/effects/interface_guard.h"
#include "host/effects/interface_tables.h"

// A plug-in needs suites to give back what it has, so that they are to be had without memory.
namespace calmframe::host {
namespace {

HX_Err Acquire(const char* name, std::int32_t version, const void** table) {
  const std::string_view suite = name ? name : "";
  char operation[128];
  std::snprintf(operation, sizeof operation, "acquire %s", name ? name : "");
  return WithLent(operation, [&](Lent&) -> HX_Err {
    const void* found = FindEffectSuite(suite, version);
    if (!found) found = MediaServices::FindSuite(suite, version);
    if (!found) return HX_ERR_MISSING_SUITE;
    Ledger::Get().Take(suite);
    *table = found;
    return HX_ERR_NONE;
  });
}

HX_Err Release(const char* name, std::int32_t) {
  Ledger::Get().GiveBack(name ? name : "");
  return HX_ERR_NONE;
}

}  // namespace

const HX_BasicSuite& BasicSuite() {
  static const HX_BasicSuite basic = {Acquire, Release};
  return basic;
}

}  // namespace calmframe::host
