#include "analysis/src/host_access.h"

#include <algorithm>
#include <vector>

namespace kelp::analysis {
namespace {
constexpr char kMissingSuiteMessage[] = "Not able to acquire OVK Suite.";
}

void ShowMessage(HX_InData* host_in, HX_OutData* host_out, const std::string& text) {
  host_out->out_flags |= HX_OUT_FLAG_SHOW_MESSAGE;
  host_in->cb->copy_text(host_out->return_msg, HX_RETURN_MSG_SIZE, text.c_str());
}

SuiteReference::SuiteReference(HX_InData* host_in, HX_OutData* host_out, const char* name,
                               std::int32_t version)
    : basic_(host_in->basic), name_(name), version_(version) {
  if (basic_->acquire(name, version, &table_) == HX_ERR_NONE) return;
  ShowMessage(host_in, host_out, kMissingSuiteMessage);
  throw std::int32_t{HX_ERR_MISSING_SUITE};
}

void ConvertToHostText(HX_InData* host_in, HX_OutData* host_out, const std::u16string& text,
                       char (&to)[kHostTextSize]) {
  std::vector<std::uint16_t> units(text.begin(), text.end());
  units.push_back(0);
  const ScopedSuite<HX_PrivateEffectSuite3> suite(host_in, host_out, HX_PRIVATE_EFFECT_SUITE,
                                                  HX_PRIVATE_EFFECT_SUITE_VERSION);
  ThrowIfFailed(suite->ConvertText(units.data(), to, kHostTextSize));
}

std::u16string UnitsToText(const std::uint16_t (&units)[kHostUnits]) {
  return std::u16string(units, std::find(units, units + kHostUnits, 0));
}

}  // namespace kelp::analysis
