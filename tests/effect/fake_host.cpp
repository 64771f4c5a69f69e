#include "tests/effect/fake_host.h"

#include <algorithm>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>

#include "platform/tessel/utility.h"
#include "tests/effect/fake_pixels.h"

struct HX_HandleRecord {
  std::vector<unsigned char> block;
  int locks = 0;
};

namespace {

FakeHost* current = nullptr;

// HX_Callbacks.transfer's sum of a pixel in front of another.
FakePixel InFront(const FakePixel& s, const FakePixel& d) {
  FakePixel sum;
  sum.a = s.a + d.a * (1 - s.a);
  if (sum.a == 0) return sum;
  const double back = d.a * (1 - s.a);
  sum.r = (s.r * s.a + d.r * back) / sum.a;
  sum.g = (s.g * s.a + d.g * back) / sum.a;
  sum.b = (s.b * s.a + d.b * back) / sum.a;
  return sum;
}

}  // namespace

// The interface's functions; they find the fake through `current`.
struct FakeHostCallbacks {
  using Lock = std::lock_guard<std::recursive_mutex>;

  static HX_Err Acquire(const char* name, std::int32_t version, const void** table) {
    Lock lock(current->mutex_);
    const auto found = current->suites_.find({name, version});
    const bool fails =
        current->Operate(std::string("acquire ") + name + " " + std::to_string(version));
    if (fails || found == current->suites_.end() || current->refused_.count(name)) {
      return HX_ERR_MISSING_SUITE + 1000;  // the effect has a code of its own for this
    }
    *table = found->second;
    ++current->acquired_[{name, version}];
    return HX_ERR_NONE;
  }
  static HX_Err Release(const char* name, std::int32_t version) {
    Lock lock(current->mutex_);
    current->Expect(--current->acquired_[{name, version}] >= 0, "released a suite once too often");
    return HX_ERR_NONE;
  }

  static HX_Err CheckoutParam(HX_EffectRef, std::int32_t index, std::int32_t time, std::int32_t,
                              std::uint32_t, HX_ParamDef* param) {
    Lock lock(current->mutex_);
    if (current->Operate("checkout_param")) return FakeHost::kFault;
    if (index < 0 || static_cast<std::size_t>(index) >= current->params.size()) {
      return HX_ERR_UNKNOWN;
    }
    *param = current->params[static_cast<std::size_t>(index)];
    current->checkout_times.push_back(time);
    ++current->checkouts_;
    return HX_ERR_NONE;
  }
  static HX_Err CheckinParam(HX_EffectRef, HX_ParamDef*) {
    Lock lock(current->mutex_);
    current->Expect(--current->checkouts_ >= 0, "checked in once too often");
    return HX_ERR_NONE;
  }
  static HX_Err AddParam(HX_EffectRef, std::int32_t index, const HX_ParamDef* param) {
    Lock lock(current->mutex_);
    if (current->Operate("add_param")) return FakeHost::kFault;
    if (index != -1) return HX_ERR_UNKNOWN;
    current->params.push_back(*param);
    return HX_ERR_NONE;
  }

  static HX_Err OpenStrings(HX_EffectRef, std::uint32_t number, const HX_StringTable* table,
                            std::uint64_t* token) {
    Lock lock(current->mutex_);
    if (current->Operate("open_strings")) return FakeHost::kFault;
    if (number != table->number) return HX_ERR_UNKNOWN;
    *token = ++current->last_token_;
    current->strings_[*token] =
        std::make_unique<tessel::config::StringTable>(table->literals, table->count);
    return HX_ERR_NONE;
  }
  static const char* GetString(std::uint64_t token, std::int32_t index, std::int32_t,
                               std::int32_t) {
    Lock lock(current->mutex_);
    const auto found = current->strings_.find(token);
    return found == current->strings_.end() ? nullptr : found->second->Get(index);
  }
  static void CloseStrings(std::uint64_t token) {
    Lock lock(current->mutex_);
    current->Expect(current->strings_.erase(token) == 1, "closed a string table that is not open");
  }

