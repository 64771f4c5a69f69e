#include "apps/calmframe/controls.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <iterator>
#include <sstream>
#include <utility>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/nearest_match.h"
#include "apps/calmframe/param_text.h"
#include "platform/tessel/debug.h"

namespace calmframe {
namespace {

// Disk ids of the effect's parameters.
enum : std::int32_t {
  kActionSafeMargin = 3,
  kMaximumScale = 4,
  kAdditionalScale = 16,
  kResult = 19,
  kSmoothness = 20,
  kFraming = 22,
  kCropLessSmoothMore = 23,
  kHideWarningBanner = 26,
  kMethod = 28,
  kSynthesisEdgeFeather = 35,
  kDetailedAnalysis = 36,
  kRollingShutterRipple = 37,
  kSynthesisInputRange = 38
};

using Choices = std::vector<std::pair<std::string, double>>;

std::string NoneOf(const std::string& text, const std::vector<std::string>& names) {
  const std::string nearest = NearestMatch(text, names);
  std::string all;
  for (const std::string& name : names) all += (all.empty() ? "" : ", ") + name;
  return "'" + text + "' is none of " + all +
         (nearest.empty() ? "" : "; did you mean " + nearest + "?");
}

// A flag that takes one of a few names; an unknown one is answered with the nearest.
void AddChoice(CLI::App& command, ControlFlags& flags, const std::string& flag,
               std::int32_t disk_id, const Choices& choices, const std::string& default_name,
               const std::string& description) {
  std::vector<std::string> names;
  std::string shown;
  for (const auto& choice : choices) {
    names.push_back(choice.first);
    shown += (shown.empty() ? "" : "|") + choice.first;
  }
  const auto take = [flag, names, choices, disk_id, &flags](const std::string& text) {
    for (const auto& [name, value] : choices) {
      if (name == text) {
        flags.values[disk_id] = value;
        return;
      }
    }
    throw CLI::ValidationError(flag, NoneOf(text, names));
  };
  command.add_option_function<std::string>(flag, take, description)
      ->type_name(shown)
      ->default_str(default_name)
      ->group("Controls");
}

void AddNumber(CLI::App& command, ControlFlags& flags, const std::string& flag,
               std::int32_t disk_id, const std::string& unit, double least, double most,
               double default_value, const std::string& description) {
  // CLI::Range lets "nan" through.
  const auto check = [least, most](const std::string& text) {
    double number = 0;
    const bool valid = CLI::detail::lexical_cast(text, number) && number >= least && number <= most;
    std::ostringstream message;
    if (!valid) message << text << " is not in the range " << least << " to " << most;
    return message.str();
  };
  std::ostringstream shown;
  shown << default_value;
  command
      .add_option_function<double>(
          flag, [disk_id, &flags](double value) { flags.values[disk_id] = value; }, description)
      ->check(check)
      ->type_name(unit)
      ->default_str(shown.str())
      ->group("Controls");
}

void AddSwitch(CLI::App& command, ControlFlags& flags, const std::string& flag,
               std::int32_t disk_id, const std::string& description) {
  command
      .add_flag_callback(
          flag, [disk_id, &flags] { flags.values[disk_id] = 1; }, description)
      ->group("Controls");
}

bool SameWord(const std::string& a, const std::string& b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](unsigned char x, unsigned char y) {
    return std::tolower(x) == std::tolower(y);
  });
}

// The one parameter of that name that has a value.
const HX_ParamDef& FindParam(const std::string& name, const std::vector<HX_ParamDef>& declared) {
  std::vector<std::string> names;
  for (const HX_ParamDef& param : declared) {
    if (!IsControl(param)) continue;
    if (SameWord(param.name, name)) return param;
    names.push_back(param.name);
  }
  const std::string nearest = NearestMatch(name, names);
  throw UsageFailure(
      "--param: there is no parameter '" + name + "'" +
      (nearest.empty() ? "; calmframe params lists them" : "; did you mean '" + nearest + "'?"));
}

double ParseValue(const HX_ParamDef& param, const std::string& text) {
  char* end = nullptr;
  const double number = std::strtod(text.c_str(), &end);
  const bool is_number = !text.empty() && *end == 0 && std::isfinite(number);
  const auto refuse = [&](const std::string& why) -> double {
    throw UsageFailure("--param " + std::string(param.name) + ": " + why);
  };
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER: {
      const auto least = double{param.u.fs.valid_min}, most = double{param.u.fs.valid_max};
      if (is_number && number >= least && number <= most) return number;
      return refuse(text + " is not in the range " + NumberText(least) + " to " + NumberText(most));
    }
    case HX_PARAM_CHECKBOX:
      if (SameWord(text, "on") || SameWord(text, "true") || text == "1") return 1;
      if (SameWord(text, "off") || SameWord(text, "false") || text == "0") return 0;
      return refuse("'" + text + "' is neither on nor off");
    default: {
      const std::vector<std::string> items = PopupItems(param);
      for (std::size_t i = 0; i < items.size(); ++i) {
        if (SameWord(items[i], text)) return static_cast<double>(i + 1);
      }
      if (is_number && number == std::floor(number) && number >= 1 &&
          number <= static_cast<double>(items.size())) {
        return number;
      }
      return refuse(NoneOf(text, items));
    }
  }
}

}  // namespace

