#include "effect/entry.h"

#include <new>

namespace kelp::effect {
namespace {

void Report(GenericEffect& effect, void (GenericEffect::*report)()) noexcept {
  try {
    (effect.*report)();
  } catch (...) {  // the failure that was to be reported is the one that counts
  }
}

}  // namespace

HX_Err RunCommand(GenericEffect& effect) noexcept {
  try {
    Dispatch(effect);
    return HX_ERR_NONE;
  } catch (std::int32_t code) {
    return code;
  } catch (const std::bad_alloc&) {
    Report(effect, &GenericEffect::ReportOutOfMemory);
    return HX_ERR_MEMORY;
  } catch (...) {
    Report(effect, &GenericEffect::ReportUnknownException);
    return HX_ERR_UNKNOWN;
  }
}

}  // namespace kelp::effect
