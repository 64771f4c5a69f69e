#include "host/effects/interface_guard.h"
#include "host/effects/interface_tables.h"

namespace calmframe::host {
namespace {

HX_Err Acquire(const char* name, std::int32_t version, const void** table) {
  const std::string suite = name ? name : "";
  const HX_Err code = WithHost(("acquire " + suite).c_str(), [&](Host& host) -> HX_Err {
    const void* found = FindEffectSuite(suite, version);
    if (!found) found = host.media().FindSuite(suite, version);
    if (!found) return HX_ERR_MISSING_SUITE;
    *table = found;
    Ledger::Get().Take("suite " + suite);
    return HX_ERR_NONE;
  });
  return code;
}

HX_Err Release(const char* name, std::int32_t) {
  Ledger::Get().GiveBack(std::string("suite ") + (name ? name : ""));
  return HX_ERR_NONE;
}

}  // namespace

const HX_BasicSuite& BasicSuite() {
  static const HX_BasicSuite basic = {Acquire, Release};
  return basic;
}

}  // namespace calmframe::host
