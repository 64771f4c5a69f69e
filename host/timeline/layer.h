#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "host/timeline/source.h"

namespace calmframe::host {

// An effect in a layer's chain, as the node graph tells of it.
struct EffectOperator {
  std::uint32_t runtime_id = 0;  // of NewRuntimeId; in this process alone
  std::string match_name;
  // Tells all that the effect's result depends on but its input; equal in every process for equal
  // settings. Empty is legal.
  std::string parameters;
  // What the effect does to the frames that pass it, in full size, on any thread; it must do what
  // match_name and parameters tell. Null: nothing.
  std::function<void(std::int64_t frame, Picture& picture)> draw;
};

// A source on the timeline. Sequence time is media time: frame n of the source stands from
// n * ticks_per_frame on, and the layer shows frames start_frame .. start_frame + length - 1.
struct LayerState {
  SourcePtr source;                  // never null
  std::int32_t start_frame = 0;      // in-point; may be negative
  std::int32_t length = 0;           // in frames
  std::int64_t ticks_per_frame = 1;  // above 0
  std::int32_t field_type = HX_FIELD_PROGRESSIVE;
  std::vector<EffectOperator> effects;  // the first acts first
  std::string name, file_name;          // UTF-8; no part of any identity
  std::string refusal;                  // why the layer can't be analysed; empty: it can
};

// Of each effect of a process its own; never 0.
std::uint32_t NewRuntimeId();

// Any thread. Readers get a state that stays as it is while they hold it.
class Layer {
 public:
  // The whole source at its own rate and field order.
  explicit Layer(const SourcePtr& source);

  boost::shared_ptr<const LayerState> state() const;

  // Publishes a changed copy of the state; changes come one after the other. Throws
  // std::invalid_argument if it lacks a source or a frame duration. Node references that
  // were given before go on showing the old state.
  void Change(const std::function<void(LayerState& state)>& change);

  // Span and effects stay; rate and field order become the new source's.
  void ReplaceMedia(const SourcePtr& source);
  // The media delivers frames of this size from now on.
  void Resize(int width, int height);

  // At `position` of the chain, 0 next to the source; limited to its end.
  void InsertEffect(std::size_t position, const EffectOperator& effect);
  // Without memory the effect goes with the next change.
  void RemoveEffect(std::uint32_t runtime_id) noexcept;
  // New identity text of an effect's settings.
  void SetParameters(std::uint32_t runtime_id, const std::string& parameters);

 private:
  std::mutex changing_;  // held by one change at a time
  // Effects that go with the next change; has room for all that are there. Guarded by changing_.
  std::vector<std::uint32_t> leaving_;
  mutable std::mutex mutex_;
  boost::shared_ptr<const LayerState> state_;  // guarded by mutex_
};

}  // namespace calmframe::host
