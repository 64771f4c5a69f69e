#pragma once

#include <cstdint>
#include <string>

#include "effect/host_context.h"
#include "platform/hx/hx_suites.h"

// Texts on their way to the host. UTF-8 within the effect; the host's form in its records.
namespace kelp::effect {

// Writes the return message, cut to its room between characters, and tells the host to show it.
void ShowMessage(const HostContext& context, const char* text);
// Writes it, and leaves it to the host whether it shows it.
void LeaveMessage(const HostContext& context, const char* text);
// Takes either back: for failures that the user learns of in another way.
void ClearMessage(const HostContext& context);

// Text to the host's form, at most `size` bytes with the terminating zero. Throws the host's code.
void ConvertToHostText(const HostContext& context, const std::string& text, char* to,
                       std::uint32_t size);

// Bytes of a text in the host's form, and units of one that the host writes, each with the
// terminating zero.
inline constexpr std::uint32_t kHostTextSize = 256;
inline constexpr std::uint32_t kHostUnits = 256;
void ConvertToHostText(const HostContext& context, const std::u16string& text,
                       char (&to)[kHostTextSize]);
std::u16string UnitsToText(const std::uint16_t (&units)[kHostUnits]);

// The text of a string, which is disposed of. Throws the host's code.
std::string TakeText(const HX_StringSuite1& strings, HX_String string);

// Text of the string table; "" for a kept place and outside the table. Valid until the plug-in is
// stopped. Throws HX_ERR_HANDLE_LOCK when the global data can't be reached.
const char* GetString(const HostContext& context, std::int32_t index);

// The about text as return message.
void ShowAboutText(const HostContext& context);

// The reports of the two failures that have no code of their own, for the frame of the current
// time. What fails in a report is dropped.
void ReportOutOfMemoryOnFrame(const HostContext& context, std::int64_t frame) noexcept;
void ReportUnknownExceptionOnFrame(const HostContext& context, std::int64_t frame) noexcept;

}  // namespace kelp::effect
