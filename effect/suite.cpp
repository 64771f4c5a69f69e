#include "effect/suite.h"

#include "effect/host_text.h"

namespace kelp::effect {

SuiteReference::SuiteReference(const HostContext& context, SuiteId id, const char* message)
    : basic_(context.in->basic), id_(id) {
  if (basic_->acquire(id.name, id.version, &table_) == HX_ERR_NONE) return;
  ShowMessage(context, message);
  throw std::int32_t{HX_ERR_MISSING_SUITE};
}

}  // namespace kelp::effect
