#include "analysis/effect/deletions_parameter.h"

#include <memory>
#include <utility>

#include "analysis/effect/effect_parameters.h"
#include "effect/handle.h"
#include "effect/suite.h"

namespace kelp::analysis::effect {
namespace {

using kelp::effect::HandleLock;
using kelp::effect::OwnedHandle;
using kelp::effect::ParamCheckout;

using Set = std::unique_ptr<DeletedTrackPoints>;

HX_Handle NewValue(const HX_Callbacks& host, Set set) {
  OwnedHandle handle(host, std::uint64_t{sizeof(DeletedTrackPoints*)});
  if (!handle) throw std::int32_t{HX_ERR_MEMORY};
  {
    const HandleLock lock(host, handle.get());
    *lock.as<DeletedTrackPoints*>() = set.release();
  }
  return handle.release();
}

void DisposeOfValue(const HX_Callbacks& host, HX_Handle handle) {
  Set set;
  {
    const HandleLock lock(host, handle);
    set.reset(std::exchange(*lock.as<DeletedTrackPoints*>(), nullptr));
  }
  host.dispose_handle(handle);
}

DeletedTrackPoints SetOf(const HX_Callbacks& host, HX_Handle handle) {
  const HandleLock lock(host, handle);
  const DeletedTrackPoints* const set = *lock.as<DeletedTrackPoints*>();
  return set ? *set : DeletedTrackPoints();
}

void ExpectFlat(bool holds) {
  if (!holds) throw std::int32_t{HX_ERR_UNKNOWN};
}

// Null where the host has no such parameter. That is asked each time: a host tells nobody what it
// has beyond what the effect declared.
std::unique_ptr<const ParamCheckout> CheckOut(AnalysisEffect& effect) {
  const std::int32_t index = effect.ParamIdToIndex(kDeletedTrackPointsParam);
  if (index == kNoIndex) return nullptr;
  std::unique_ptr<const ParamCheckout> param;
  try {
    param = std::make_unique<const ParamCheckout>(effect.context(), index);
  } catch (std::int32_t) {
    return nullptr;
  }
  const bool is_it =
      (*param)->disk_id == kDeletedTrackPointsParam && (*param)->kind == HX_PARAM_ARBITRARY;
  return is_it ? std::move(param) : nullptr;
}

DeletedTrackPoints Value(const AnalysisEffect& effect, const HX_ParamDef& param) {
  const HX_Handle value = param.u.arb_d.value;
  return value ? SetOf(*effect.context().in->cb, value) : DeletedTrackPoints();
}

}  // namespace

void RunCustomDataOp(const kelp::effect::HostContext& context, HX_CustomDataExtra& extra) {
  if (extra.param_id != kDeletedTrackPointsParam) return;
  const HX_Callbacks& host = *context.in->cb;
  const auto copy_of = [&](HX_Handle handle) {
    return std::make_unique<DeletedTrackPoints>(SetOf(host, handle));
  };
  switch (extra.op) {
    case HX_DATA_NEW:
      extra.out = NewValue(host, std::make_unique<DeletedTrackPoints>());
      return;
    case HX_DATA_DISPOSE:
      DisposeOfValue(host, extra.a);
      return;
    case HX_DATA_COPY:
    case HX_DATA_INTERPOLATE:  // sets have nothing between them: the left one
      extra.out = NewValue(host, copy_of(extra.a));
      return;
    case HX_DATA_FLAT_SIZE:
      extra.size = static_cast<std::uint32_t>(SetOf(host, extra.a).FlatSize());
      return;
    case HX_DATA_FLATTEN: {
      const DeletedTrackPoints set = SetOf(host, extra.a);
      ExpectFlat(extra.buffer || set.empty());
      set.Flatten(extra.buffer);
      return;
    }
    case HX_DATA_UNFLATTEN:
      ExpectFlat(extra.size % sizeof(DeletedTrackPoints::Key) == 0 &&
                 (extra.buffer || extra.size == 0));
      extra.out = NewValue(host, std::make_unique<DeletedTrackPoints>(extra.buffer, extra.size));
      return;
    case HX_DATA_COMPARE: {
      const auto order = SetOf(host, extra.a) <=> SetOf(host, extra.b);
      extra.compare = order == 0 ? 0 : order < 0 ? -1 : 1;
      return;
    }
    default:
      return;
  }
}

std::optional<DeletedTrackPoints> ReadDeletedTrackPoints(AnalysisEffect& effect) {
  const std::unique_ptr<const ParamCheckout> param = CheckOut(effect);
  if (!param) return std::nullopt;
  return Value(effect, **param);
}

void ClearDeletedTrackPoints(AnalysisEffect& effect) {
  const std::unique_ptr<const ParamCheckout> present = CheckOut(effect);
  if (!present || Value(effect, **present).empty()) return;
  const kelp::effect::HostContext& context = effect.context();
  const HX_Callbacks& host = *context.in->cb;
  const kelp::effect::ScopedSuite<HX_ParamUtilsSuite3> suite(context);
  HX_ParamDef param = **present;
  param.u.arb_d.value = NewValue(host, std::make_unique<DeletedTrackPoints>());
  param.change_flag = 1;
  const HX_Err code = suite->SetParamValue(context.in->effect_ref,
                                           effect.ParamIdToIndex(kDeletedTrackPointsParam), &param);
  if (code != HX_ERR_NONE) DisposeOfValue(host, param.u.arb_d.value);
  kelp::effect::ThrowIfFailed(code);
}

}  // namespace kelp::analysis::effect
