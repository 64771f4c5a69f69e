#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "host/effects/handle_store.h"
#include "host/effects/instance.h"
#include "host/effects/instance_registry.h"
#include "host/effects/opaque_store.h"
#include "host/effects/user_interface.h"
#include "host/effects/world_store.h"
#include "host/plugin/plugin_library.h"
#include "host/timeline/media_services.h"
#include "platform/tessel/config.h"

namespace calmframe::host {

struct HostSettings {
  MediaSettings media;
  std::string project_path;         // UTF-8; empty is legal
  bool keeps_analysis_raw = false;  // at first; see Host::KeepAnalysisRaw
  // Plug-ins declare their parameters for experts, too; the first host that loads one settles it
  // for as long as the process keeps the library. The solve's log, which comes with the option, is
  // shown where the environment asks for it.
  bool experimental_parameters = false;
};

// A plug-in in this process, started, and all that it may ask of its host. One at a time in a
// process, since the interface's functions carry no host. Operations that the plug-in asks for can
// be made to fail by Operations; what it does wrong is in the Ledger.
class Host {
 public:
  // Loads the library, starts the plug-in and collects its parameters. Throws PluginError, whose
  // line names the file and the cause.
  explicit Host(const std::string& library, const HostSettings& settings = {});
  explicit Host(PluginLibrary library, const HostSettings& settings = {});
  // Stop, if it was not called.
  ~Host();
  Host(const Host&) = delete;
  Host& operator=(const Host&) = delete;

  static Host* active();  // null when there is none

  // Stops the plug-in: its last command, an end to all renders and background tasks. All effects
  // and renderers are gone, and no other thread uses the host. The library stays loaded until the
  // host goes.
  CommandResult Stop();

  const PluginLibrary& library() const { return library_; }
  // Index 0 is the layer, the others are the plug-in's in their order.
  const std::vector<HX_ParamDef>& declarations() const { return declarations_; }
  // What the start told, beside what the property record does.
  std::uint32_t version() const { return version_; }
  std::uint32_t out_flags() const { return out_flags_; }
  std::uint32_t out_flags2() const { return out_flags2_; }
  // The text of the plug-in's about box.
  CommandResult About();

  const HostSettings& settings() const { return settings_; }
  // Whether plug-ins are asked not to compress what they save. Any thread.
  void KeepAnalysisRaw(bool raw) { keeps_analysis_raw_ = raw; }
  bool keeps_analysis_raw() const { return keeps_analysis_raw_; }
  MediaServices& media() { return media_; }
  UserInterface& user_interface() { return user_interface_; }
  HandleStore& handles() { return handles_; }
  OpaqueStore& opaque_data() { return opaque_data_; }
  WorldStore& worlds() { return worlds_; }
  InstanceRegistry& instances() { return instances_; }

  // What the plug-in holds of the host, and what it did wrong, a line each; empty when all is in
  // order. Whole after Stop.
  std::string LeakReport() const;

  // -- For the other half of the library --
  // Runs a command on the entry, with flags, message and handles preset; see Instance::Call.
  CommandResult Command(std::uint32_t command, HX_InData& in, HX_OutData& out,
                        HX_ParamDef* params[] = nullptr, HX_World* output = nullptr,
                        void* extra = nullptr);
  // Ends a wait, or the next one. Any thread; cheap, and many count as one.
  void Wake();
  // True when it was woken.
  bool WaitForWake(std::chrono::milliseconds time);
  // While one lives on a thread, Wake does nothing there: what a command asks for on the loop's own
  // thread is seen to without.
  class LoopCall {
   public:
    LoopCall();
    ~LoopCall();
    LoopCall(const LoopCall&) = delete;
    LoopCall& operator=(const LoopCall&) = delete;
  };

  // -- For the interface's functions --
  HX_Err AddParam(std::int32_t index, const HX_ParamDef& param);
  std::uint64_t OpenStrings(const HX_StringTable& table);
  const char* GetString(std::uint64_t token, std::int32_t index) const;
  void CloseStrings(std::uint64_t token);
  void CountParamCheckout(int change) { param_checkouts_ += change; }
  void CountDirectRender(int change) { direct_renders_ += change; }

 private:
  void Start();
  void DeclareParams();

  // Sets the debug option while it lives, where it is wanted and not set.
  class ExperimentalParameters {
   public:
    explicit ExperimentalParameters(bool wanted);
    ~ExperimentalParameters();
    ExperimentalParameters(const ExperimentalParameters&) = delete;
    ExperimentalParameters& operator=(const ExperimentalParameters&) = delete;

   private:
    const bool sets_;
  };

  const HostSettings settings_;
  std::atomic<bool> keeps_analysis_raw_;
  const ExperimentalParameters experimental_;
  PluginLibrary library_;
  MediaServices media_;
  UserInterface user_interface_;
  HandleStore handles_;
  OpaqueStore opaque_data_;
  WorldStore worlds_;
  InstanceRegistry instances_;

  std::vector<HX_ParamDef> declarations_;  // constant after construction
  bool declaring_ = false;
  std::uint32_t version_ = 0, out_flags_ = 0, out_flags2_ = 0;  // constant after construction
  std::atomic<HX_Handle> global_data_{nullptr};
  bool running_ = false;

  mutable std::mutex strings_mutex_;
  std::map<std::uint64_t, std::unique_ptr<tessel::config::StringTable>> strings_;  // guarded by it
  std::uint64_t last_token_ = 0;                                                   // guarded by it

  std::atomic<std::int64_t> param_checkouts_{0}, direct_renders_{0};

  std::mutex wake_mutex_;
  std::condition_variable woken_changed_;
  bool woken_ = false;  // guarded by wake_mutex_
};

}  // namespace calmframe::host