void AddControlFlags(CLI::App& command, ControlFlags& flags) {
  AddChoice(command, flags, "--result", kResult, {{"smooth-motion", 1}, {"no-motion", 2}},
            "smooth-motion", "Keep the camera's motion but smooth, or hold it still");
  AddNumber(command, flags, "--smoothness", kSmoothness, "PERCENT", 0, 1000, 50,
            "How much of the camera's motion is smoothed away");
  AddChoice(
      command, flags, "--method", kMethod,
      {{"position", 1}, {"position-scale-rotation", 2}, {"perspective", 3}, {"subspace-warp", 4}},
      "subspace-warp", "What may be done to a frame");
  AddChoice(command, flags, "--framing", kFraming,
            {{"stabilize-only", 1}, {"crop", 2}, {"crop-auto-scale", 3}, {"synthesize-edges", 4}},
            "crop-auto-scale", "What becomes of the moving edges");
  AddNumber(command, flags, "--maximum-scale", kMaximumScale, "PERCENT", 100, 10000, 150,
            "Most that crop-auto-scale may enlarge");
  AddNumber(command, flags, "--action-safe-margin", kActionSafeMargin, "PERCENT", 0, 100, 0,
            "Border that crop-auto-scale need not fill");
  AddNumber(command, flags, "--additional-scale", kAdditionalScale, "PERCENT", 0, 10000, 100,
            "Scale applied on top");
  AddSwitch(command, flags, "--detailed-analysis", kDetailedAnalysis,
            "Track more features; slower");
  AddChoice(command, flags, "--rolling-shutter-ripple", kRollingShutterRipple,
            {{"automatic", 1}, {"enhanced", 2}}, "automatic",
            "How hard the warp works against rolling shutter");
  AddNumber(command, flags, "--crop-less-smooth-more", kCropLessSmoothMore, "PERCENT", 0, 100, 50,
            "Let the crop window follow less of the motion");
  AddNumber(command, flags, "--synthesis-input-range", kSynthesisInputRange, "SECONDS", 0, 999, 0.5,
            "How far away in time synthesize-edges may take its pixels from");
  AddNumber(command, flags, "--synthesis-edge-feather", kSynthesisEdgeFeather, "PIXELS", 0, 999, 10,
            "How softly synthesize-edges joins frames at their edges");
  AddSwitch(command, flags, "--hide-warning-banner", kHideWarningBanner,
            "Draw no banner over frames that could not be steadied as asked");
  command.add_option("--param", flags.params, "Any parameter of `calmframe params`; repeatable")
      ->type_name("NAME=VALUE")
      ->allow_extra_args(false)
      ->group("Controls");
  command.add_flag("--experimental", flags.experimental, "Offer the experimental parameters too")
      ->group("Controls");
}

bool HasFlag(std::int32_t disk_id) {
  constexpr std::int32_t kFlagged[] = {
      kActionSafeMargin, kMaximumScale,         kAdditionalScale,    kResult, kSmoothness,
      kFraming,          kCropLessSmoothMore,   kHideWarningBanner,  kMethod, kSynthesisEdgeFeather,
      kDetailedAnalysis, kRollingShutterRipple, kSynthesisInputRange};
  return std::find(std::begin(kFlagged), std::end(kFlagged), disk_id) != std::end(kFlagged);
}

void ShowExperimentalParameters(const ControlFlags& flags) {
  constexpr char kOption[] = "ShowExperimentalEffectParameters";
  if (!flags.experimental || tessel::debug::DebugDatabase::GetBool(kOption)) return;
  tessel::debug::DebugDatabase::Set(kOption, 1);
  // The solve's log comes with the option; who wants that sets it in the environment.
  tessel::debug::SetSink([](const std::string&) {});
}

std::map<std::int32_t, double> ResolveControls(const ControlFlags& flags,
                                               const std::vector<HX_ParamDef>& declared) {
  std::map<std::int32_t, double> values = flags.values;
  for (const std::string& setting : flags.params) {
    const std::size_t sign = setting.find('=');
    if (sign == std::string::npos) {
      throw UsageFailure("--param takes NAME=VALUE, not '" + setting + "'");
    }
    const HX_ParamDef& param = FindParam(setting.substr(0, sign), declared);
    values[param.disk_id] = ParseValue(param, setting.substr(sign + 1));
  }
  return values;
}

}  // namespace calmframe
