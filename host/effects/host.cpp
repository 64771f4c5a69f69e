#include "host/effects/host.h"

#include <cstring>
#include <new>
#include <stdexcept>
#include <utility>

#include "host/base/operations.h"
#include "host/effects/interface_tables.h"
#include "platform/tessel/debug.h"
#include "platform/tessel/importer.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

std::atomic<Host*> active_host{nullptr};
thread_local int loop_calls = 0;

constexpr char kExperimental[] = "ShowExperimentalEffectParameters";

}  // namespace

Host::LoopCall::LoopCall() {
  ++loop_calls;
}

Host::LoopCall::~LoopCall() {
  --loop_calls;
}

Host::ExperimentalParameters::ExperimentalParameters(bool wanted)
    : sets_(wanted && !tessel::debug::DebugDatabase::GetBool(kExperimental)) {
  if (!sets_) return;
  tessel::debug::DebugDatabase::Set(kExperimental, 1);
  tessel::debug::SetSink([](const std::string&) {});
}

Host::ExperimentalParameters::~ExperimentalParameters() {
  if (!sets_) return;
  try {
    tessel::debug::DebugDatabase::Set(kExperimental, 0);
    tessel::debug::SetSink({});
  } catch (const std::bad_alloc&) {  // then the next host finds it set, and nothing is shown
  }
}

Host* Host::active() {
  return active_host.load();
}

Host::Host(const std::string& library, const HostSettings& settings)
    : Host(PluginLibrary(library), settings) {}

Host::Host(PluginLibrary library, const HostSettings& settings)
    : settings_(settings),
      keeps_analysis_raw_(settings.keeps_analysis_raw),
      experimental_(settings.experimental_parameters),
      library_(std::move(library)),
      media_(settings.media),
      declarations_(1) {
  Host* none = nullptr;
  if (!active_host.compare_exchange_strong(none, this)) {
    throw std::logic_error("a process has one host at a time");
  }
  Ledger::Get().Reset();
  declarations_[0].kind = HX_PARAM_LAYER;
  try {
    Start();
    DeclareParams();
  } catch (...) {
    Stop();
    active_host = nullptr;
    throw;
  }
}

Host::~Host() {
  Stop();
  active_host = nullptr;
}

void Host::Start() {
  HX_InData in{};
  HX_OutData out{};
  running_ = true;
  const CommandResult result = Command(HX_CMD_START_PLUGIN, in, out);
  if (!result.ok()) {
    running_ = false;
    throw PluginError(result.Line(library_.path()));
  }
  version_ = out.version;
  out_flags_ = out.out_flags;
  out_flags2_ = out.out_flags2;
}

void Host::DeclareParams() {
  HX_InData in{};
  HX_OutData out{};
  declaring_ = true;
  const CommandResult result = Command(HX_CMD_DECLARE_PARAMS, in, out);
  declaring_ = false;
  if (!result.ok()) throw PluginError(result.Line(library_.path()));
  const auto declared = static_cast<std::int32_t>(declarations_.size());
  if (out.num_params != declared && !(out.num_params == 0 && declared == 1)) {
    throw PluginError(library_.path() + ": tells of " + std::to_string(out.num_params) +
                      " parameters and declares " + std::to_string(declared));
  }
}

CommandResult Host::Stop() {
  if (!running_) return {};
  running_ = false;
  tessel::importer::PauseBackgroundWork(false);
  HX_InData in{};
  HX_OutData out{};
  const CommandResult result = Command(HX_CMD_STOP_PLUGIN, in, out);
  // A job that is still at work ends by the renders that it is refused; then nothing of the
  // plug-in's runs any more.
  media_.Shutdown();
  tessel::threads::Shutdown();
  return result;
}

CommandResult Host::About() {
  HX_InData in{};
  HX_OutData out{};
  CommandResult result = Command(HX_CMD_ABOUT, in, out);
  // The about text is shown whether the flag is set or not.
  result.message.assign(out.return_msg, strnlen(out.return_msg, sizeof(out.return_msg)));
  return result;
}

