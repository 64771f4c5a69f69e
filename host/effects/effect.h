#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "host/effects/instance.h"
#include "host/effects/renderer.h"
#include "host/effects/track_point.h"

namespace calmframe::host {

// An effect as a project keeps it.
struct SavedEffect {
  std::string match_name;
  ParamValues values;
  std::vector<std::uint8_t> instance;  // flattened; empty: there was none
};

// An effect on a layer, as the user has it before them. Session makes and keeps it; all operations
// but MakeRenderer, shared() and opaque_data() belong to the session's thread.
class Effect {
 public:
  // Made by the user, or taken from a project. `position` in the layer's chain of effects, 0 next
  // to the source. What the plug-in says to it is in creation(); the effect stands in any case.
  Effect(Host& host, boost::shared_ptr<Layer> layer, std::size_t position);
  Effect(Host& host, boost::shared_ptr<Layer> layer, std::size_t position,
         const SavedEffect& saved);
  // Takes the effect off the layer. Renderers may go on.
  ~Effect();
  Effect(const Effect&) = delete;
  Effect& operator=(const Effect&) = delete;

  const CommandResult& creation() const { return creation_; }
  const std::shared_ptr<TimelineEffect>& shared() const { return shared_; }

  // -- Controls; by index or by disk id --
  std::optional<HX_ParamDef> Param(std::int32_t index) const { return shared_->params().At(index); }
  std::int32_t IndexOf(std::int32_t disk_id) const { return shared_->params().IndexOf(disk_id); }
  // The value is clamped to what is valid. The plug-in hears of a change at once where it wants to,
  // and refreshes its controls. An error for an index without a value and for what is no number.
  CommandResult SetParam(std::int32_t index, double value);
  // An error, and no call, for a disabled button and for what is none.
  CommandResult Press(std::int32_t index);

  // The tracks that these points lie on, and no others, are left out when the effect solves, which
  // it does anew from its next tick on if that is a change; without points all are there again. A
  // point stands for the track that began last in its slot, at its frame or before; one on none
  // means nothing. An analysis forgets them. What is saved keeps those of its solve, and a loaded
  // effect leaves them out until this is called. An error of a plug-in that knows no such tracks.
  CommandResult DeleteTracks(const std::vector<TrackPoint>& points);

  // -- Upkeep --
  CommandResult Tick();
  CommandResult Refresh();  // of controls and readouts
  // Frame of the layer that the user looks at, counted from its in-point.
  void SetPlayhead(std::int64_t frame) { playhead_ = frame; }
  std::vector<std::string> TakeMessages() { return shared_->TakeMessages(); }

  // The effect lives on, as it would come back from a project. Fails with the plug-in's code; then
  // `saved` stands unchanged. Null: nobody wants the bytes.
  CommandResult Save(SavedEffect* saved);

  // Any thread, while the effect stands on its layer.
  std::unique_ptr<Renderer> MakeRenderer() { return std::make_unique<Renderer>(host_, shared_); }

  // The block that the plug-in's exports take (PluginExports), null if the plug-in keeps none. It
  // is there, at one address, as long as the effect stands on its layer. Any thread until then.
  const void* opaque_data() const;

 private:
  Effect(Host& host, boost::shared_ptr<Layer> layer);  // on no layer yet
  void PutOnLayer(std::size_t position);
  CommandResult Command(std::uint32_t command, void* extra = nullptr);
  // Takes a flattened handle back into work.
  CommandResult Restore();
  CommandResult TellChange(std::int32_t index);
  // Of a value of the parameter that holds the deleted tracks.
  CommandResult DeletionsOp(HX_CustomDataExtra& extra);
  // The last one that the effect was given, and the one that it may have put in its place.
  void DisposeOfDeletions();

  Host& host_;
  const std::shared_ptr<TimelineEffect> shared_;
  const std::shared_ptr<Instance> instance_;
  // Keeps what the plug-in shares among its instances while a save takes the other one apart.
  std::unique_ptr<Renderer> standing_;
  CommandResult creation_;
  // Set while the handle is flattened, when it may be restored or destroyed and nothing else.
  HX_Handle flattened_ = nullptr;
  HX_Handle deletions_ = nullptr;  // as they were given
  std::int64_t playhead_ = 0;
};

}  // namespace calmframe::host