  static HX_Handle NewHandle(std::uint64_t size) {
    Lock lock(current->mutex_);
    if (current->Operate("new_handle")) return nullptr;
    auto* handle = new HX_HandleRecord{std::vector<unsigned char>(size), 0};
    current->handles_.insert(handle);
    return handle;
  }
  static void* LockHandle(HX_Handle handle) {
    Lock lock(current->mutex_);
    if (current->Operate("lock_handle")) return nullptr;
    ++handle->locks;
    return handle->block.data();
  }
  static void UnlockHandle(HX_Handle handle) {
    Lock lock(current->mutex_);
    current->Expect(handle->locks > 0, "unlocked once too often");
    if (--handle->locks == 0) handle->block = std::vector<unsigned char>(handle->block);
  }
  static void DisposeHandle(HX_Handle handle) {
    Lock lock(current->mutex_);
    const bool was_ours = current->handles_.erase(handle) == 1;
    current->Expect(was_ours && handle->locks == 0, "disposed of a locked or unknown handle");
    if (was_ours) delete handle;
  }
  static HX_Err ResizeHandle(HX_Handle* handle, std::uint64_t size) {
    Lock lock(current->mutex_);
    if (current->Operate("resize_handle")) return FakeHost::kFault;
    current->Expect((*handle)->locks == 0, "resized a locked handle");
    (*handle)->block.resize(size);
    return HX_ERR_NONE;
  }
  static std::uint64_t HandleSize(HX_Handle handle) {
    Lock lock(current->mutex_);
    return handle->block.size();
  }

  static std::int32_t Format(char* buffer, const char* text, ...) {
    va_list values;
    va_start(values, text);
    const int size = std::vsnprintf(buffer, 512, text, values);
    va_end(values);
    return size;
  }
  static void CopyText(char* to, std::uint32_t size, const char* from) {
    const std::string text = tessel::utility::CutToBytes(from, size - 1);
    std::memcpy(to, text.c_str(), text.size() + 1);
  }

  static HX_Err UpdateParamUI(HX_EffectRef, std::int32_t index, const HX_ParamDef* param) {
    Lock lock(current->mutex_);
    if (current->Operate("Param Utils.UpdateParamUI")) return FakeHost::kFault;
    HX_ParamDef& own = current->params.at(static_cast<std::size_t>(index));
    std::memcpy(own.name, param->name, sizeof(own.name));
    own.flags = param->flags;
    own.ui_flags = param->ui_flags;
    return HX_ERR_NONE;
  }
  static HX_Err SetParamValue(HX_EffectRef, std::int32_t index, const HX_ParamDef* param) {
    Lock lock(current->mutex_);
    if (current->Operate("Param Utils.SetParamValue")) return FakeHost::kFault;
    HX_ParamDef& own = current->params.at(static_cast<std::size_t>(index));
    if (own.kind == HX_PARAM_ARBITRARY) current->replaced_values.push_back(own.u.arb_d.value);
    own.u = param->u;
    own.change_flag = param->change_flag;
    return HX_ERR_NONE;
  }

  static HX_Err ConvertText(const std::uint16_t* from, char* to, std::uint32_t max) {
    if (Lock lock(current->mutex_); current->Operate("Private Effect.ConvertText")) {
      return FakeHost::kFault;
    }
    std::u16string text;
    for (; *from; ++from) text += static_cast<char16_t>(*from);
    CopyText(to, max, tessel::utility::ToUTF8(text).c_str());
    return HX_ERR_NONE;
  }
  static HX_Err ForceRerender(HX_EffectRef) {
    Lock lock(current->mutex_);
    if (current->Operate("Private Effect.ForceRerender")) return FakeHost::kFault;
    ++current->rerenders_;
    return HX_ERR_NONE;
  }

