#include "studio/server/studio.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <limits>
#include <stdexcept>
#include <utility>

#include "platform/tessel/guid.h"
#include "studio/server/trust.h"
#include "studio/wire/encoding.h"

namespace calmframe::studio {
namespace {

namespace fs = std::filesystem;

// Workers that are open at once: each holds a clip's tracks and some of its frames.
constexpr std::size_t kMostOpen = 4;
constexpr std::size_t kMostClips = 500;
constexpr char kSession[] = "/session.json";

using Corners = std::vector<std::array<double, 2>>;
constexpr std::size_t kMostCorners = 1000;  // of a lasso: each is held against every track
constexpr std::int32_t kMostControl = std::numeric_limits<std::int32_t>::max();  // disk id
constexpr std::size_t kMostWays = 1000;
constexpr std::uint64_t kMostRenders = std::uint64_t{1} << 53;

// The folders with the sample's, which is made.
std::vector<std::string> ReadableFolders(const StudioSettings& settings) {
  fs::create_directories(settings.SampleFolder());
  std::vector<std::string> folders = settings.roots;
  folders.push_back(settings.SampleFolder());
  return folders;
}

bool IsProject(const std::string& path) {
  return fs::path(path).extension() == ".calm";
}

// By which a password is known again; empty of none.
std::string MarkOf(const std::string& password, const std::string& secret) {
  return password.empty() ? "" : tessel::utility::Guid::FromText(secret + password).ToText();
}

// Throws std::invalid_argument beyond 0 to `most`, which a conversion would make another number.
template <class Whole>
Whole WholeIn(const nlohmann::json& request, const char* name, Whole most) {
  const double number = request.at(name).get<double>();
  if (number >= 0 && number <= static_cast<double>(most)) return static_cast<Whole>(number);
  throw std::invalid_argument(std::string(name) + ": out of range");
}

}  // namespace

Studio::Studio(boost::asio::io_context& context, const StudioSettings& settings)
    : roots_(settings.roots),
      readable_(ReadableFolders(settings)),
      folder_(settings.folder),
      work_folder_(settings.WorkFolder()),
      surroundings_{
          context,
          ending_,
          readable_.folders(),
          {settings.program},
          [this](const std::string& id, ClipSurroundings::When when) { Changed(id, when); }},
      flush_(context),
      keep_(context) {
  surroundings_.worker_words.insert(surroundings_.worker_words.end(), settings.worker.begin(),
                                    settings.worker.end());
  fs::create_directories(work_folder_);
  // The secret is in it.
  struct stat status;
  if (chmod(folder_.c_str(), 0700) != 0 || stat(folder_.c_str(), &status) != 0 ||
      status.st_uid != geteuid()) {
    throw std::runtime_error(folder_ + ": belongs to somebody else, who could let others in");
  }
  lock_ = std::make_unique<batch::FileLock>(folder_ + "/lock");
  if (!lock_->is_held()) {
    throw std::runtime_error(folder_ +
                             ": another studio keeps its work there; --session names another one");
  }
  renders_ = std::make_unique<RenderQueue>(
      context, settings.program, work_folder_,
      [this](const std::string& id, const std::string& path, const auto& done) {
        Clip* const clip = Find(id);
        if (!clip) return done("the clip was removed", {});
        Open(*clip);
        clip->Ask({{"op", "save"}, {"path", path}}, [this, id, done](const Message& answer) {
          Clip* const saved = Find(id);
          const std::string error = answer.head.value("error", "");
          done(saved || !error.empty() ? error : "the clip was removed",
               saved ? saved->settings() : Settings());
        });
      },
      [this] {
        renders_changed_ = true;
        Flush();
      });
  std::vector<std::string> sample = {settings.program};
  sample.insert(sample.end(), settings.sample.begin(), settings.sample.end());
  sample_ = std::make_unique<SampleClip>(
      context, std::move(sample), readable_.folders().back() + "/sample.mp4",
      [this] { Add(sample_->path()); },
      [this] {
        sample_changed_ = true;
        Flush();
      });
  Restore();
  if (secret_.empty() || kept_password_ != MarkOf(settings.password, secret_)) {
    secret_ = NewSecret();
    kept_password_ = MarkOf(settings.password, secret_);
  }
  Keep();
}

Studio::~Studio() = default;

void Studio::StopAll() {
  Keep();
  sample_.reset();
  renders_.reset();
  clips_.clear();
}

void Studio::Restore() {
  const auto kept = batch::ReadObject(folder_ + kSession, batch::kMostOfAll);
  if (!kept) return;
  try {
    secret_ = kept->value("secret", "");
    kept_password_ = kept->value("password", "");
    for (const nlohmann::json clip : kept->value("clips", nlohmann::ordered_json::array())) {
      try {
        const std::string id = clip.at("id").get<std::string>();
        readable_.ExistingClip(clip.value("path", "").empty() ? clip.value("project", "")
                                                              : clip.value("path", ""));
        clips_.push_back(std::make_unique<Clip>(surroundings_, clip, KeepPath(id)));
      } catch (const std::exception&) {  // damaged, or in a folder that is none of this studio's
      }
    }
  } catch (const std::exception&) {  // damaged: what could be read stands
  }
}

Clip* Studio::Find(const std::string& id) const {
  for (const std::unique_ptr<Clip>& clip : clips_) {
    if (clip->id() == id) return clip.get();
  }
  return nullptr;
}

Clip& Studio::At(const nlohmann::json& request) const {
  Clip* const clip = Find(request.value("clip", ""));
  if (!clip) throw std::invalid_argument("there is no such clip");
  return *clip;
}

std::string Studio::Add(const std::string& path) {
  const std::string place = readable_.ExistingClip(path);
  for (const std::unique_ptr<Clip>& clip : clips_) {
    if (clip->path() == place) return clip->id();
  }
  if (clips_.size() >= kMostClips) throw std::invalid_argument("too many clips are open");
  if (fs::is_directory(place)) throw std::invalid_argument(path + ": is a folder");
  const std::string id = NewSecret().substr(0, 12);
  const bool is_project = IsProject(place);
  clips_.push_back(std::make_unique<Clip>(surroundings_, id, is_project ? "" : place,
                                          is_project ? place : "", KeepPath(id)));
  order_changed_ = true;
  Changed(id);
  return id;
}

void Studio::Open(Clip& clip) {
  used_.remove(clip.id());
  used_.push_front(clip.id());
  clip.Open();
  std::size_t open = 0;
  for (auto id = used_.begin(); id != used_.end();) {
    Clip* const one = Find(*id);
    const bool rests = one && !one->works() && !renders_->Needs(*id);
    if (one && one->is_open() && ++open > kMostOpen && rests) {
      one->CloseWorker();
      id = used_.erase(id);
    } else {
      ++id;
    }
  }
}

void Studio::Do(const nlohmann::json& request, const Answer& answer) {
  nlohmann::json said;
  try {
    bool answers_later = false;
    said = Act(request, answer, &answers_later);
    if (answers_later) return;
  } catch (const nlohmann::json::exception&) {
    said = {{"error", "the request is not understood"}};
  } catch (const std::exception& error) {
    said = {{"error", error.what()}};
  }
  answer(std::move(said));
}

nlohmann::json Studio::Act(const nlohmann::json& request, const Answer& later,
                           bool* answers_later) {
  const std::string op = request.at("op").get<std::string>();
  if (op == "add") return {{"clip", Add(request.at("path").get<std::string>())}};
  if (op == "find") return {{"clip", Add(roots_.Find(request.at("name").get<std::string>()))}};
  if (op == "sample") {
    if (sample_->is_there()) return {{"clip", Add(sample_->path())}};
    sample_->Draw();
    return nlohmann::json::object();
  }
  if (op == "end sample") {
    sample_->Cancel();
    return nlohmann::json::object();
  }
  if (op == "end render") {
    renders_->Remove(WholeIn(request, "render", kMostRenders));
    return nlohmann::json::object();
  }
  Clip& clip = At(request);
  if (op == "remove") {
    const std::string keep = clip.keep(), id = clip.id();
    if (renders_->Needs(id)) throw std::invalid_argument("a render of the clip still waits");
    clip.CloseWorker();  // whoever waits for an answer looks for clips
    std::erase_if(clips_, [&clip](const auto& one) { return one.get() == &clip; });
    used_.remove(id);
    std::error_code ignored;
    fs::remove(keep, ignored);
    changed_.erase(id);
    order_changed_ = true;
    KeepSoon();
    Flush();
    return nlohmann::json::object();
  }
  return ActOnClip(op, clip, request, later, answers_later);
}

nlohmann::json Studio::ActOnClip(const std::string& op, Clip& clip, const nlohmann::json& request,
                                 const Answer& later, bool* answers_later) {
  if (op == "open") {
    Open(clip);
  } else if (op == "control") {
    clip.SetControl(WholeIn(request, "control", kMostControl), request.at("value").get<double>());
  } else if (op == "reset") {
    clip.ResetControl(WholeIn(request, "control", kMostControl));
  } else if (op == "window") {
    clip.SetWindow(request.at("name").get<std::string>(), request.at("value"));
  } else if (op == "way") {
    clip.TakeWay(WholeIn(request, "way", kMostWays));
  } else if (op == "lasso") {
    *answers_later = true;
    AskForTracks(clip, request, later);
  } else if (op == "restore tracks") {
    clip.RestoreTracks();
  } else if (op == "undo") {
    clip.Undo();
  } else if (op == "redo") {
    clip.Redo();
  } else if (op == "analyze") {
    Open(clip);
    clip.Tell({{"op", "work"}});
  } else if (op == "cancel") {
    clip.Tell({{"op", "cancel"}});
  } else if (op == "look") {
    clip.Tell({{"op", "look"}, {"frame", WholeIn(request, "frame", media::kMaximumFrames)}});
  } else if (op == "save") {
    const std::string path = roots_.ToWrite(request.at("path").get<std::string>());
    if (!IsProject(path)) throw std::invalid_argument("saved work is named like walk.calm");
    if (fs::exists(path) && !request.value("overwrite", false)) {
      return {{"error", path + ": is there already"}, {"exists", true}};
    }
    *answers_later = true;
    Open(clip);
    clip.Ask({{"op", "save"}, {"path", path}}, [later](const Message& answer) {
      nlohmann::json said = nlohmann::json::object();
      if (const std::string error = answer.head.value("error", ""); !error.empty()) {
        said["error"] = error;
      }
      later(said);
    });
  } else if (op == "render") {
    return Render(clip, request, later, answers_later);
  } else {
    throw std::invalid_argument("there is no such operation");
  }
  return nlohmann::json::object();
}

// Into the queue, once the clip's worker has seen that the output can be had like that.
nlohmann::json Studio::Render(Clip& clip, const nlohmann::json& request, const Answer& later,
                              bool* answers_later) {
  RenderOrder order;
  order.clip = clip.id();
  order.name = fs::path(clip.path()).filename();
  order.output = roots_.ToWrite(request.at("path").get<std::string>());
  order.encode = EncodeSettingsOf(request);
  order.from = request.value("from", "");
  order.to = request.value("to", "");
  for (const std::string* time : {&order.from, &order.to}) {
    if (time->find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789_.:") != std::string::npos) {
      throw std::invalid_argument(*time + ": is no time");
    }
  }
  if (fs::exists(order.output) && !order.encode.overwrite) {
    return {{"error", order.output + ": is there already"}, {"exists", true}};
  }
  *answers_later = true;
  Open(clip);
  clip.Ask({{"op", "try output"}, {"path", order.output}, {"encode", JsonOf(order.encode)}},
           [this, order, later](const Message& answer) {
             nlohmann::json said = nlohmann::json::object();
             try {
               if (const std::string error = answer.head.value("error", ""); !error.empty()) {
                 throw std::runtime_error(error);
               }
               renders_->Add(order);
             } catch (const std::exception& error) {
               said["error"] = error.what();
             }
             later(said);
           });
  return nlohmann::json::object();
}

// What a lasso holds; with "deletes" they are deleted, else shown.
void Studio::AskForTracks(Clip& clip, const nlohmann::json& request, const Answer& later) {
  nlohmann::json head = {{"op", "lasso"},
                         {"frame", WholeIn(request, "frame", media::kMaximumFrames)},
                         {"any_frame", request.value("any_frame", false)},
                         {"corners", request.value("corners", Corners())}};
  if (head["corners"].size() > kMostCorners) throw std::invalid_argument("too many corners");
  const bool deletes = request.value("deletes", false);
  Open(clip);
  clip.Ask(std::move(head), [this, id = clip.id(), deletes, later](const Message& answer) {
    nlohmann::json said = {{"places", answer.head.value("places", nlohmann::json::array())}};
    try {
      if (const std::string error = answer.head.value("error", ""); !error.empty()) {
        throw std::runtime_error(error);
      }
      if (Clip* const asked = Find(id); asked && deletes) {
        asked->DeleteTracks(answer.head.value("tracks", nlohmann::json::array()));
      }
    } catch (const std::exception& error) {
      said["error"] = error.what();
    }
    later(said);
  });
}

std::optional<std::uint64_t> Studio::Ask(const std::string& id, nlohmann::json head,
                                         Clip::Reply reply) {
  Clip* const clip = Find(id);
  if (!clip) return {};
  // A page that shows it would have it die again and again.
  if (clip->has_failed()) {
    reply({{{"why", "gone"}, {"error", clip->error()}}, {}});
    return 0;
  }
  Open(*clip);
  return clip->Ask(std::move(head), std::move(reply));
}

void Studio::Forget(const std::string& id, std::uint64_t number) {
  if (Clip* const clip = Find(id)) clip->Forget(number);
}

std::uint64_t Studio::Listen(Listener listener) {
  nlohmann::json all = {{"clips", nlohmann::json::object()}, {"order", Order()},
                        {"renders", renders_->State()},      {"roots", roots_.folders()},
                        {"sample", sample_->State()},        {"trouble", trouble_}};
  for (const std::unique_ptr<Clip>& clip : clips_) all["clips"][clip->id()] = clip->State();
  listener(std::make_shared<const std::string>(
      all.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace)));
  listeners_[++listeners_ever_] = std::move(listener);
  return listeners_ever_;
}

