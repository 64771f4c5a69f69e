#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "host/effects/interface_guard.h"
#include "host/effects/interface_tables.h"
#include "host/effects/layer_time.h"
#include "host/pixels/world_operations.h"
#include "platform/tessel/utility.h"

namespace calmframe::host {
namespace {

constexpr std::size_t kFormatSize = 512;  // of the callers' buffers

HX_Err CheckoutInput(Instance& instance, std::int32_t time, std::uint32_t time_scale,
                     HX_ParamDef& param) {
  if (!instance.frames() || time_scale == 0) return HX_ERR_UNKNOWN;
  const LayerTime layer(instance.frames()->layer());
  const std::int64_t ticks = layer.MediaTicks(time, time_scale);
  param = {};
  param.kind = HX_PARAM_LAYER;
  if (!instance.frames()->HasFrame(ticks)) return HX_ERR_NONE;
  const HX_World* world = instance.frames()->CheckOutInput(ticks);
  if (!world) return HX_ERR_UNKNOWN;
  param.u.ld = *world;
  return HX_ERR_NONE;
}

HX_Err CheckoutParam(HX_EffectRef effect, std::int32_t index, std::int32_t time, std::int32_t,
                     std::uint32_t time_scale, HX_ParamDef* param) {
  return WithInstance("checkout_param", effect, [&](Instance& instance) -> HX_Err {
    if (index == 0) {
      if (const HX_Err code = CheckoutInput(instance, time, time_scale, *param)) return code;
    } else {
      const std::optional<HX_ParamDef> found = instance.Param(index);
      if (!found) return HX_ERR_UNKNOWN;
      *param = *found;
    }
    instance.host().CountParamCheckout(1);
    return HX_ERR_NONE;
  });
}

HX_Err CheckinParam(HX_EffectRef effect, HX_ParamDef* param) {
  const std::shared_ptr<Instance> instance = FindInstance(effect);
  if (Host* host = instance ? &instance->host() : Host::calling()) host->CountParamCheckout(-1);
  if (param->kind != HX_PARAM_LAYER || !param->u.ld.data) return HX_ERR_NONE;
  if (!instance || !instance->frames()) return HX_ERR_UNKNOWN;
  instance->frames()->CheckInInput(param->u.ld.data);
  return HX_ERR_NONE;
}

HX_Err AddParam(HX_EffectRef, std::int32_t index, const HX_ParamDef* param) {
  return WithHost("add_param", [&](Host& host) { return host.AddParam(index, *param); });
}

HX_Err OpenStrings(HX_EffectRef, std::uint32_t number, const HX_StringTable* table,
                   std::uint64_t* token) {
  return WithLent("open_strings", [&](Lent& lent) -> HX_Err {
    if (!table || table->number != number) return HX_ERR_UNKNOWN;
    *token = lent.strings.Open(*table);
    return HX_ERR_NONE;
  });
}

const char* GetString(std::uint64_t token, std::int32_t index, std::int32_t, std::int32_t) {
  const Lent* lent = Lent::active();
  return lent ? lent->strings.Get(token, index) : nullptr;
}

void CloseStrings(std::uint64_t token) {
  if (Lent* lent = Lent::active()) lent->strings.Close(token);
}

HX_Handle NewHandle(std::uint64_t size) {
  HX_Handle handle = nullptr;
  WithLent("new_handle", [&](Lent& lent) -> HX_Err {
    handle = lent.handles.New(size);
    return HX_ERR_NONE;
  });
  return handle;
}

void* LockHandle(HX_Handle handle) {
  void* block = nullptr;
  WithLent("lock_handle", [&](Lent& lent) -> HX_Err {
    block = lent.handles.Lock(handle);
    return HX_ERR_NONE;
  });
  return block;
}

void UnlockHandle(HX_Handle handle) {
  if (Lent* lent = Lent::active()) lent->handles.Unlock(handle);
}

void DisposeHandle(HX_Handle handle) {
  if (Lent* lent = Lent::active()) lent->handles.Dispose(handle);
}

HX_Err ResizeHandle(HX_Handle* handle, std::uint64_t size) {
  return WithLent("resize_handle", [&](Lent& lent) { return lent.handles.Resize(*handle, size); });
}

std::uint64_t HandleSize(HX_Handle handle) {
  Lent* lent = Lent::active();
  return lent ? lent->handles.Size(handle) : 0;
}

#if defined(__GNUC__)
__attribute__((format(printf, 2, 3)))
#endif
std::int32_t
Format(char* buffer, const char* text, ...) {
  va_list values;
  va_start(values, text);
  const int size = std::vsnprintf(buffer, kFormatSize, text, values);
  va_end(values);
  if (size < 0) buffer[0] = '\0';
  return std::clamp(size, 0, static_cast<int>(kFormatSize) - 1);
}

void CopyText(char* to, std::uint32_t size, const char* from) {
  if (size == 0) return;
  try {
    const std::string text = tessel::utility::CutToBytes(from ? from : "", size - 1);
    std::memcpy(to, text.c_str(), text.size() + 1);
  } catch (...) {
    to[0] = '\0';
  }
}

HX_Err CopyWorldCallback(HX_EffectRef, const HX_World* from, HX_World* to, const HX_Rect* from_rect,
                         const HX_Rect* to_rect) {
  return Guarded("copy_world", [&] { return CopyWorld(*from, *to, from_rect, to_rect); });
}

HX_Err TransferCallback(HX_EffectRef, const HX_World* from, const HX_TransferMode* mode,
                        const void* mask, std::int32_t x, std::int32_t y, HX_World* to) {
  return Guarded("transfer", [&]() -> HX_Err {
    return mask ? HX_ERR_UNKNOWN : Transfer(*from, *mode, x, y, *to);
  });
}

// Begin and end of a direct render; the table's rows mean nothing to this host. An end that is made
// to fail has ended the render all the same.
HX_Err Utility(HX_EffectRef effect, std::int32_t operation, const void* table) {
  const std::shared_ptr<Instance> instance = FindInstance(effect);
  Host* const host = instance ? &instance->host() : Host::calling();
  if (operation == HX_UTILITY_END_RENDER && host) host->CountDirectRender(-1);
  return Guarded("utility", [&]() -> HX_Err {
    if (!host) return HX_ERR_UNKNOWN;
    if (operation == HX_UTILITY_END_RENDER) return HX_ERR_NONE;
    if (operation != HX_UTILITY_BEGIN_RENDER || !table) return HX_ERR_UNKNOWN;
    host->CountDirectRender(1);
    return HX_ERR_NONE;
  });
}

HX_Err HlsToRgb(HX_EffectRef, const std::int32_t hls[3], HX_Pixel8* rgb) {
  return Guarded("hls_to_rgb", [&]() -> HX_Err {
    *rgb = ColourOfHls(hls);
    return HX_ERR_NONE;
  });
}

}  // namespace

const HX_Callbacks& Callbacks() {
  static const HX_Callbacks callbacks = {
      CheckoutParam, CheckinParam, AddParam,          OpenStrings,      GetString,    CloseStrings,
      NewHandle,     LockHandle,   UnlockHandle,      DisposeHandle,    ResizeHandle, HandleSize,
      Format,        CopyText,     CopyWorldCallback, TransferCallback, Utility,      HlsToRgb};
  return callbacks;
}

}  // namespace calmframe::host
