#include <memory>
#include <utility>

#include "analysis/effect/effect_parameters.h"
#include "effect/suite.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/stabilizer_effect.h"

// StabilizerEffect and the block that it shares with its renders.
namespace kelp::effect {

using analysis::FrameStatus;

namespace {

std::uint64_t EffectReference(const HostContext& context) {
  const ScopedSuite<HX_UtilitySuite> utility(context, HX_UTILITY_SUITE_VERSION_4);
  std::uint64_t reference = 0;
  ThrowIfFailed(utility->GetEffectReference(context.in->effect_ref, &reference));
  return reference;
}

}  // namespace

void StabilizerEffect::PublishSharedData() {
  const StabilizerState* const state = GetState();
  if (!state || !state->shared || state->keep_jobs) return;
  // The status asks the host, so it comes last and ahead of the lock.
  const auto framing = static_cast<Framing>(GetPopupParam(kFramingIndex));
  const SolveResult& solve = *state->solve_result;
  const bool gpu_allowed = solve.warper && framing != Framing::synthesize_edges &&
                           (!crops(framing) || solve.crop) &&
                           GetStatusForFrame(state->table().first_frame) == FrameStatus::Ready;
  state->Publish(gpu_allowed);
}

void StabilizerEffect::AttachSharedData(bool skip_publish) {
  StabilizerState* const state = GetState();
  if (!state || state->shared) return;
  const ScopedSuite<HX_OpaqueEffectDataSuite1> opaque(context());
  const std::uint64_t reference = EffectReference(context());
  void* block = nullptr;
  ThrowIfFailed(opaque->Find(reference, &block));
  if (!block) {
    auto own = std::make_unique<StabilizerSharedData>();
    ThrowIfFailed(opaque->Set(reference, own.get(), &block));
    if (block == own.get()) static_cast<void>(own.release());  // else another was first
  }
  state->shared = static_cast<StabilizerSharedData*>(block);
  if (!skip_publish) PublishSharedData();
}

bool StabilizerEffect::DetachSharedData() {
  StabilizerState* const state = GetState();
  if (!state || !state->shared) return false;
  const ScopedSuite<HX_OpaqueEffectDataSuite1> opaque(context());
  const std::uint64_t reference = EffectReference(context());
  std::uint8_t last = 0;
  ThrowIfFailed(opaque->Release(reference, &last));
  StabilizerSharedData* const block = std::exchange(state->shared, nullptr);
  if (last) delete block;
  return last != 0;
}

}  // namespace kelp::effect