nlohmann::json Studio::Order() const {
  nlohmann::json order = nlohmann::json::array();
  for (const std::unique_ptr<Clip>& clip : clips_) order.push_back(clip->id());
  return order;
}

void Studio::Changed(const std::string& id, ClipSurroundings::When when) {
  changed_.insert(id);
  KeepSoon();
  Flush(when);
}

// Many changes at once are one event; one by itself waits for none.
void Studio::Flush(ClipSurroundings::When when) {
  using Clock = std::chrono::steady_clock;
  constexpr Clock::duration kBetween = std::chrono::milliseconds(30);
  auto at = Clock::now();
  if (when == ClipSurroundings::When::soon) at += kBetween;
  // What takes long leaves most of the thread's time to others.
  at = std::max(at, flushed_at_ + std::max(kBetween, 4 * flush_took_));
  if (flushes_ && flush_.expiry() <= at) return;
  flushes_ = true;
  flush_.expires_at(at);  // of a later one nothing is heard any more
  flush_.async_wait([this](const boost::system::error_code& error) {
    if (error) return;
    flushes_ = false;
    const auto began = Clock::now();
    nlohmann::json event = nlohmann::json::object();
    for (const std::string& id : changed_) {
      if (const Clip* clip = Find(id)) event["clips"][id] = clip->State();
    }
    if (order_changed_) event["order"] = Order();
    if (renders_changed_) event["renders"] = renders_->State();
    if (sample_changed_) event["sample"] = sample_->State();
    event["trouble"] = trouble_;
    changed_.clear();
    order_changed_ = renders_changed_ = sample_changed_ = false;
    Send(event);
    flushed_at_ = Clock::now();
    flush_took_ = flushed_at_ - began;
  });
}

