#include "apps/calmframe/controls.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <variant>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "host/base/param_text.h"
#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"

namespace calmframe {
namespace {

constexpr char kControls[] = "Controls";
constexpr char kFinerControls[] = "Finer controls";

struct Slider {
  HX_SliderControl control;
  const char* unit;
};

struct Choice {
  std::string name;
  double value;
  std::string meaning;  // goes on where the flag's description ends
};
struct Popup {
  HX_PopupControl control;
  std::vector<Choice> choices;
};

struct Switch {
  HX_CheckboxControl control;
};

struct Flag {
  const char* name;
  std::variant<Slider, Popup, Switch> kind;
  const char* description;
  const char* group = kFinerControls;
};

std::int32_t DiskIdOf(const Flag& flag) {
  return std::visit([](const auto& kind) { return kind.control.disk_id; }, flag.kind);
}

// In the order of the help.
const std::vector<Flag>& Flags() {
  static const std::vector<Flag> flags = {
      {"--smoothness", Slider{HX_SMOOTHNESS, "PERCENT"},
       "How much of the camera's motion is smoothed away: more is calmer and crops more",
       kControls},
      {"--result",
       Popup{HX_RESULT,
             {{"smooth-motion", host::kSmoothMotion, "keeps them but calms them"},
              {"no-motion", host::kNoMotion, "holds the picture still as on a tripod"}}},
       "The camera's own moves", kControls},
      {"--framing",
       Popup{HX_FRAMING,
             {{"crop-auto-scale", host::kCropAutoScale,
               "cuts them off and enlarges the rest to the full frame"},
              {"crop", host::kCrop, "only cuts them off"},
              {"stabilize-only", host::kStabilizeOnly, "shows them"},
              {"synthesize-edges", host::kSynthesizeEdges,
               "fills them from the frames before and after"}}},
       "The edges that the motion lays bare", kControls},
      {"--method",
       Popup{HX_METHOD,
             {{"subspace-warp", 4, "bends each part of it"},
              {"perspective", 3, "tilts it"},
              {"position-scale-rotation", 2, "turns and resizes it"},
              {"position", 1, "only shifts it"}}},
       "How far a frame is changed, less where the picture comes out bent", kControls},
      {"--maximum-scale", Slider{HX_MAXIMUM_SCALE, "PERCENT"},
       "The most that crop-auto-scale may enlarge; what that leaves empty stays black"},
      {"--crop-less-smooth-more", Slider{HX_CROP_LESS_SMOOTH_MORE, "PERCENT"},
       "How still the crop window stands: above 50 it follows less of the motion, which is "
       "calmer and crops more; below 50 it gives way to sudden moves"},
      {"--additional-scale", Slider{HX_ADDITIONAL_SCALE, "PERCENT"},
       "A scale on top of the others"},
      {"--action-safe-margin", Slider{HX_ACTION_SAFE_MARGIN, "PERCENT"},
       "A border of the frame that crop-auto-scale need not fill"},
      {"--detailed-analysis", Switch{HX_DETAILED_ANALYSIS},
       "Track four times as many features in larger windows, for clips whose motion comes "
       "out wrong; slower"},
      {"--rolling-shutter-ripple",
       Popup{HX_ROLLING_SHUTTER_RIPPLE,
             {{"automatic", 1, "works where it is sure"},
              {"enhanced", 2, "works harder, on less evidence"}}},
       "What perspective and subspace-warp do against the wobble of a rolling shutter"},
      {"--synthesis-input-range", Slider{HX_SYNTHESIS_INPUT_RANGE, "SECONDS"},
       "How far away in time synthesize-edges looks for pixels; more fills more and is slower"},
      {"--synthesis-edge-feather", Slider{HX_SYNTHESIS_EDGE_FEATHER, "PIXELS"},
       "How softly synthesize-edges joins one frame to another"}};
  return flags;
}

CLI::Option* Add(CLI::App& command, ControlFlags& flags, const Flag& flag, const Slider& slider) {
  const HX_SliderControl& control = slider.control;
  const auto take = [id = control.disk_id, &flags](double value) { flags.values[id] = value; };
  return AddNumber<double>(command, flag.name, take, slider.unit, control.min, control.max,
                           flag.description)
      ->default_str(NumberText(control.default_value));
}

CLI::Option* Add(CLI::App& command, ControlFlags& flags, const Flag& flag, const Popup& popup) {
  std::vector<std::string> names;
  std::string meanings, default_name;
  for (const Choice& choice : popup.choices) {
    meanings += (names.empty() ? ": " : "; ") + choice.name + " " + choice.meaning;
    names.push_back(choice.name);
    if (choice.value == popup.control.default_item) default_name = choice.name;
  }
  const auto take = [&popup, &flags](const std::string& text) {
    for (const Choice& choice : popup.choices) {
      if (choice.name == text) flags.values[popup.control.disk_id] = choice.value;
    }
  };
  return AddChoice(command, flag.name, take, names, flag.description + meanings)
      ->default_str(default_name);
}

CLI::Option* Add(CLI::App& command, ControlFlags& flags, const Flag& flag, const Switch& checkbox) {
  return command.add_flag_callback(
      flag.name, [id = checkbox.control.disk_id, &flags] { flags.values[id] = 1; },
      flag.description);
}

}  // namespace

void AddControlFlags(CLI::App& command, ControlFlags& flags) {
  for (const Flag& flag : Flags()) {
    std::visit([&](const auto& kind) { Add(command, flags, flag, kind)->group(flag.group); },
               flag.kind);
  }
  command.add_option("--param", flags.params, "Any parameter of `calmframe params`; repeatable")
      ->type_name("NAME=VALUE")
      ->allow_extra_args(false)
      ->group(kFinerControls);
  command.add_flag("--experimental", flags.experimental, "Offer the experimental parameters too")
      ->group(kFinerControls);
  // Of 0.1.0; what it asked for is so without it.
  command.add_flag("--hide-warning-banner")->group("");
}

bool HasFlag(std::int32_t disk_id) {
  return std::any_of(Flags().begin(), Flags().end(),
                     [disk_id](const Flag& flag) { return DiskIdOf(flag) == disk_id; });
}

std::vector<HX_ParamDef> OfferedParams(const ControlFlags& flags,
                                       const std::vector<HX_ParamDef>& declared) {
  const std::size_t count = flags.experimental ? declared.size() : HX_FIRST_EXPERIMENTAL;
  return {declared.begin(),
          declared.begin() + static_cast<std::ptrdiff_t>(std::min(count, declared.size()))};
}

std::map<std::int32_t, double> ResolveControls(const ControlFlags& flags,
                                               const std::vector<HX_ParamDef>& declared) {
  std::map<std::int32_t, double> values = flags.values;
  for (const std::string& setting : flags.params) {
    // Names have such signs too: "Max Count, 0=auto".
    const HX_ParamDef* param = nullptr;
    std::size_t sign = setting.find('=');
    const std::size_t last = setting.rfind('=');
    while (sign != std::string::npos && !(param = FindParam(setting.substr(0, sign), declared))) {
      sign = setting.find('=', sign + 1);
    }
    if (last == std::string::npos) {
      throw UsageFailure("--param takes NAME=VALUE, not '" + setting + "'");
    }
    if (!param) {
      throw UsageFailure("--param: " +
                         UnknownParamText(setting.substr(0, last), OfferedParams(flags, declared)));
    }
    if (!flags.experimental && param - declared.data() >= HX_FIRST_EXPERIMENTAL) {
      throw UsageFailure("--param " + std::string(param->name) +
                         ": is experimental, which takes --experimental");
    }
    try {
      values[param->disk_id] = ParamValueOf(*param, setting.substr(sign + 1));
    } catch (const ParamRefused& refused) {
      throw UsageFailure(std::string("--param ") + refused.what());
    }
  }
  return values;
}

}  // namespace calmframe