CommandResult Host::Command(std::uint32_t command, HX_InData& in, HX_OutData& out,
                            HX_ParamDef* params[], HX_World* output, void* extra) {
  const HX_Handle global_data = global_data_;
  in.basic = &BasicSuite();
  in.cb = &Callbacks();
  in.global_data = global_data;
  out.out_flags = 0;
  out.return_msg[0] = '\0';
  out.instance_handle = in.instance_handle;
  out.global_data = global_data;
  CommandResult result;
  try {
    result.code = library_.entry()(command, &in, &out, params, output, extra);
  } catch (...) {
    Ledger::Get().Mistake("entry: an exception came out");
    result.code = HX_ERR_UNKNOWN;
  }
  if (out.global_data != global_data) global_data_ = out.global_data;
  if (out.out_flags & HX_OUT_FLAG_SHOW_MESSAGE) {
    try {
      result.message.assign(out.return_msg, strnlen(out.return_msg, sizeof(out.return_msg)));
    } catch (const std::bad_alloc&) {  // what the command did counts for more
    }
  }
  return result;
}

void Host::Wake() {
  if (loop_calls > 0) return;
  {
    std::lock_guard lock(wake_mutex_);
    if (woken_) return;
    woken_ = true;
  }
  woken_changed_.notify_one();
}

bool Host::WaitForWake(std::chrono::milliseconds time) {
  std::unique_lock lock(wake_mutex_);
  woken_changed_.wait_for(lock, time, [this] { return woken_; });
  return std::exchange(woken_, false);
}

HX_Err Host::AddParam(std::int32_t index, const HX_ParamDef& param) {
  if (!declaring_ || index != -1) return HX_ERR_UNKNOWN;
  declarations_.push_back(param);
  HX_ParamDef& own = declarations_.back();
  own.name[sizeof(own.name) - 1] = '\0';
  return HX_ERR_NONE;
}

std::uint64_t Host::OpenStrings(const HX_StringTable& table) {
  auto strings = std::make_unique<tessel::config::StringTable>(table.literals, table.count);
  std::lock_guard lock(strings_mutex_);
  strings_[++last_token_] = std::move(strings);
  return last_token_;
}

const char* Host::GetString(std::uint64_t token, std::int32_t index) const {
  std::lock_guard lock(strings_mutex_);
  const auto found = strings_.find(token);
  return found == strings_.end() ? nullptr : found->second->Get(index);
}

void Host::CloseStrings(std::uint64_t token) {
  std::lock_guard lock(strings_mutex_);
  if (strings_.erase(token) == 0) Ledger::Get().Mistake("close_strings: not open");
}

std::string Host::LeakReport() const {
  std::string text;
  const auto tell = [&text](const char* kind, std::int64_t count) {
    if (count != 0) text += std::to_string(count) + " of " + kind + " left\n";
  };
  tell("instance", static_cast<std::int64_t>(instances_.size()));
  tell("handle", static_cast<std::int64_t>(handles_.count()));
  tell("handle lock", static_cast<std::int64_t>(handles_.locks()));
  tell("world", static_cast<std::int64_t>(worlds_.count()));
  tell("opaque data use", static_cast<std::int64_t>(opaque_data_.uses()));
  tell("parameter checkout", param_checkouts_);
  tell("direct render", direct_renders_);
  {
    std::lock_guard lock(strings_mutex_);
    tell("string table", static_cast<std::int64_t>(strings_.size()));
  }
  const MediaCounts media = media_.counts();
  tell("node", static_cast<std::int64_t>(media.nodes));
  tell("segments", static_cast<std::int64_t>(media.segments));
  tell("string", static_cast<std::int64_t>(media.strings));
  tell("frame", static_cast<std::int64_t>(media.frames));
  tell("frame reference", static_cast<std::int64_t>(media.references));
  tell("render request", static_cast<std::int64_t>(media.requests));
  return text + Ledger::Get().Report();
}

}  // namespace calmframe::host