  static HX_Err RefreshAllWindows() {
    Lock lock(current->mutex_);
    return current->Operate("Adv App.RefreshAllWindows") ? FakeHost::kFault : HX_Err{HX_ERR_NONE};
  }
  static HX_Err InfoText(const char* line1, const char* line2) {
    Lock lock(current->mutex_);
    if (current->Operate("Adv App.InfoText")) return FakeHost::kFault;
    current->info_text_.clear();
    for (const char* line : {line1, line2}) {
      if (line) current->info_text_.push_back(line);
    }
    return HX_ERR_NONE;
  }

  static HX_Err Transfer(HX_EffectRef, const HX_World* from, const HX_TransferMode* mode,
                         const void* mask, std::int32_t x0, std::int32_t y0, HX_World* to) {
    Lock lock(current->mutex_);
    if (current->Operate("transfer")) return FakeHost::kFault;
    const bool behind = mode->mode == HX_TRANSFER_BEHIND;
    if ((!behind && mode->mode != HX_TRANSFER_IN_FRONT) || mode->opacity != 255 ||
        mode->opacity_u16 != 32768 || mode->random_seed != 0 || mode->rgb_only != 0 || mask) {
      return HX_ERR_UNKNOWN;
    }
    for (int y = std::max(0, -y0); y < from->height && y + y0 < to->height; ++y) {
      for (int x = std::max(0, -x0); x < from->width && x + x0 < to->width; ++x) {
        const FakePixel source = LoadFakePixel(*from, x, y);
        const FakePixel target = LoadFakePixel(*to, x + x0, y + y0);
        StoreFakePixel(*to, x + x0, y + y0,
                       behind ? InFront(target, source) : InFront(source, target));
      }
    }
    return HX_ERR_NONE;
  }
  // The mean of the pixels that a pixel of the copy covers, as far as they are whole.
  static HX_Err CopyWorld(HX_EffectRef, const HX_World* from, HX_World* to,
                          const HX_Rect* from_rect, const HX_Rect* to_rect) {
    Lock lock(current->mutex_);
    if (current->Operate("copy_world")) return FakeHost::kFault;
    const HX_Rect s = from_rect ? *from_rect : HX_Rect{0, 0, from->width, from->height};
    const HX_Rect d = to_rect ? *to_rect : HX_Rect{0, 0, to->width, to->height};
    const int from_width = s.right - s.left, from_height = s.bottom - s.top;
    const int to_width = d.right - d.left, to_height = d.bottom - d.top;
    for (int y = 0; y < to_height; ++y) {
      for (int x = 0; x < to_width; ++x) {
        const int left = x * from_width / to_width, top = y * from_height / to_height;
        const int right = std::max(left + 1, (x + 1) * from_width / to_width);
        const int bottom = std::max(top + 1, (y + 1) * from_height / to_height);
        FakePixel sum{0, 0, 0, 0};
        for (int v = top; v < bottom; ++v) {
          for (int u = left; u < right; ++u) {
            const FakePixel p = LoadFakePixel(*from, s.left + u, s.top + v);
            sum = {sum.a + p.a, sum.r + p.r * p.a, sum.g + p.g * p.a, sum.b + p.b * p.a};
          }
        }
        const double alpha = sum.a > 0 ? sum.a : 1;
        StoreFakePixel(*to, d.left + x, d.top + y,
                       {sum.a / ((right - left) * (bottom - top)), sum.r / alpha, sum.g / alpha,
                        sum.b / alpha});
      }
    }
    return HX_ERR_NONE;
  }
  static HX_Err Utility(HX_EffectRef, std::int32_t operation, const void* table) {
    Lock lock(current->mutex_);
    current->Expect((operation == HX_UTILITY_BEGIN_RENDER) == (table != nullptr),
                    "a render's beginning, alone, has a table");
    return current->Operate("utility " + std::to_string(operation)) ? FakeHost::kFault
                                                                    : HX_ERR_NONE;
  }

