// Whatever a text says that a person, a list or a file of the program's own gives it, it is refused
// with a line or means something, and what it means can be told as a text that means the same.

#include <CLI/CLI.hpp>
#include <cmath>
#include <cstdlib>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "apps/calmframe/controls.h"
#include "apps/calmframe/failures.h"
#include "apps/calmframe/stretch.h"
#include "fuzz/input.h"
#include "fuzz/scratch_file.h"
#include "host/base/param_text.h"
#include "host/batch/plan.h"
#include "host/batch/record.h"
#include "host/effects/host.h"
#include "host/media/clip_files.h"
#include "host/stabilize/choice.h"
#include "library/control_set.h"
#include "library/refusal.h"
#include "tests/support/linked_plugin.h"

namespace {

using namespace calmframe;

enum class Reader : std::uint8_t {
  command_line,  // words, each to its zero
  parameter,     // a name to its zero, a value
  moment,
  choice,
  plan,      // of a batch
  record,    // of what became of a clip
  numbered,  // pictures
  count
};

void Expect(bool holds) {
  if (!holds) std::abort();
}

const std::vector<HX_ParamDef>& Declared() {
  static const auto& host = *[] {
    host::HostSettings settings;
    settings.experimental_parameters = true;
    return new host::Host(host::LinkedPlugin(), settings);
  }();
  return host.declarations();
}

media::ClipInfo Clip() {
  media::ClipInfo clip;
  clip.frame_count = 50;
  return clip;
}

void ReadCommandLine(fuzz::Input& input) {
  CLI::App app;
  ControlFlags controls;
  Stretch stretch;
  AddControlFlags(app, controls);
  AddStretchFlags(app, stretch, BareNumber::seconds);
  std::vector<std::string> words;
  while (!input.is_over()) words.insert(words.begin(), input.TakeText());
  try {
    app.parse(words);
    ResolveControls(controls, Declared());
    CheckOrder(stretch);
    const media::FrameRange frames = FramesOf(stretch, Clip());
    Expect(frames.first < frames.end && frames.end <= Clip().frame_count);
  } catch (const CLI::Error&) {
  } catch (const UsageFailure&) {
  }
}

void ReadParameter(fuzz::Input& input) {
  library::ControlSet controls(Declared());
  const std::string name = input.TakeText(), value = input.TakeRest();
  try {
    controls.Set(name, value);
  } catch (const library::Refusal&) {
  } catch (const ParamRefused&) {
  }
  controls.Json();
  const HX_ParamDef* const param = FindParam(name, Declared());
  if (!param) return;
  try {
    const double number = ParamValueOf(*param, value);
    Expect(std::isfinite(number));
    // Six digits.
    const double again = ParamValueOf(*param, ValueText(*param, number));
    Expect(std::abs(again - number) <= 1e-5 * std::abs(number));
  } catch (const ParamRefused&) {
  }
}

void ReadMoment(fuzz::Input& input) {
  const std::string text = input.TakeRest();
  for (const BareNumber bare : {BareNumber::seconds, BareNumber::frame}) {
    const std::optional<Moment> moment = MomentOf(text, bare);
    Expect(moment.has_value() == MomentTrouble(text, bare).empty());
    if (!moment) continue;
    Expect(std::isfinite(moment->value) && moment->value >= 0);
    TimeText(Clip(), FrameAt(*moment, Clip()));
  }
}

void ReadChoice(fuzz::Input& input) {
  const std::optional<host::Choice> choice = host::Choice::Parse(input.TakeRest());
  if (!choice) return;
  choice->Text();
  choice->Why();
  const std::string once = choice->Json().dump();
  // What is not finite has no number in JSON.
  const std::optional<host::Choice> again = host::Choice::Parse(once);
  if (again) Expect(again->Json().dump() == once);
}

void ReadPlan(fuzz::Input& input) {
  try {
    const std::string once = TextOf(batch::PlanOf(input.TakeRest()));
    Expect(TextOf(batch::PlanOf(once)) == once);
  } catch (const nlohmann::json::exception&) {
  }
}

void ReadRecord(fuzz::Input& input) {
  static const fuzz::ScratchFile file;
  file.Write(input.TakeRest());
  const std::optional<batch::Record> record = batch::ReadRecord(file.path());
  if (!record) return;
  const std::string once = TextOf(*record);
  file.Write(once);
  const std::optional<batch::Record> again = batch::ReadRecord(file.path());
  Expect(again && TextOf(*again) == once);
}

void ReadNumbered(fuzz::Input& input) {
  const std::string text = input.TakeRest();
  const auto path = media::NumberedPath::Of(text);
  if (!path) return;
  const std::string one = path->At(1);
  Expect(one.starts_with(path->folder + path->before) && one.ends_with(path->after));
  path->Pattern();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  switch (static_cast<Reader>(input.Take<std::uint8_t>() % static_cast<int>(Reader::count))) {
    case Reader::command_line:
      ReadCommandLine(input);
      break;
    case Reader::parameter:
      ReadParameter(input);
      break;
    case Reader::moment:
      ReadMoment(input);
      break;
    case Reader::choice:
      ReadChoice(input);
      break;
    case Reader::plan:
      ReadPlan(input);
      break;
    case Reader::record:
      ReadRecord(input);
      break;
    default:
      ReadNumbered(input);
  }
  return 0;
}
