#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "analysis/effect/deleted_track_points.h"
#include "platform/hx/hx.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/effect/fake_host.h"
#include "tests/support/shaken_table.h"
#include "tests/support/shifting_warper.h"

namespace kelp::effect {

HX_Err Entry(std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
             HX_World* output, void* extra);

// A frame buffer of memory of its own.
class TestWorld {
 public:
  TestWorld(int width, int height, std::int32_t depth, int origin_x = 0, int origin_y = 0);
  TestWorld(TestWorld&&) = default;
  TestWorld& operator=(TestWorld&&) = default;
  HX_World* get() { return &world_; }
  // One channel, 0 to 1: 0 alpha, 1 red, 2 green, 3 blue.
  double At(int x, int y, int channel) const;
  void Set(int x, int y, double red, double green);
  bool operator==(const TestWorld& other) const { return bytes_ == other.bytes_; }

 private:
  std::vector<unsigned char> bytes_;
  HX_World world_{};
};

// The stabilizer, started, on a layer of 640 x 360 at 25 frames a second, over the two fakes. At
// its end everything is destroyed, the plug-in is stopped, and nothing may be missing.
class StabilizerHost {
 public:
  explicit StabilizerHost(std::int32_t frames = 20);
  ~StabilizerHost();

  FakeHost host;
  analysis::FakeHost layer;

  HX_Err Call(std::uint32_t command, HX_World* output = nullptr, void* extra = nullptr);
  HX_Err Tick() { return Call(HX_CMD_IDLE_TICK); }
  // Until no solve is wanted; waits for each.
  void TickUntilSolved();
  // Destroys the instance of the host-in, which may be replaced then.
  void Destroy();

  // A user interface instance with a finished analysis of that table, and nothing solved.
  StabilizerState& Analysed(const marrow::tracking::AllFeatures& table);
  // The same with the warps of a solve that fits the parameters, published.
  StabilizerState& Solved(boost::shared_ptr<const marrow::stabilization::CPWarper> warper,
                          boost::shared_ptr<const cropper> crop);
  // A render's instance in its place; the host-in then has its handle.
  StabilizerState& RenderCopy();
  // The effect of a call.
  StabilizerEffect Effect();
  StabilizerState* state() { return Effect().GetState(); }

  // A parameter behind the effect's own that holds deleted track points, as a host that keeps them
  // has it; made when it is first set.
  void SetDeletions(const analysis::effect::DeletedTrackPoints& deletions);
  analysis::effect::DeletedTrackPoints Deletions();
  HX_ParamDef& deletions_param() { return host.params.back(); }

  void Set(std::int32_t index, double value);
  double Value(std::int32_t index) const;
  bool Enabled(std::int32_t index) const;
  std::string Name(std::int32_t index) const;
  // What AnalysisStatusCounter tells.
  int Status() const;

  // The opaque data of the one reference.
  std::mutex opaque_mutex;
  void* opaque = nullptr;
  int opaque_uses = 0;

  bool prefers_raw = false;  // payloads of flattened instances

  // Of the last polygon.
  std::vector<float> polygon;
  std::int32_t polygon_frame = -1;

  // The planned path: what was ordered, id to time in seconds, and the pixels behind each order.
  std::map<std::int32_t, double> orders;
  int layers_out = 0;  // checked out and not yet back
  std::int32_t refused_layer = -1;
  HX_World* pixels = nullptr;
  HX_PlanExtra plan{};
  HX_Err Plan(const HX_Rect& request, std::int32_t depth);
  HX_Err RenderPlan(TestWorld& output, std::int32_t depth);

 private:
  HX_CustomDataExtra DataOp(std::int32_t op, HX_Handle a, std::vector<char>* flat = nullptr);
  void PointAtParams();

  std::vector<HX_ParamDef*> params_;
  bool keeps_deletions_ = false;
  std::vector<HX_Handle> handles_;  // of instances set aside
};

}  // namespace kelp::effect
