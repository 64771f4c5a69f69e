#pragma once

#include <functional>
#include <map>
#include <string>

#include "effect/suite.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

namespace calmframe::host {

// The records that the host hands to an effect on a layer, for tests of what is called with those
// alone. They are good for callbacks and suites of any thread. The effect itself does nothing.
class HostRecords : public testing::Test {
 protected:
  static constexpr int kWidth = 24, kHeight = 10, kFrames = 10;

  // `on_draw` as in ShakyClip.
  explicit HostRecords(const std::function<void(std::int64_t frame)>& on_draw = {})
      : hosted_(ShakyClip{kWidth, kHeight, kFrames, "clip", 1, {16, 15}, on_draw}) {
    hosted_.Apply();
    hosted_.Inside([this](const auto& effect) { in_ = *effect.context().in; });
    basic_ = in_.basic;
    answering_ = {Acquire, basic_->release};
    in_.basic = &answering_;
  }
  ~HostRecords() override { replaced_.clear(); }

  // The table of a suite that the host answers with from now on, for the test to change: a copy of
  // its own, which kHosts keeps.
  template <class Table>
  static Table& Changed(std::int32_t version = kelp::effect::kSuite<Table>.version) {
    static Table changed;
    const char* const name = kelp::effect::kSuite<Table>.name;
    const void* table = nullptr;
    EXPECT_EQ(basic_->acquire(name, version, &table), HX_ERR_NONE);
    basic_->release(name, version);
    kHosts<Table> = *static_cast<const Table*>(table);
    replaced_[name] = &changed;
    return changed = kHosts<Table>;
  }
  template <class Table>
  static inline Table kHosts{};

  Layer& layer() { return hosted_.layer(); }
  MediaServices& media() { return hosted_.host().media(); }

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

  HostedEffect hosted_;
  HX_InData in_{};
  HX_OutData out_{};
  const kelp::effect::HostContext context_ = kelp::effect::RecordsOnly(&in_, &out_);

 private:
  static HX_Err Acquire(const char* name, std::int32_t version, const void** table) {
    const HX_Err code = basic_->acquire(name, version, table);
    const auto found = replaced_.find(name);
    if (code == HX_ERR_NONE && found != replaced_.end()) *table = found->second;
    return code;
  }

  static inline HX_BasicSuite answering_{};
  static inline const HX_BasicSuite* basic_ = nullptr;
  static inline std::map<std::string, const void*> replaced_;
};

}  // namespace calmframe::host
