#include "stabilizer/effect/src/shared_service.h"

#include <memory>
#include <utility>

#include "effect/suite.h"

namespace kelp::effect {
namespace {

std::uint64_t EffectReference(const HostContext& context) {
  const ScopedSuite<HX_UtilitySuite> utility(context, HX_UTILITY_SUITE_VERSION_4);
  std::uint64_t reference = 0;
  ThrowIfFailed(utility->GetEffectReference(context.in->effect_ref, &reference));
  return reference;
}

}  // namespace

void AttachBlock(const HostContext& context, StabilizerState& state) {
  const ScopedSuite<HX_OpaqueEffectDataSuite1> opaque(context);
  const std::uint64_t reference = EffectReference(context);
  void* block = nullptr;
  ThrowIfFailed(opaque->Find(reference, &block));
  if (!block) {
    auto own = std::make_unique<StabilizerSharedData>();
    ThrowIfFailed(opaque->Set(reference, own.get(), &block));
    if (block == own.get()) static_cast<void>(own.release());  // else another was first
  }
  state.shared = static_cast<StabilizerSharedData*>(block);
}

bool DetachBlock(const HostContext& context, StabilizerState& state) {
  const ScopedSuite<HX_OpaqueEffectDataSuite1> opaque(context);
  const std::uint64_t reference = EffectReference(context);
  std::uint8_t last = 0;
  ThrowIfFailed(opaque->Release(reference, &last));
  StabilizerSharedData* const block = std::exchange(state.shared, nullptr);
  if (last) delete block;
  return last != 0;
}

}  // namespace kelp::effect
