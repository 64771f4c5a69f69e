#pragma once

#include <atomic>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "host/effects/param_table.h"
#include "host/timeline/layer.h"

namespace calmframe::host {

// Keeps the pieces of an analysis while it is under way, and finds those of an earlier process: see
// HX_AnalysisKeepingSuite1. None of them throws.
class AnalysisKeeper {
 public:
  virtual ~AnalysisKeeper() = default;
  virtual bool Wants() noexcept = 0;
  virtual void Keep(std::size_t number, const std::uint8_t* bytes, std::size_t size) noexcept = 0;
  // Null behind the last. Good until the next call.
  virtual const std::vector<std::uint8_t>* Find(std::size_t number) noexcept = 0;
};

// What all instances of one effect on the timeline share. Any thread.
class TimelineEffect {
 public:
  // `declared`: see Host::declarations. The effect is not in the layer's chain yet.
  TimelineEffect(boost::shared_ptr<Layer> layer, std::vector<HX_ParamDef> declared);

  const boost::shared_ptr<Layer>& layer() const { return layer_; }
  std::uint64_t reference() const { return reference_; }    // HX_UtilitySuite.GetEffectReference
  std::uint32_t runtime_id() const { return runtime_id_; }  // HX_UtilitySuite.GetRuntimeInstanceID
  ParamTable& params() { return params_; }

  // Frames rendered under another generation are out of date.
  std::uint64_t generation() const { return generation_; }
  void InvalidateRenders() { ++generation_; }

  // What the plug-in wanted the user to see, oldest first; each is given out once. Past 100 the
  // oldest go; one that there is no memory for is lost.
  void AddMessage(const std::string& text) noexcept;
  std::vector<std::string> TakeMessages();

  // Who keeps an analysis that is under way; null: nobody. The session's thread.
  void SetKeeper(std::shared_ptr<AnalysisKeeper> keeper) { keeper_ = std::move(keeper); }
  const std::shared_ptr<AnalysisKeeper>& keeper() const { return keeper_; }

  // Outline of a frame as its last render told it, x and y of each vertex; empty if none did.
  void SetPolygon(std::int32_t frame, std::vector<float> xy);
  std::vector<float> PolygonOf(std::int32_t frame) const;

 private:
  const boost::shared_ptr<Layer> layer_;
  const std::uint64_t reference_;
  const std::uint32_t runtime_id_;
  ParamTable params_;
  std::shared_ptr<AnalysisKeeper> keeper_;
  std::atomic<std::uint64_t> generation_{1};
  mutable std::mutex mutex_;
  std::vector<std::string> messages_;                    // guarded by mutex_
  std::map<std::int32_t, std::vector<float>> polygons_;  // guarded by mutex_
};

}  // namespace calmframe::host
