#include "effect/host_text.h"

#include <algorithm>
#include <memory>
#include <type_traits>
#include <vector>

#include "effect/effect_globals.h"
#include "effect/suite.h"
#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

namespace kelp::effect {
namespace {

constexpr char kOutOfMemory[] =
    "$$$/OV/Stabilizer/OutOfMemoryError=Calmframe out of memory on frame @0.";
constexpr char kGenericError[] =
    "$$$/OV/Stabilizer/GenericError=unknown exception on frame @0 in Calmframe.";

constexpr std::int32_t kAboutString = 0;
constexpr int kMajorVersion = 1;
constexpr int kMinorVersion = 0;
constexpr std::size_t kFormatSize = 512;  // bound of HX_Callbacks.format

void ConvertUnits(const HostContext& context, const std::u16string& text, char* to,
                  std::uint32_t size) {
  std::vector<std::uint16_t> units(text.begin(), text.end());
  units.push_back(0);
  const ScopedSuite<HX_PrivateEffectSuite3> suite(context);
  ThrowIfFailed(suite->ConvertText(units.data(), to, size));
}

void ReportOnFrame(const HostContext& context, const char* literal, std::int64_t frame) noexcept {
  try {
    const std::string text = tessel::utility::ReplaceInString(
        tessel::config::Localizer::Localize(literal), tessel::utility::NumberToString(frame));
    ConvertToHostText(context, text, context.out->return_msg, HX_RETURN_MSG_SIZE);
    context.out->out_flags |= HX_OUT_FLAG_SHOW_MESSAGE;
  } catch (...) {
  }
}

}  // namespace

void ShowMessage(const HostContext& context, const char* text) {
  context.out->out_flags |= HX_OUT_FLAG_SHOW_MESSAGE;
  LeaveMessage(context, text);
}

void LeaveMessage(const HostContext& context, const char* text) {
  context.in->cb->copy_text(context.out->return_msg, HX_RETURN_MSG_SIZE, text);
}

void ClearMessage(const HostContext& context) {
  context.out->out_flags &= ~std::uint32_t{HX_OUT_FLAG_SHOW_MESSAGE};
  context.out->return_msg[0] = '\0';
}

void ConvertToHostText(const HostContext& context, const std::string& text, char* to,
                       std::uint32_t size) {
  ConvertUnits(context, tessel::utility::ToUTF16(text), to, size);
}

void ConvertToHostText(const HostContext& context, const std::u16string& text,
                       char (&to)[kHostTextSize]) {
  ConvertUnits(context, text, to, kHostTextSize);
}

std::u16string UnitsToText(const std::uint16_t (&units)[kHostUnits]) {
  return std::u16string(units, std::find(units, units + kHostUnits, 0));
}

std::string TakeText(const HX_StringSuite1& strings, HX_String string) {
  const auto dispose = [&strings](HX_String held) { strings.Dispose(held); };
  const std::unique_ptr<std::remove_pointer_t<HX_String>, decltype(dispose)> own(string, dispose);
  const char* bytes = nullptr;
  ThrowIfFailed(strings.GetUTF8(string, &bytes));
  return bytes != nullptr ? bytes : "";
}

const char* GetString(const HostContext& context, std::int32_t index) {
  const std::uint64_t token = GlobalsLock(context)->string_token;
  const char* text = context.in->cb->get_string(token, index, 0, 0);
  return text ? text : "";
}

void ShowAboutText(const HostContext& context) {
  char text[kFormatSize];
  context.in->cb->format(text, GetString(context, kAboutString), kMajorVersion, kMinorVersion);
  context.in->cb->copy_text(context.out->return_msg, HX_RETURN_MSG_SIZE, text);
}

void ReportOutOfMemoryOnFrame(const HostContext& context, std::int64_t frame) noexcept {
  ReportOnFrame(context, kOutOfMemory, frame);
}

void ReportUnknownExceptionOnFrame(const HostContext& context, std::int64_t frame) noexcept {
  ReportOnFrame(context, kGenericError, frame);
}

}  // namespace kelp::effect
