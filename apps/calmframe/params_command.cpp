#include "apps/calmframe/params_command.h"

#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/plugin_path.h"
#include "host/base/param_text.h"
#include "host/effects/host.h"
#include "host/project/project_file.h"

namespace calmframe {
namespace {

std::string RangeText(const HX_ParamDef& param) {
  if (param.kind == HX_PARAM_CHECKBOX) return "on, off";
  if (param.kind == HX_PARAM_FLOAT_SLIDER) {
    return NumberText(WrittenNumber(param.u.fs.valid_min)) + " to " +
           NumberText(WrittenNumber(param.u.fs.valid_max));
  }
  std::string text;
  for (const std::string& item : PopupItems(param)) text += (text.empty() ? "" : " | ") + item;
  return text;
}

nlohmann::ordered_json JsonOf(const HX_ParamDef& param, double value) {
  nlohmann::ordered_json json;
  json["id"] = param.disk_id;
  json["name"] = param.name;
  json.update(DeclarationJson(param));
  json["value"] = value;
  return json;
}

}  // namespace

ParamsCommand::ParamsCommand(CLI::App& program)
    : Command(AddCommand(
          program, "params",
          "List every parameter with its range and default\n\n"
          "The names are those that --param takes. Where a value differs from the default, by a "
          "flag or in saved work, it is told too.",
          "Examples:\n"
          "  calmframe params\n"
          "  calmframe params --experimental --param \"Rank=12\" --json")) {
  AddFile(parser_, "--project", project_, "Tell the values that this saved work has",
          Need::optional);
  AddSwitch(parser_, "--json", json_, "As a JSON array");
  AddControlFlags(parser_, controls_);
}

void ParamsCommand::Run() {
  host::HostSettings settings;
  settings.experimental_parameters = true;  // which of them are offered is seen to below
  std::vector<HX_ParamDef> params;
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  try {
    const host::Host host(PluginPath(), settings);
    std::map<std::int32_t, double> given = ResolveControls(controls_, host.declarations());
    if (!project_.empty()) given.merge(host::LoadProject(project_).shots.front().effect.values);
    for (const HX_ParamDef& param : OfferedParams(controls_, host.declarations())) {
      if (!IsControl(param)) continue;
      const auto found = given.find(param.disk_id);
      const double value = found == given.end() ? DefaultOf(param) : found->second;
      if (json_) {
        list.push_back(JsonOf(param, value));
        continue;
      }
      std::printf("%-32s %-9s %s (default %s)", param.name, KindText(param).c_str(),
                  RangeText(param).c_str(), ValueText(param, DefaultOf(param)).c_str());
      if (IsChanged(param, value)) std::printf(", now %s", ValueText(param, value).c_str());
      std::printf("\n");
    }
  } catch (const host::PluginError& error) {
    throw SolveFailure(error.what());
  }
  if (json_) std::printf("%s\n", list.dump(2).c_str());
}

}  // namespace calmframe
