#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "host/effects/instance.h"
#include "host/effects/lent.h"
#include "host/effects/loop_wake.h"
#include "host/effects/payload_form.h"
#include "host/effects/user_interface.h"
#include "host/plugin/plugin_library.h"
#include "host/timeline/media_services.h"

namespace calmframe::host {

struct HostSettings {
  MediaSettings media;
  std::string project_path;                      // UTF-8; empty is legal
  PayloadForm saves_as = PayloadForm::deflated;  // at first; see Host::SaveAs
  // Plug-ins declare their parameters for experts, too; the first host that loads one settles it
  // for as long as the process keeps the library. The solve's log, which comes with the option, is
  // shown where the environment asks for it.
  bool experimental_parameters = false;
};

// A plug-in in this process, started, and all that it may ask of its host. Several in a process
// work side by side, each with effects, media and a loop of its own, and each on a thread of its
// own; what they have lent is in one place (Lent), since most of the interface's functions carry no
// host. Operations that the plug-in asks for can be made to fail by Operations; what it does wrong
// is in the Ledger. Both are the process's.
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

  // Whose command runs on this thread; else the only host that there is; else null.
  static Host* calling();

  // Stops the plug-in: its last command, an end to all renders and background tasks. All effects
  // and renderers are gone, and no other thread uses the host. The library stays loaded until the
  // host goes. While others run, tasks that were told to end may still do so; the last one waits
  // for all of them, and until then no library goes that they may be of.
  CommandResult Stop();

  const PluginLibrary& library() const { return library_.front(); }
  // Index 0 is the layer, the others are the plug-in's in their order.
  const std::vector<HX_ParamDef>& declarations() const { return declarations_; }
  // What the start told, beside what the property record does.
  std::uint32_t version() const { return version_; }
  std::uint32_t out_flags() const { return out_flags_; }
  std::uint32_t out_flags2() const { return out_flags2_; }
  // The text of the plug-in's about box.
  CommandResult About();

  const HostSettings& settings() const { return settings_; }
  // What plug-ins are asked to save for. Any thread.
  void SaveAs(PayloadForm form) { saves_as_ = form; }
  PayloadForm saves_as() const { return saves_as_; }
  MediaServices& media() { return media_; }
  UserInterface& user_interface() { return user_interface_; }
  // The process's, for all its hosts; they begin anew with the first one.
  HandleStore& handles() { return lent_->handles; }
  OpaqueStore& opaque_data() { return lent_->opaque_data; }
  WorldStore& worlds() { return lent_->worlds; }
  InstanceRegistry& instances() { return lent_->instances; }

  // What plug-ins hold of the process's hosts, and what they did wrong, a line each; empty when all
  // is in order. Whole after Stop of the only one.
  std::string LeakReport() const;

  // -- For the other half of the library --
  // Runs a command on the entry, with flags, message and handles preset; see Instance::Call.
  CommandResult Command(std::uint32_t command, HX_InData& in, HX_OutData& out,
                        HX_ParamDef* params[] = nullptr, HX_World* output = nullptr,
                        void* extra = nullptr);
  const std::shared_ptr<LoopWake>& wake() const { return wake_; }

  // -- For the interface's functions --
  HX_Err AddParam(std::int32_t index, const HX_ParamDef& param);
  void CountParamCheckout(int change) { param_checkouts_ += change; }
  void CountDirectRender(int change) { direct_renders_ += change; }

 private:
  void Start();
  void DeclareParams();

  // Has the debug option set while one that wants it lives, where it was not.
  class ExperimentalParameters {
   public:
    explicit ExperimentalParameters(bool wanted);
    ~ExperimentalParameters();
    ExperimentalParameters(const ExperimentalParameters&) = delete;
    ExperimentalParameters& operator=(const ExperimentalParameters&) = delete;

   private:
    const bool wanted_;
  };
  // Counts the hosts that run. The last that leaves ends the plug-ins' background tasks.
  class Running {
   public:
    explicit Running(Host& host);
    ~Running();
    Running(const Running&) = delete;
    Running& operator=(const Running&) = delete;

   private:
    Host& host_;
  };

  const HostSettings settings_;
  std::atomic<PayloadForm> saves_as_;
  const ExperimentalParameters experimental_;
  std::list<PluginLibrary> library_;  // one; it goes on to others without memory
  const SharedByAll<Lent> lent_;
  MediaServices media_;
  UserInterface user_interface_;
  const std::shared_ptr<LoopWake> wake_ = std::make_shared<LoopWake>();

  std::vector<HX_ParamDef> declarations_;  // constant after construction
  bool declaring_ = false;
  std::uint32_t version_ = 0, out_flags_ = 0, out_flags2_ = 0;  // constant after construction
  std::atomic<HX_Handle> global_data_{nullptr};
  bool started_ = false;
  std::atomic<std::int64_t> param_checkouts_{0}, direct_renders_{0};
  std::optional<Running> running_;  // last
};

}  // namespace calmframe::host
