#include "effect/effect_globals.h"

#include <boost/make_shared.hpp>
#include <memory>
#include <new>

#include "effect/host_text.h"

namespace kelp::effect {
namespace {

constexpr char kNotInitialized[] = "Calmframe could not be initialized.";

// Words of the host's, kept as they are; the property record's need not equal them.
constexpr std::uint32_t kOutFlags = 0x1216;
constexpr std::uint32_t kOutFlags2 = 0x20048;
constexpr std::uint32_t kEffectVersion = 0x80600;

// Closes the table unless somebody keeps it.
class OpenStrings {
 public:
  OpenStrings(const HX_InData& in, const HX_StringTable& table) : host_(*in.cb) {
    ThrowIfFailed(host_.open_strings(in.effect_ref, table.number, &table, &token_));
  }
  ~OpenStrings() {
    if (token_ != 0) host_.close_strings(token_);
  }
  OpenStrings(const OpenStrings&) = delete;
  OpenStrings& operator=(const OpenStrings&) = delete;

  std::uint64_t token() const { return token_; }
  void keep() { token_ = 0; }

 private:
  const HX_Callbacks& host_;
  std::uint64_t token_ = 0;
};

HX_Handle MakeGlobals(const HostContext& context, const HX_StringTable& table) {
  OpenStrings strings(*context.in, table);
  auto banner_cache_lock = boost::make_shared<std::mutex>();
  OwnedHandle handle(*context.in->cb, sizeof(EffectGlobals));
  if (!handle) throw std::int32_t{HX_ERR_MEMORY};
  void* const block = context.in->cb->lock_handle(handle.get());
  if (!block) throw std::int32_t{HX_ERR_MEMORY};
  new (block) EffectGlobals{strings.token(), nullptr, std::move(banner_cache_lock)};
  context.in->cb->unlock_handle(handle.get());
  strings.keep();
  return handle.release();
}

}  // namespace

void OpenPlugin(const HostContext& context, const HX_StringTable& strings) {
  try {
    context.in->global_data = context.out->global_data = MakeGlobals(context, strings);
  } catch (std::int32_t) {
    ShowMessage(context, kNotInitialized);
    throw;
  }
  context.out->out_flags |= kOutFlags;
  context.out->out_flags2 |= kOutFlags2;
  context.out->version = kEffectVersion;
}

void ClosePlugin(const HostContext& context) {
  const HX_Callbacks& host = *context.in->cb;
  const HX_Handle handle = context.in->global_data;
  if (!handle) return;
  {
    const HandleLock lock(host, handle);
    auto* globals = lock.as<EffectGlobals>();
    const std::uint64_t token = globals->string_token;
    std::destroy_at(globals);
    host.close_strings(token);
    *lock.as<std::uint64_t>() = 0;
  }
  host.dispose_handle(handle);
  context.in->global_data = context.out->global_data = nullptr;
}

}  // namespace kelp::effect
