#include "apps/calmframe/controls.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <iterator>
#include <utility>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/param_text.h"
#include "host/base/nearest_match.h"
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

constexpr char kControls[] = "Controls";
constexpr char kFinerControls[] = "Finer controls";

struct Choice {
  std::string name;
  double value;
  std::string meaning;  // goes on where the flag's description ends
};

// A popup; the choice that holds without the flag first.
CLI::Option* AddPopup(CLI::App& command, ControlFlags& flags, const std::string& flag,
                      std::int32_t disk_id, const std::vector<Choice>& choices,
                      const std::string& description) {
  std::vector<std::string> names;
  std::string meanings;
  for (const Choice& choice : choices) {
    meanings += (names.empty() ? ": " : "; ") + choice.name + " " + choice.meaning;
    names.push_back(choice.name);
  }
  const auto take = [choices, disk_id, &flags](const std::string& text) {
    for (const Choice& choice : choices) {
      if (choice.name == text) flags.values[disk_id] = choice.value;
    }
  };
  return AddChoice(command, flag, take, names, description + meanings)->default_str(names[0]);
}

CLI::Option* AddSlider(CLI::App& command, ControlFlags& flags, const std::string& flag,
                       std::int32_t disk_id, const std::string& unit, double least, double most,
                       double default_value, const std::string& description) {
  const auto take = [disk_id, &flags](double value) { flags.values[disk_id] = value; };
  return AddNumber<double>(command, flag, take, unit, least, most, description)
      ->default_str(NumberText(default_value));
}

void AddSwitch(CLI::App& command, ControlFlags& flags, const std::string& flag,
               std::int32_t disk_id, const std::string& description) {
  command
      .add_flag_callback(
          flag, [disk_id, &flags] { flags.values[disk_id] = 1; }, description)
      ->group(kFinerControls);
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
      return refuse(text + " is out of range: " + NumberText(least) + " to " + NumberText(most));
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
  AddSlider(command, flags, "--smoothness", kSmoothness, "PERCENT", 0, 1000, 50,
            "How much of the camera's motion is smoothed away: more is calmer and crops more")
      ->group(kControls);
  AddPopup(command, flags, "--result", kResult,
           {{"smooth-motion", 1, "keeps them but calms them"},
            {"no-motion", 2, "holds the picture still as on a tripod"}},
           "The camera's own moves")
      ->group(kControls);
  AddPopup(command, flags, "--framing", kFraming,
           {{"crop-auto-scale", 3, "cuts them off and enlarges the rest to the full frame"},
            {"crop", 2, "only cuts them off"},
            {"stabilize-only", 1, "shows them"},
            {"synthesize-edges", 4, "fills them from the frames before and after"}},
           "The edges that the motion lays bare")
      ->group(kControls);
  AddPopup(command, flags, "--method", kMethod,
           {{"subspace-warp", 4, "bends each part of it"},
            {"perspective", 3, "tilts it"},
            {"position-scale-rotation", 2, "turns and resizes it"},
            {"position", 1, "only shifts it"}},
           "How far a frame is changed, less where the picture comes out bent")
      ->group(kControls);

  AddSlider(command, flags, "--maximum-scale", kMaximumScale, "PERCENT", 100, 10000, 150,
            "The most that crop-auto-scale may enlarge; what that leaves empty stays black")
      ->group(kFinerControls);
  AddSlider(command, flags, "--crop-less-smooth-more", kCropLessSmoothMore, "PERCENT", 0, 100, 50,
            "How still the crop window stands: above 50 it follows less of the motion, which is "
            "calmer and crops more; below 50 it gives way to sudden moves")
      ->group(kFinerControls);
  AddSlider(command, flags, "--additional-scale", kAdditionalScale, "PERCENT", 0, 10000, 100,
            "A scale on top of the others")
      ->group(kFinerControls);
  AddSlider(command, flags, "--action-safe-margin", kActionSafeMargin, "PERCENT", 0, 100, 0,
            "A border of the frame that crop-auto-scale need not fill")
      ->group(kFinerControls);
  AddSwitch(command, flags, "--detailed-analysis", kDetailedAnalysis,
            "Track four times as many features in larger windows, for clips whose motion comes "
            "out wrong; slower");
  AddPopup(command, flags, "--rolling-shutter-ripple", kRollingShutterRipple,
           {{"automatic", 1, "works where it is sure"},
            {"enhanced", 2, "works harder, on less evidence"}},
           "What perspective and subspace-warp do against the wobble of a rolling shutter")
      ->group(kFinerControls);
  AddSlider(command, flags, "--synthesis-input-range", kSynthesisInputRange, "SECONDS", 0, 999, 0.5,
            "How far away in time synthesize-edges looks for pixels; more fills more and is slower")
      ->group(kFinerControls);
  AddSlider(command, flags, "--synthesis-edge-feather", kSynthesisEdgeFeather, "PIXELS", 0, 999, 10,
            "How softly synthesize-edges joins one frame to another")
      ->group(kFinerControls);
  AddSwitch(command, flags, "--hide-warning-banner", kHideWarningBanner,
            "Draw no banner over frames that could not be steadied as asked");
  command.add_option("--param", flags.params, "Any parameter of `calmframe params`; repeatable")
      ->type_name("NAME=VALUE")
      ->allow_extra_args(false)
      ->group(kFinerControls);
  command.add_flag("--experimental", flags.experimental, "Offer the experimental parameters too")
      ->group(kFinerControls);
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