void Studio::Send(const nlohmann::json& event) {
  const auto text = std::make_shared<const std::string>(
      event.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace));
  for (const auto listeners = listeners_; const auto& [number, listener] : listeners) {
    listener(text);
  }
}

void Studio::KeepSoon() {
  if (keeps_) return;
  keeps_ = true;
  keep_.expires_after(std::chrono::milliseconds(500));
  keep_.async_wait([this](const boost::system::error_code& error) {
    if (error) return;
    keeps_ = false;
    const std::string before = trouble_;
    if (!Keep()) KeepSoon();  // until there is room again
    if (trouble_ != before) Flush();
  });
}

bool Studio::Keep() {
  nlohmann::json session = {
      {"secret", secret_}, {"password", kept_password_}, {"clips", nlohmann::json::array()}};
  for (const std::unique_ptr<Clip>& clip : clips_) session["clips"].push_back(clip->Kept());
  const std::string path = folder_ + kSession;
  if (!batch::WriteWhole(path,
                         session.dump(1, ' ', false, nlohmann::json::error_handler_t::replace))) {
    trouble_ = "what you set isn't kept: " + path + ": " + std::strerror(errno);
    return false;
  }
  chmod(path.c_str(), 0600);
  trouble_.clear();
  return true;
}

}  // namespace calmframe::studio
