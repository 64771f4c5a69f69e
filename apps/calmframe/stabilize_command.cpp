#include "apps/calmframe/stabilize_command.h"

#include <map>
#include <sstream>
#include <utility>
#include <vector>

#include "apps/calmframe/nearest_match.h"
#include "apps/calmframe/progress_line.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

using kelp::effect::Controls;
using kelp::effect::Method;
using kelp::effect::Result;
using kelp::effect::RollingShutterRipple;

template <class Value>
using Choices = std::vector<std::pair<std::string, Value>>;

// A flag that takes one of a few names; an unknown one is answered with the nearest.
template <class Value>
CLI::Option* AddChoice(CLI::App& command, const std::string& flag, Value& value,
                       const Choices<Value>& choices, const std::string& description) {
  std::vector<std::string> names;
  std::string shown;
  std::string default_name;
  for (const auto& [name, choice] : choices) {
    names.push_back(name);
    shown += (shown.empty() ? "" : "|") + name;
    if (choice == value) default_name = name;
  }
  const auto take = [flag, names, choices, &value](const std::string& text) {
    for (const auto& [name, choice] : choices) {
      if (name == text) {
        value = choice;
        return;
      }
    }
    const std::string nearest = NearestMatch(text, names);
    std::string all;
    for (const std::string& name : names) all += (all.empty() ? "" : ", ") + name;
    throw CLI::ValidationError(flag,
                               "'" + text + "' is none of " + all +
                                   (nearest.empty() ? "" : "; did you mean " + nearest + "?"));
  };
  return command.add_option_function<std::string>(flag, take, description)
      ->type_name(shown)
      ->default_str(default_name)
      ->group("Controls");
}

void AddPercent(CLI::App& command, const std::string& flag, double& value, double least,
                double most, const std::string& description) {
  // CLI::Range lets "nan" through.
  const auto check = [least, most](const std::string& text) {
    double number = 0;
    const bool valid = CLI::detail::lexical_cast(text, number) && number >= least && number <= most;
    std::ostringstream message;
    if (!valid) message << text << " is not in the range " << least << " to " << most;
    return message.str();
  };
  command.add_option(flag, value, description)
      ->check(check)
      ->type_name("PERCENT")
      ->capture_default_str()
      ->group("Controls");
}

}  // namespace

void AddControlFlags(CLI::App& command, Controls& controls) {
  AddChoice<Result>(command, "--result", controls.result,
                    {{"smooth-motion", Result::smooth_motion}, {"no-motion", Result::no_motion}},
                    "Keep the camera's motion but smooth, or hold it still");
  AddPercent(command, "--smoothness", controls.smoothness, 0, 1000,
             "How much of the camera's motion is smoothed away");
  AddChoice<Method>(command, "--method", controls.method,
                    {{"position", Method::position},
                     {"position-scale-rotation", Method::position_scale_rotation},
                     {"perspective", Method::perspective},
                     {"subspace-warp", Method::subspace_warp}},
                    "What may be done to a frame");
  AddChoice<Framing>(command, "--framing", controls.framing,
                     {{"stabilize-only", Framing::stabilize_only},
                      {"crop", Framing::crop},
                      {"crop-auto-scale", Framing::crop_auto_scale}},
                     "What becomes of the moving edges");
  AddPercent(command, "--maximum-scale", controls.maximum_scale, 100, 10000,
             "Most that crop-auto-scale may enlarge");
  AddPercent(command, "--action-safe-margin", controls.action_safe_margin, 0, 100,
             "Border that crop-auto-scale need not fill");
  AddPercent(command, "--additional-scale", controls.additional_scale, 0, 10000,
             "Scale applied on top");
  command
      .add_flag("--detailed-analysis", controls.detailed_analysis, "Track more features; slower")
      ->group("Controls");
  AddChoice<RollingShutterRipple>(command, "--rolling-shutter-ripple",
                                  controls.rolling_shutter_ripple,
                                  {{"automatic", RollingShutterRipple::automatic_reduction},
                                   {"enhanced", RollingShutterRipple::enhanced_reduction}},
                                  "How hard the warp works against rolling shutter");
  AddPercent(command, "--crop-less-smooth-more", controls.crop_less_smooth_more, 0, 100,
             "Let the crop window follow less of the motion");
}

void AddOutputFlags(CLI::App& command, OutputFlags& flags) {
  media::EncodeSettings& encode = flags.output.encode;
  command.add_option("--codec", encode.codec, "Encoder, or the name of what it encodes")
      ->type_name("NAME")
      ->group("Output");
  command.add_option("--crf", encode.crf, "Quality of the encoder: less is better and larger")
      ->check(CLI::Range(0, 63))
      ->capture_default_str()
      ->group("Output");
  command.add_option("--pixel-format", encode.pixel_format, "Pixel format of the encoder")
      ->type_name("NAME")
      ->group("Output");
  command.add_option("--depth", flags.output.depth, "Bits of a component in the render")
      ->check(CLI::IsMember(std::vector<int>{8, 16, 32}))
      ->type_name("8|16|32")
      ->group("Output");
  command.add_option("--threads", flags.threads, "Processors to use")
      ->check(CLI::Range(1, 1024))
      ->group("Output");
  command.add_flag("--overwrite", encode.overwrite, "Replace an existing file")->group("Output");
  command.add_flag("--quiet", flags.quiet, "Show no progress")->group("Output");
}

StabilizeCommand::StabilizeCommand(CLI::App& program)
    : command_(program.add_subcommand("stabilize", "Steady a clip")) {
  command_->add_option("IN", input_, "The shaky clip")->required();
  command_->add_option("OUT", flags_.output.path, "The steady clip to write")->required();
  AddControlFlags(*command_, controls_);
  AddOutputFlags(*command_, flags_);
}

void StabilizeCommand::Run() {
  const tessel::threads::ProcessorLimit limit(flags_.threads);
  ProgressLine progress(flags_.quiet);
  pipeline::Stabilize(input_, controls_, flags_.output, progress);
}

}  // namespace calmframe
