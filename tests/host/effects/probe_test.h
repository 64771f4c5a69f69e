#pragma once

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "platform/hx/hx.h"
#include "tests/host/timeline/drawn_media.h"

namespace calmframe::host {

inline constexpr int kClipWidth = 23, kClipHeight = 20, kClipFrames = 10;

inline boost::shared_ptr<Layer> MakeDrawnLayer() {
  const SourceInfo info = DrawnInfo(kClipWidth, kClipHeight, kClipFrames);
  return boost::make_shared<Layer>(MakeDrawnSource(info, DrawFrame));
}

// A host of a plug-in that does at each command what the test wants; what it leaves behind or does
// wrong fails the test. One at a time.
class ProbeTest : public testing::Test {
 protected:
  struct Call {
    std::uint32_t command;
    HX_InData* in;
    HX_OutData* out;
    HX_ParamDef** params;
    HX_World* output;
    void* extra;
    const HX_Callbacks& cb() const { return *in->cb; }
    HX_EffectRef ref() const { return in->effect_ref; }
    // Goes back with the pointer.
    template <class Table>
    std::shared_ptr<const Table> Suite(const char* name, std::int32_t version) const {
      const void* table = nullptr;
      EXPECT_EQ(in->basic->acquire(name, version, &table), HX_ERR_NONE) << name;
      return {static_cast<const Table*>(table),
              [=, basic = in->basic](const Table*) { basic->release(name, version); }};
    }
  };
  using Deed = std::function<HX_Err(const Call&)>;

  ProbeTest() { current_ = this; }
  ~ProbeTest() override { current_ = nullptr; }
  void TearDown() override {
    Operations::Get().FailNone();
    if (host) {
      EXPECT_EQ(LeftBehind(), "");
    }
  }

  static PluginLibrary Probe() {
    PluginProperties record;
    record.match_name = "Probe";
    return PluginLibrary(
        [](std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
           HX_World* output, void* extra) -> HX_Err {
          const auto deed = current_->on.find(command);
          if (deed == current_->on.end()) return HX_ERR_NONE;
          return deed->second({command, in, out, params, output, extra});
        },
        record);
  }

  // Starts the plug-in.
  void Start() {
    host = std::make_unique<Host>(Probe());
    host->worlds().SetRowPadding(8);
    host->handles().MoveOnUnlock(true);
    session = std::make_unique<Session>(*host);
  }
  // What the plug-in holds, and did wrong, when all is gone.
  std::string LeftBehind() {
    session.reset();
    EXPECT_TRUE(host->Stop().ok());
    const std::string report = host->LeakReport();
    host.reset();
    return report;
  }

  std::map<std::uint32_t, Deed> on;  // by command; none: it does nothing
  std::unique_ptr<Host> host;
  std::unique_ptr<Session> session;

 private:
  static inline ProbeTest* current_ = nullptr;
};

}  // namespace calmframe::host
