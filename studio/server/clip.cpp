#include "studio/server/clip.h"

#include <algorithm>
#include <filesystem>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "host/stabilize/control_items.h"
#include "platform/hx/hx_controls.h"
#include "studio/wire/roots.h"
#include "studio/wire/told.h"

namespace calmframe::studio {
namespace {

constexpr std::size_t kMostSteps = 200;
constexpr std::size_t kLongestEnd = 1000;
// A frame may be far from where a decoder can begin. One that stands still holds no window up
// longer than this: a browser has six connections to a page's server, and waits with all of them.
constexpr std::chrono::seconds kUntilSilent(15);
constexpr char kSilent[] = "the clip's worker gives no answer";
// Above what a worker counts, so that its numbers differ from those of the one before.
constexpr std::uint64_t kCountsOfAWorker = std::uint64_t{1} << 32;

std::string EndText(int code, const std::string& said) {
  if (code > 128) {
    return "the clip brought its worker down (signal " + std::to_string(code - 128) +
           "); it may be damaged. Your settings are kept; open it to try again";
  }
  return "the clip's worker ended" +
         (said.empty() ? std::string() : ": " + said.substr(0, kLongestEnd));
}

// What is kept may be older.
nlohmann::json OutcomeKept(const nlohmann::json& kept) {
  try {
    return ToldOf({{"outcome", kept.value("outcome", nlohmann::json())}})["outcome"];
  } catch (const BadMessage&) {
    return nullptr;
  }
}

}  // namespace

Clip::Clip(const ClipSurroundings& surroundings, std::string id, std::string path,
           std::string project, std::string keep)
    : surroundings_(surroundings),
      id_(std::move(id)),
      path_(std::move(path)),
      project_(std::move(project)),
      keep_(std::move(keep)),
      has_settings_(project_.empty()),
      patience_(surroundings.context) {
  state_["state"] = "closed";
}

Clip::Clip(const ClipSurroundings& surroundings, const nlohmann::json& kept, std::string keep)
    : Clip(surroundings, kept.at("id").get<std::string>(), kept.value("path", ""),
           kept.value("project", ""), std::move(keep)) {
  if (kept.contains("settings")) {
    settings_ = SettingsOf(kept["settings"]);
    has_settings_ = true;
  }
  state_["outcome"] = OutcomeKept(kept);
}

// Whoever still waits for an answer may be gone, too.
Clip::~Clip() {
  if (worker_) worker_->Close();
}

void Clip::Open() {
  if (worker_) return;
  state_["state"] = "opening";
  state_["error"] = "";
  try {
    worker_ = WorkerProcess::Start(
        surroundings_.context, surroundings_.ending, surroundings_.worker_words,
        {[this](const Message& message) { Take(message); },
         [this](int code, const std::string& said) { End(code, said); }});
  } catch (const std::system_error& error) {
    state_["state"] = "failed";
    state_["error"] = std::string("the clip's worker can't be started: ") + error.what();
    surroundings_.changed(id_, ClipSurroundings::When::now);
    return;
  }
  workers_ += kCountsOfAWorker;
  std::error_code ignored;
  const bool was_kept = std::filesystem::exists(keep_, ignored);
  nlohmann::json head = {{"op", "open"},
                         {"clip", path_},
                         {"project", was_kept ? keep_ : project_},
                         {"keep", keep_},
                         {"roots", surroundings_.roots},
                         {"version", version_}};
  if (has_settings_) head["settings"] = JsonOf(settings_);
  worker_->Send({std::move(head), {}});
  surroundings_.changed(id_, ClipSurroundings::When::now);
}

void Clip::CloseWorker() {
  if (worker_) worker_->Close();
  worker_.reset();
  AnswerAll("the clip was closed");
}

// Whoever hears may ask again.
void Clip::AnswerAll(const std::string& error) {
  silent_ = 0;
  for (auto waiting = std::exchange(waiting_, {}); auto& [number, one] : waiting) {
    if (one.reply) one.reply({{{"error", error}}, {}});
  }
}

void Clip::Take(const Message& message) {
  if (const auto tells = message.head.find("tells"); tells != message.head.end()) {
    return TakeTold(ToldOf(*tells));
  }
  const auto id = message.head.find("id");
  if (id == message.head.end() || !id->is_number_unsigned()) throw BadMessage("an answer to none");
  const auto found = waiting_.find(id->get<std::uint64_t>());
  if (found == waiting_.end()) return;
  const Message answer = AnswerOf(found->second.op, found->second.width, message);
  const Reply reply = std::move(found->second.reply);
  waiting_.erase(found);
  if (!reply) {
    --silent_;  // late
  } else {
    reply(answer);
  }
}

void Clip::TakeTold(nlohmann::json told) {
  for (auto& [key, value] : told.items()) {
    if (key == "settings") {
      settings_ = SettingsOf(value);
      has_settings_ = true;
    } else if (key == "path") {
      // Of saved work alone it isn't known; another clip's it can't become.
      if (path_.empty()) {
        path_ = Roots(surroundings_.roots).ExistingClip(value.get<std::string>());
      }
    } else if (key == "panel" || key == "picture" || key == "curves") {
      state_[key] = workers_ + value.get<std::uint64_t>();
    } else {
      state_[key] = std::move(value);
    }
  }
  surroundings_.changed(id_, ClipSurroundings::When::now);
}

void Clip::End(int code, const std::string& said) {
  worker_.reset();
  state_["state"] = "failed";
  state_["progress"] = nullptr;
  state_["error"] = EndText(code, said);
  AnswerAll(error());
  surroundings_.changed(id_, ClipSurroundings::When::now);
}

const nlohmann::json* Clip::ChoiceShown() const {
  const auto shots = state_.find("shots");
  if (shots == state_.end() || !shots->is_array() || shots->empty()) return nullptr;
  const auto choice = shots->front().find("choice");
  return choice != shots->front().end() && choice->is_object() ? &*choice : nullptr;
}

Settings Clip::ByHand() const {
  Settings settings = settings_;
  const nlohmann::json* const choice = ChoiceShown();
  if (settings.window.as_set || !choice) return settings;
  settings.window.as_set = true;
  for (const nlohmann::json& way : choice->value("candidates", nlohmann::json::array())) {
    if (!way.value("taken", false)) continue;
    if (way.value("window", "") == "follow") {
      settings.window.kind = host::WindowSettings::Kind::follow;
    }
    // Frames that are only moved, turned and sized: of the methods this is the nearest.
    if (!way.value("bends", true)) {
      settings.controls.emplace(HX_METHOD.disk_id, host::kPositionScaleRotation);
    }
    const nlohmann::json changes = way.value("changes", nlohmann::json::object());
    for (const auto& [key, value] : changes.items()) {
      settings.controls.emplace(std::stoi(key), value.get<double>());
    }
  }
  return settings;
}

void Clip::SetControl(std::int32_t id, double value) {
  Settings settings = ByHand();
  settings.controls[id] = value;
  Change(std::move(settings), "control " + std::to_string(id));
}

void Clip::ResetControl(std::int32_t id) {
  Settings settings = ByHand();
  settings.controls.erase(id);
  Change(std::move(settings), "");
}

void Clip::SetWindow(const std::string& name, const nlohmann::json& value) {
  nlohmann::json json = JsonOf(settings_);
  if (value.is_null()) {
    json["window"].erase(name);
  } else {
    json["window"][name] = value;
  }
  Change(SettingsOf(json), "window " + name);
}

void Clip::TakeWay(std::size_t number) {
  const nlohmann::json* const choice = ChoiceShown();
  const nlohmann::json ways =
      choice ? choice->value("candidates", nlohmann::json::array()) : nlohmann::json::array();
  if (number >= ways.size()) throw std::invalid_argument("there is no such way");
  Settings settings = settings_;
  settings.window.as_set = true;
  settings.window.kind = host::WindowSettings::Kind::follow;
  // As in ByHand.
  if (!ways[number].value("bends", true)) {
    settings.controls[HX_METHOD.disk_id] = host::kPositionScaleRotation;
  }
  const nlohmann::json changes = ways[number].value("changes", nlohmann::json::object());
  for (const auto& [key, value] : changes.items()) {
    settings.controls[std::stoi(key)] = value.get<double>();
  }
  Change(std::move(settings), "");
}

void Clip::DeleteTracks(const nlohmann::json& tracks) {
  Settings settings = ByHand();
  settings.deleted.merge(SettingsOf({{"deleted", tracks}}).deleted);
  if (settings.deleted.size() > kMostDeletedTracks) {
    throw std::invalid_argument("more tracks than can be deleted one by one");
  }
  Change(std::move(settings), "");
}

void Clip::RestoreTracks() {
  Settings settings = ByHand();
  settings.deleted.clear();
  Change(std::move(settings), "");
}

void Clip::Change(Settings settings, const std::string& what) {
  const nlohmann::json json = JsonOf(settings);
  SettingsOf(json);  // as it will be read again, from what is kept too
  if (json == JsonOf(settings_)) return;
  constexpr std::chrono::milliseconds kOneStep(900);
  const auto now = std::chrono::steady_clock::now();
  if (what.empty() || what != changed_last_ || now - changed_at_ > kOneStep || undo_.empty()) {
    undo_.push_back(settings_);
    if (undo_.size() > kMostSteps) undo_.erase(undo_.begin());
  }
  redo_.clear();
  changed_last_ = what;
  changed_at_ = now;
  Give(std::move(settings));
}

void Clip::Undo() {
  Step(undo_, redo_);
}

void Clip::Redo() {
  Step(redo_, undo_);
}

void Clip::Step(std::vector<Settings>& from, std::vector<Settings>& to) {
  if (from.empty()) return;
  to.push_back(settings_);
  Settings settings = std::move(from.back());
  from.pop_back();
  changed_last_.clear();
  Give(std::move(settings));
}

void Clip::Give(Settings settings) {
  settings_ = std::move(settings);
  has_settings_ = true;
  ++version_;
  Tell({{"op", "set"}, {"settings", JsonOf(settings_)}, {"version", version_}});
  surroundings_.changed(id_, ClipSurroundings::When::soon);
}

std::uint64_t Clip::Ask(nlohmann::json head, Reply reply) {
  Open();
  const std::uint64_t number = ++asked_;
  const std::string op = head.value("op", "");
  const bool may_last = op == "save";  // until it is solved
  if (!worker_ || (silent_ > 0 && !may_last)) {
    reply({{{"why", worker_ ? "busy" : "gone"}, {"error", worker_ ? kSilent : error()}}, {}});
    return number;
  }
  using Clock = std::chrono::steady_clock;
  waiting_[number] = {op, head.value("width", 0), std::move(reply),
                      may_last ? Clock::time_point::max() : Clock::now() + kUntilSilent};
  head["id"] = number;
  worker_->Send({std::move(head), {}});
  if (!may_last) LosePatience();
  return number;
}

void Clip::LosePatience() {
  if (is_patient_) return;
  const auto now = std::chrono::steady_clock::now();
  auto next = std::chrono::steady_clock::time_point::max();
  std::vector<Reply> late;
  for (auto& [number, one] : waiting_) {
    if (!one.reply) continue;
    if (one.until > now) {
      next = std::min(next, one.until);
      continue;
    }
    // Its answer is still waited for: from then on others are asked for again.
    late.push_back(std::exchange(one.reply, nullptr));
    ++silent_;
  }
  if (next != std::chrono::steady_clock::time_point::max()) {
    is_patient_ = true;
    patience_.expires_at(next);
    patience_.async_wait([this, here = std::weak_ptr(here_)](const boost::system::error_code&) {
      if (here.expired()) return;
      is_patient_ = false;
      LosePatience();
    });
  }
  for (const Reply& reply : late) reply({{{"why", "busy"}, {"error", kSilent}}, {}});
}

void Clip::Forget(std::uint64_t number) {
  if (waiting_.erase(number) > 0) Tell({{"op", "forget"}, {"of", number}});
}

void Clip::Tell(nlohmann::json head) {
  if (worker_) worker_->Send({std::move(head), {}});
}

nlohmann::json Clip::State() const {
  nlohmann::json state = state_;
  // What it shows is of other settings still.
  const auto shows = state.find("shows");
  state["stale"] = shows != state.end() && shows->is_number() && *shows != version_;
  state["id"] = id_;
  state["path"] = path();
  state["name"] = std::filesystem::path(path()).filename().string();
  state["settings"] = JsonOf(settings_);
  // Pages have no use for them one by one, and hear this at every change.
  state["settings"].erase("deleted");
  state["deleted"] = settings_.deleted.size();
  state["can_undo"] = !undo_.empty();
  state["can_redo"] = !redo_.empty();
  return state;
}

nlohmann::json Clip::Kept() const {
  nlohmann::json kept = {{"id", id_},
                         {"path", path_},
                         {"project", project_},
                         {"outcome", state_.value("outcome", nlohmann::json())}};
  if (has_settings_) kept["settings"] = JsonOf(settings_);
  return kept;
}

}  // namespace calmframe::studio
