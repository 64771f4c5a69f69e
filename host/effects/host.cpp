#include "host/effects/host.h"

#include <cstring>
#include <list>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/interface_tables.h"
#include "platform/tessel/debug.h"
#include "platform/tessel/importer.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

constexpr char kExperimental[] = "ShowExperimentalEffectParameters";

thread_local Host* commanding = nullptr;  // whose command runs on this thread

// The process's hosts.
struct Hosts {
  std::mutex mutex;
  std::vector<Host*> running;         // guarded by mutex
  std::atomic<Host*> only = nullptr;  // that runs; null where there are several, too
  // Of hosts that are gone while tasks of their plug-ins may still run. Guarded by mutex.
  std::list<PluginLibrary> kept;
  int experimental = 0;       // that want the debug option; guarded by mutex
  bool was_set_here = false;  // guarded by mutex
};

Hosts& AllHosts() {
  static Hosts& hosts = *new Hosts;  // outlives threads that ask at the process's end
  return hosts;
}

class Commanding {
 public:
  explicit Commanding(Host& host) : before_(std::exchange(commanding, &host)) {}
  ~Commanding() { commanding = before_; }
  Commanding(const Commanding&) = delete;
  Commanding& operator=(const Commanding&) = delete;

 private:
  Host* const before_;
};

}  // namespace

Host::ExperimentalParameters::ExperimentalParameters(bool wanted) : wanted_(wanted) {
  Hosts& hosts = AllHosts();
  const std::lock_guard lock(hosts.mutex);
  if (!wanted_ || hosts.experimental++ > 0) return;
  hosts.was_set_here = !tessel::debug::DebugDatabase::GetBool(kExperimental);
  if (!hosts.was_set_here) return;
  tessel::debug::DebugDatabase::Set(kExperimental, 1);
  tessel::debug::SetSink([](const std::string&) {});
}

Host::ExperimentalParameters::~ExperimentalParameters() {
  Hosts& hosts = AllHosts();
  const std::lock_guard lock(hosts.mutex);
  if (!wanted_ || --hosts.experimental > 0 || !hosts.was_set_here) return;
  try {
    tessel::debug::DebugDatabase::Set(kExperimental, 0);
    tessel::debug::SetSink({});
  } catch (const std::bad_alloc&) {  // then the next host finds it set, and nothing is shown
  }
}

Host::Running::Running(Host& host) : host_(host) {
  Hosts& hosts = AllHosts();
  const std::lock_guard lock(hosts.mutex);
  hosts.running.push_back(&host);
  const bool is_only = hosts.running.size() == 1;
  hosts.only = is_only ? &host : nullptr;
  if (is_only) Ledger::Get().Reset();
}

// Whoever starts meanwhile waits: its tasks are not to be ended with those of the others.
Host::Running::~Running() {
  Hosts& hosts = AllHosts();
  const std::lock_guard lock(hosts.mutex);
  std::erase(hosts.running, &host_);
  if (!hosts.running.empty()) {
    hosts.only = hosts.running.size() == 1 ? hosts.running.front() : nullptr;
    return;
  }
  tessel::importer::PauseBackgroundWork(false);
  tessel::threads::Shutdown();
  hosts.only = nullptr;
  hosts.kept.clear();
}

Host* Host::calling() {
  return commanding ? commanding : AllHosts().only.load();
}

Host::Host(const std::string& library, const HostSettings& settings)
    : Host(PluginLibrary(library), settings) {}

Host::Host(PluginLibrary library, const HostSettings& settings)
    : settings_(settings),
      saves_as_(settings.saves_as),
      experimental_(settings.experimental_parameters),
      media_(settings.media),
      declarations_(1) {
  library_.push_back(std::move(library));
  running_.emplace(*this);
  declarations_[0].kind = HX_PARAM_LAYER;
  try {
    Start();
    DeclareParams();
  } catch (...) {
    Stop();
    throw;
  }
}

Host::~Host() {
  Stop();
  // Tasks that end late may still be of it.
  Hosts& hosts = AllHosts();
  const std::lock_guard lock(hosts.mutex);
  if (hosts.running.empty()) return;
  for (const PluginLibrary& kept : hosts.kept) {
    if (kept.entry() == this->library().entry()) return;
  }
  hosts.kept.splice(hosts.kept.end(), library_);
}

void Host::Start() {
  HX_InData in{};
  HX_OutData out{};
  const CommandResult result = Command(HX_CMD_START_PLUGIN, in, out);
  if (!result.ok()) throw PluginError(result.Line(library().path()));
  started_ = true;
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
  if (!result.ok()) throw PluginError(result.Line(library().path()));
  const auto declared = static_cast<std::int32_t>(declarations_.size());
  if (out.num_params != declared && !(out.num_params == 0 && declared == 1)) {
    throw PluginError(library().path() + ": tells of " + std::to_string(out.num_params) +
                      " parameters and declares " + std::to_string(declared));
  }
}

CommandResult Host::Stop() {
  CommandResult result;
  if (std::exchange(started_, false)) {
    HX_InData in{};
    HX_OutData out{};
    result = Command(HX_CMD_STOP_PLUGIN, in, out);
  }
  // A job that is still at work ends by the renders that it is refused.
  media_.Shutdown();
  running_.reset();
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
  const Commanding from_here(*this);
  try {
    result.code = library().entry()(command, &in, &out, params, output, extra);
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

HX_Err Host::AddParam(std::int32_t index, const HX_ParamDef& param) {
  if (!declaring_ || index != -1) return HX_ERR_UNKNOWN;
  declarations_.push_back(param);
  HX_ParamDef& own = declarations_.back();
  own.name[sizeof(own.name) - 1] = '\0';
  return HX_ERR_NONE;
}

std::string Host::LeakReport() const {
  std::string text;
  const auto tell = [&text](const char* kind, std::int64_t count) {
    if (count != 0) text += std::to_string(count) + " of " + kind + " left\n";
  };
  tell("instance", static_cast<std::int64_t>(lent_->instances.size()));
  tell("handle", static_cast<std::int64_t>(lent_->handles.count()));
  tell("handle lock", static_cast<std::int64_t>(lent_->handles.locks()));
  tell("world", static_cast<std::int64_t>(lent_->worlds.count()));
  tell("opaque data use", static_cast<std::int64_t>(lent_->opaque_data.uses()));
  tell("parameter checkout", param_checkouts_);
  tell("direct render", direct_renders_);
  tell("string table", static_cast<std::int64_t>(lent_->strings.count()));
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
