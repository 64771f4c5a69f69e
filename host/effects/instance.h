#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "host/effects/loop_wake.h"
#include "host/effects/render_context.h"
#include "host/effects/timeline_effect.h"
#include "platform/hx/hx_effect.h"

namespace calmframe::host {

class Host;

// What came of a command: the plug-in's code, and the message that it wanted shown, if any.
struct CommandResult {
  HX_Err code = HX_ERR_NONE;
  std::string message;

  bool ok() const { return code == HX_ERR_NONE; }
  // One line: what failed, the message or else the code.
  std::string Line(const std::string& what) const;
};

// One instance handle of an effect with the reference under which the plug-in knows it. References
// are never given twice. Commands on one instance come one at a time; which thread, its owner
// decides.
class Instance {
 public:
  // Registers the reference with the host and its media services.
  static std::shared_ptr<Instance> Make(Host& host, std::shared_ptr<TimelineEffect> effect);
  // The handle must have been destroyed by its command.
  ~Instance();
  Instance(const Instance&) = delete;
  Instance& operator=(const Instance&) = delete;

  const std::shared_ptr<TimelineEffect>& effect() const { return effect_; }
  HX_EffectRef ref() const { return ref_; }
  // For calls on the threads of commands: on others the host may be gone.
  Host& host() const { return host_; }
  LoopWake& wake() const { return *wake_; }
  HX_Handle handle() const { return handle_; }
  void SetHandle(HX_Handle handle) { handle_ = handle; }

  // Where a call stands: on which frame of the layer, counted from its in-point, and on which
  // frames it may work.
  struct Place {
    std::int64_t frame = 0;
    bool second_field = false;
    RenderContext* frames = nullptr;  // null: at 8 bit and full scale
    HX_World* input = nullptr;        // of params[0]; null: its size alone
  };

  // Runs the command with the records preset, all parameters in place (those that `frames` froze,
  // if it did), the handles taken back and the message kept, whatever the result. `out`, if given,
  // holds the presets that the command needs and then what it answered. Values that the plug-in
  // replaced in its parameters, by change_flag, are taken over. HX_ERR_MEMORY, and no call, where
  // there is no memory for the records.
  CommandResult Call(std::uint32_t command, const Place& place, HX_World* output = nullptr,
                     void* extra = nullptr, HX_OutData* out = nullptr);

  // Takes the instance apart, without parameters; tried a second time when the plug-in fails and
  // keeps the handle. One that is kept still is a mistake in the Ledger.
  void Destroy(const Place& place) noexcept;

  // As the call that is under way sees it, for the interface's functions; none outside the table.
  std::optional<HX_ParamDef> Param(std::int32_t index) const;
  // Of the call that is under way, for the interface's functions; null outside.
  RenderContext* frames() const { return frames_; }
  // The layer as the call that is under way sees it, so that both commands of a render see one;
  // outside of calls as it is now. Any thread.
  boost::shared_ptr<const LayerState> layer() const;

 private:
  Instance(Host& host, std::shared_ptr<TimelineEffect> effect);

  CommandResult Run(std::uint32_t command, const Place& place, RenderContext& frames,
                    HX_ParamDef** params, HX_World* output, void* extra, HX_OutData& out);
  // In `own`: for a call of no render.
  RenderContext& FullFrames(std::optional<RenderContext>& own) const;
  void SetLayerOfCall(boost::shared_ptr<const LayerState> layer);

  Host& host_;
  const std::shared_ptr<LoopWake> wake_;
  const std::shared_ptr<TimelineEffect> effect_;
  HX_EffectRef ref_ = nullptr;  // constant after Make
  HX_Handle handle_ = nullptr;
  RenderContext* frames_ = nullptr;
  mutable std::mutex mutex_;
  boost::shared_ptr<const LayerState> layer_of_call_;  // guarded by mutex_; null outside of calls
};

}  // namespace calmframe::host
