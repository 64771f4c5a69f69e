#pragma once

#include <cstdint>
#include <string>

#include "platform/hx/hx_suites.h"

// The few things of the host that this folder needs. Functions throw the host's code, a 32-bit
// integer, where it refuses.
namespace kelp::analysis {

inline void ThrowIfFailed(HX_Err code) {
  if (code != HX_ERR_NONE) throw std::int32_t{code};
}

// Writes the return message, cut between characters, and tells the host to show it.
void ShowMessage(HX_InData* host_in, HX_OutData* host_out, const std::string& text);

// A suite for a scope. Where the host has none: the message goes to the user, and
// HX_ERR_MISSING_SUITE is thrown.
class SuiteReference {
 public:
  SuiteReference(HX_InData* host_in, HX_OutData* host_out, const char* name, std::int32_t version);
  ~SuiteReference() { basic_->release(name_, version_); }
  SuiteReference(const SuiteReference&) = delete;
  SuiteReference& operator=(const SuiteReference&) = delete;

 protected:
  const void* table_ = nullptr;

 private:
  const HX_BasicSuite* const basic_;
  const char* const name_;
  const std::int32_t version_;
};

template <class Table>
class ScopedSuite : private SuiteReference {
 public:
  using SuiteReference::SuiteReference;
  const Table* operator->() const { return static_cast<const Table*>(table_); }
  const Table& operator*() const { return *static_cast<const Table*>(table_); }
};

// Bytes of a text in the host's form, with the terminating zero.
inline constexpr std::uint32_t kHostTextSize = 256;
void ConvertToHostText(HX_InData* host_in, HX_OutData* host_out, const std::u16string& text,
                       char (&to)[kHostTextSize]);

// Units of a text that the host writes, with the terminating zero.
inline constexpr std::uint32_t kHostUnits = 256;
std::u16string UnitsToText(const std::uint16_t (&units)[kHostUnits]);

}  // namespace kelp::analysis