  // A colour of full value, by the distance of its hue from those of the components: each is full
  // within 60 degrees of its own and least from 120 degrees on.
  static HX_Err HlsToRgb(HX_EffectRef, const std::int32_t hls[3], HX_Pixel8* rgb) {
    Lock lock(current->mutex_);
    if (current->Operate("hls_to_rgb")) return FakeHost::kFault;
    current->Expect(hls[1] == 65536, "a hue of another lightness");
    const auto component = [&](double own_hue) {
      const double apart = std::abs(std::remainder(hls[0] * 360.0 / 65536 - own_hue, 360.0));
      const double share = std::clamp((120 - apart) / 60, 0.0, 1.0);
      return static_cast<std::uint8_t>(std::lround(255 * (1 - hls[2] / 65536.0 * (1 - share))));
    };
    *rgb = {255, component(0), component(120), component(240)};
    return HX_ERR_NONE;
  }
  static HX_Err InvalidateRect(void*, const HX_Rect* rect) {
    Lock lock(current->mutex_);
    if (current->Operate("App.InvalidateRect")) return FakeHost::kFault;
    current->invalidated.push_back(*rect);
    return HX_ERR_NONE;
  }

  static HX_Err NewWorld(HX_EffectRef, std::int32_t width, std::int32_t height, std::uint8_t,
                         std::uint32_t format, HX_World* world) {
    Lock lock(current->mutex_);
    if (current->Operate("World.NewWorld")) return FakeHost::kFault;
    const int row_bytes = width * FakePixelBytes(format);
    void* data = ::operator new(static_cast<std::size_t>(row_bytes) * height);
    std::memset(data, 0, static_cast<std::size_t>(row_bytes) * height);
    current->worlds_.insert(data);
    *world = {data,
              row_bytes,
              width,
              height,
              format == HX_FORMAT_ARGB16 ? std::uint32_t{HX_WORLD_DEEP} : 0U,
              0,
              0,
              format,
              {0, 0, width, height}};
    return HX_ERR_NONE;
  }
  static HX_Err DisposeWorld(HX_EffectRef, HX_World* world) {
    Lock lock(current->mutex_);
    const bool was_ours = current->worlds_.erase(world->data) == 1;
    current->Expect(was_ours, "disposed of an unknown world");
    if (was_ours) ::operator delete(world->data);
    *world = {};
    return HX_ERR_NONE;
  }

  static constexpr HX_BasicSuite kBasic = {Acquire, Release};
  static constexpr HX_ParamUtilsSuite3 kParamUtils = {UpdateParamUI, SetParamValue};
  static constexpr HX_PrivateEffectSuite3 kPrivate = {ConvertText, nullptr, nullptr, nullptr,
                                                      ForceRerender};
  static constexpr HX_AdvAppSuite1 kAdvApp = {RefreshAllWindows, InfoText};
  static constexpr HX_AppSuite6 kApp = {InvalidateRect};
  static constexpr HX_WorldSuite2 kWorlds = {NewWorld, DisposeWorld};

  static const HX_Callbacks& Callbacks() {
    static const HX_Callbacks callbacks = [] {
      HX_Callbacks cb{};
      cb.checkout_param = CheckoutParam;
      cb.checkin_param = CheckinParam;
      cb.add_param = AddParam;
      cb.open_strings = OpenStrings;
      cb.get_string = GetString;
      cb.close_strings = CloseStrings;
      cb.new_handle = NewHandle;
      cb.lock_handle = LockHandle;
      cb.unlock_handle = UnlockHandle;
      cb.dispose_handle = DisposeHandle;
      cb.resize_handle = ResizeHandle;
      cb.handle_size = HandleSize;
      cb.format = Format;
      cb.copy_text = CopyText;
      cb.copy_world = CopyWorld;
      cb.transfer = Transfer;
      cb.utility = Utility;
      cb.hls_to_rgb = HlsToRgb;
      return cb;
    }();
    return callbacks;
  }
};

