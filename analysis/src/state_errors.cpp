#include "analysis/src/state_errors.h"

#include "effect/host_text.h"
#include "effect/suite.h"
#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

namespace kelp::analysis {
namespace {

constexpr std::int32_t kErrorCode = 1273;
constexpr char kDimensions[] = "$$$/Plugin/AnalysisState/Errors/DimensionSubstring=@0x@1";
constexpr char kSizeMismatch[] =
    "$$$/Plugin/AnalysisState/Error/SizeMismatch=^1 for layer #{ldquo}^2#{rdquo} requires "
    "re-analysis because the source dimensions have changed from ^3 to ^4.";

std::string SizeText(const kelp::effect::SourceShape& size) {
  using tessel::utility::NumberToString;
  return tessel::utility::ReplaceInString(tessel::config::Localizer::Localize(kDimensions),
                                          NumberToString(size.width), NumberToString(size.height));
}

// A report is worth more than the name in it.
std::string LayerName(HX_InData* host_in, HX_OutData* host_out) {
  std::uint16_t units[effect::kHostUnits] = {};
  try {
    const effect::ScopedSuite<HX_UtilitySuite> suite(effect::RecordsOnly(host_in, host_out),
                                                     HX_UTILITY_SUITE_VERSION_3);
    effect::ThrowIfFailed(suite->GetLayerName(host_in->effect_ref, units, effect::kHostUnits));
  } catch (std::int32_t) {
    return {};
  }
  return tessel::utility::ToUTF8(effect::UnitsToText(units));
}

}  // namespace

void ReportStateError(HX_InData* host_in, HX_OutData* host_out, const char* literal,
                      std::initializer_list<std::string> values, AfterReport after) {
  std::string text = tessel::config::Localizer::Localize(literal);
  text = tessel::utility::ReplacePlaceholders(text, values, '^', '1');
  try {
    tessel::config::ThrowError(text, kErrorCode);
  } catch (const tessel::config::Error& error) {
    effect::ShowMessage(effect::RecordsOnly(host_in, host_out), error.what());
  }
  if (after == AfterReport::Throw) throw StateDeserializationFailed(text);
}

void ReportSizeMismatch(HX_InData* host_in, HX_OutData* host_out, const std::string& effect_name,
                        const kelp::effect::SourceShape& stored,
                        const kelp::effect::SourceShape& present, AfterReport after) {
  const std::string layer = LayerName(host_in, host_out);
  ReportStateError(host_in, host_out, kSizeMismatch,
                   {effect_name, layer, SizeText(stored), SizeText(present)}, after);
}

}  // namespace kelp::analysis
