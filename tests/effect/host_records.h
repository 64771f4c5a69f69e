#pragma once

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>

#include "host/base/operations.h"
#include "host/effects/session.h"

namespace calmframe::host {

// An effect that stands on a layer of the host, and the records that the host hands to it, for
// tests of what is called with those alone. They are good for callbacks and suites of any thread.
// At the end nothing that was lent may be missing.
class HostRecords : public testing::Test {
 protected:
  static constexpr int kWidth = 24, kHeight = 10, kFrames = 10;

  // Of a clip of 25 frames a second, with pixels of 16:15. `draw` fills a frame, on a thread of the
  // host.
  explicit HostRecords(const std::function<void(std::int64_t, Picture&)>& draw = {})
      : host_(std::make_unique<Host>(Linked())), session_(std::make_unique<Session>(*host_)) {
    host_->handles().MoveOnUnlock(true);
    SourceInfo info;
    info.width = kWidth;
    info.height = kHeight;
    info.frame_count = kFrames;
    info.pixel_aspect = {16, 15};
    info.content = tessel::utility::Guid::FromText("clip");
    layer_ = boost::make_shared<Layer>(MakeDrawnSource(info, [draw](auto frame, Picture& picture) {
      if (draw) draw(frame, picture);
    }));
    effect_ = &session_->Apply(layer_);
    effect_->Tick();
    in_ = seen_;
    basic_ = in_.basic;
    in_.basic = &kBasic;
  }

  void TearDown() override {
    Operations::Get().FailNone();
    replaced_.clear();
    session_.reset();
    host_->Stop();
    EXPECT_EQ(host_->LeakReport(), "");
  }

  // The host answers with this table, of the test's, where the suite is asked for.
  static void Replace(const char* suite, const void* table) { replaced_[suite] = table; }
  template <class Table>
  Table TableOf(const char* suite, std::int32_t version) const {
    const void* table = nullptr;
    EXPECT_EQ(basic_->acquire(suite, version, &table), HX_ERR_NONE);
    basic_->release(suite, version);
    return *static_cast<const Table*>(table);
  }

  // What the layer shows of the clip's frames.
  void Place(std::int32_t start_frame, std::int32_t length) {
    layer_->Change([=](LayerState& state) {
      state.start_frame = start_frame;
      state.length = length;
    });
  }

  // The code that was thrown, 0 if none.
  static HX_Err Thrown(const std::function<void()>& body) {
    try {
      body();
      return HX_ERR_NONE;
    } catch (std::int32_t code) {
      return code;
    }
  }
  // What was shown since the last look.
  std::string TakeMessage() {
    const bool shown = out_.out_flags & HX_OUT_FLAG_SHOW_MESSAGE;
    const std::string text = out_.return_msg;
    out_.out_flags = 0;
    out_.return_msg[0] = '\0';
    return shown ? text : "";
  }

  std::unique_ptr<Host> host_;
  std::unique_ptr<Session> session_;
  boost::shared_ptr<Layer> layer_;
  Effect* effect_ = nullptr;
  HX_InData in_{};
  HX_OutData out_{};

 private:
  static PluginLibrary Linked() {
    PluginProperties properties;
    properties.match_name = "standing effect";
    return PluginLibrary(Entry, properties);
  }
  // Declares one slider.
  static HX_Err Entry(std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef*[],
                      HX_World*, void*) {
    if (command == HX_CMD_IDLE_TICK) seen_ = *in;
    if (command != HX_CMD_DECLARE_PARAMS) return HX_ERR_NONE;
    HX_ParamDef slider{};
    slider.kind = HX_PARAM_FLOAT_SLIDER;
    slider.u.fs.value = 0.5;
    out->num_params = 2;
    return in->cb->add_param(in->effect_ref, -1, &slider);
  }
  static HX_Err Acquire(const char* name, std::int32_t version, const void** table) {
    const HX_Err code = basic_->acquire(name, version, table);
    const auto found = replaced_.find(name);
    if (code == HX_ERR_NONE && found != replaced_.end()) *table = found->second;
    return code;
  }
  static HX_Err Release(const char* name, std::int32_t version) {
    return basic_->release(name, version);
  }

  static constexpr HX_BasicSuite kBasic = {Acquire, Release};
  static inline HX_InData seen_{};
  static inline const HX_BasicSuite* basic_ = nullptr;
  static inline std::map<std::string, const void*> replaced_;
};

}  // namespace calmframe::host