FakeHost::FakeHost() : params(1) {
  if (current) std::abort();
  current = this;
  Offer(HX_PARAM_UTILS_SUITE, HX_PARAM_UTILS_SUITE_VERSION, &FakeHostCallbacks::kParamUtils);
  Offer(HX_PRIVATE_EFFECT_SUITE, HX_PRIVATE_EFFECT_SUITE_VERSION, &FakeHostCallbacks::kPrivate);
  Offer(HX_APP_SUITE, HX_APP_SUITE_VERSION, &FakeHostCallbacks::kApp);
  Offer(HX_ADV_APP_SUITE, HX_ADV_APP_SUITE_VERSION, &FakeHostCallbacks::kAdvApp);
  Offer(HX_WORLD_SUITE, HX_WORLD_SUITE_VERSION, &FakeHostCallbacks::kWorlds);
  in.basic = &FakeHostCallbacks::kBasic;
  in.cb = &FakeHostCallbacks::Callbacks();
  in.effect_ref = reinterpret_cast<HX_EffectRef>(this);
  in.width = 640;
  in.height = 480;
  in.pixel_aspect = {1, 1};
  in.time_step = 1;
  in.time_scale = 25;
  in.downsample_x = in.downsample_y = {1, 1};
  Prepare();
}

FakeHost::~FakeHost() {
  for (const HX_Handle handle : handles_) delete handle;
  for (void* data : worlds_) ::operator delete(data);
  current = nullptr;
}

void FakeHost::Prepare() {
  out = {};
  out.instance_handle = in.instance_handle;
  out.global_data = in.global_data;
}

HX_Err FakeHost::Call(HX_EffectMain entry, std::uint32_t command, HX_ParamDef* parameters[],
                      HX_World* output, void* extra) {
  Prepare();
  const HX_Err code = entry(command, &in, &out, parameters, output, extra);
  in.instance_handle = out.instance_handle;
  in.global_data = out.global_data;
  return code;
}

void FakeHost::FailOperation(int n) {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  fail_in_ = n;
}

void FakeHost::Offer(const std::string& name, std::int32_t version, const void* table) {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  suites_[{name, version}] = table;
}

std::vector<std::string> FakeHost::info_text() const {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  return info_text_;
}

int FakeHost::Count(const std::string& name) const {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  return static_cast<int>(std::count_if(operations_.begin(), operations_.end(),
                                        [&](const Operation& o) { return o.name == name; }));
}

int FakeHost::rerenders() const {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  return rerenders_;
}

std::string FakeHost::handle_bytes(HX_Handle handle) const {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  return std::string(handle->block.begin(), handle->block.end());
}

std::string FakeHost::Leaks() const {
  std::lock_guard<std::recursive_mutex> lock(mutex_);
  std::ostringstream text;
  for (const HX_Handle handle : handles_) {
    text << "handle of " << handle->block.size() << " bytes, " << handle->locks << " locks\n";
  }
  for (const auto& [suite, count] : acquired_) {
    if (count != 0) text << suite.first << " " << suite.second << ": " << count << " uses\n";
  }
  for (const std::string& mistake : mistakes_) text << mistake << "\n";
  if (checkouts_ != 0) text << checkouts_ << " checkouts\n";
  if (!worlds_.empty()) text << worlds_.size() << " worlds\n";
  if (!strings_.empty()) text << strings_.size() << " string tables\n";
  return text.str();
}

void FakeHost::Expect(bool holds, const char* mistake) {
  if (!holds) mistakes_.push_back(mistake);
}

bool FakeHost::Operate(const std::string& name) {
  const bool fails = fail_in_ > 0 && --fail_in_ == 0;
  operations_.push_back({name, fails});
  return fails;
}
