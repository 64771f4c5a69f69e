#pragma once

#include <cstdint>

#include "effect/host_context.h"

namespace kelp::effect {

// One operation for each of the host's commands, all of them empty here. An effect object is a view
// over one host call: it owns nothing, holds nothing but the context, and lives on the entry's
// stack. Operations report failures by throwing; see ThrowIfFailed.
//
// The order of the operations is the order of the table that other callers know; new ones go to the
// end, in a class below.
class GenericEffect {
 public:
  virtual void ShowAbout() {}
  virtual void PrepareFrame() {}
  virtual void StartPlugin() {}
  virtual void DeclareParams() {}
  virtual void StopPlugin() {}
  virtual void CreateInstance() {}
  virtual void RestoreInstance() {}
  virtual void FlattenInstance() {}
  virtual void OpenOptions() {}
  virtual void ParamChanged() {}
  virtual void RefreshParams() {}
  virtual void DestroyInstance() {}
  virtual void IdleTick() {}
  virtual void RenderFrame() {}
  virtual void PlanFrame() {}
  virtual void RenderPlannedFrame() {}
  virtual void CustomDataOp() {}

  // One for each type of event that the host may send.
  virtual void Event0() {}
  virtual void Event1() {}
  virtual void Event2() {}
  virtual void Event3() {}
  virtual void Event4() {}
  virtual void Event5() {}
  virtual void Event6() {}
  virtual void Event7() {}
  virtual void Event9() {}
  virtual void Event10() {}
  virtual void Event11() {}

  // Hands the event of HX_EventExtra to its operation; types without one are ignored.
  virtual void DispatchEvent();

  // Called by the entry while it handles the failure.
  virtual void ReportOutOfMemory() = 0;
  virtual void ReportUnknownException() = 0;

  // Adds the parameter of that index through the host and answers the host's code; index 0 is the
  // host's own and adds nothing.
  virtual HX_Err AddParam(std::int32_t index) = 0;

  const HostContext& context() const { return context_; }

 protected:
  explicit GenericEffect(const HostContext& context) noexcept : context_(context) {}
  // Not virtual: it would stand in the table, and nobody owns an effect by its base.
  ~GenericEffect() = default;
  GenericEffect(const GenericEffect&) = delete;
  GenericEffect& operator=(const GenericEffect&) = delete;

  // Adds the parameters 0 to count - 1 in rising order and tells the host their number.
  void DeclareParamCount(std::int32_t count);

 private:
  const HostContext context_;
};

// The operation of the context's command; commands without one do nothing.
void Dispatch(GenericEffect& effect);

}  // namespace kelp::effect
