#include "studio/worker/worker.h"

#include <cstdint>
#include <memory>
#include <stdexcept>
#include <thread>
#include <utility>
#include <vector>

#include "studio/wire/encoding.h"
#include "studio/worker/channel.h"
#include "studio/worker/clip_desk.h"

namespace calmframe::studio {
namespace {

const char* NameOf(NoFrame why) {
  switch (why) {
    case NoFrame::none:
      return "";
    case NoFrame::busy:
      return "busy";
    case NoFrame::shot:
      return "shot";
    case NoFrame::tracks:
      return "tracks";
    default:
      return "gone";
  }
}

class Worker {
 public:
  Worker(Channel& channel, ClipDesk& desk) : channel_(channel), desk_(desk) {}

  void Take(const nlohmann::json& head) {
    const std::string op = head.value("op", "");
    const std::uint64_t id = head.value("id", std::uint64_t{0});
    if (op == "open") {
      OpenRequest request;
      request.clip = head.value("clip", "");
      request.project = head.value("project", "");
      request.keep = head.value("keep", "");
      request.roots = head.value("roots", std::vector<std::string>());
      request.version = head.value("version", std::uint64_t{0});
      if (head.contains("settings")) request.settings = SettingsOf(head["settings"]);
      desk_.Open(std::move(request));
    } else if (op == "set") {
      desk_.Set(SettingsOf(head.value("settings", nlohmann::json::object())),
                head.value("version", std::uint64_t{0}));
    } else if (op == "work") {
      desk_.Work();
    } else if (op == "cancel") {
      desk_.Cancel();
    } else if (op == "save") {
      desk_.Save(head.value("path", ""), [&channel = channel_, id](const std::string& error) {
        AnswerBy(channel, id, {{"error", error}});
      });
    } else if (op == "panel") {
      Answer(id, {{"rows", desk_.Panel()}});
    } else if (op == "curves") {
      Answer(id, {{"shots", desk_.Curves()}});
    } else if (op == "frame") {
      AskFrame(id, head);
    } else if (op == "lasso") {
      Answer(id, TracksOf(head));
    } else if (op == "try output") {
      Answer(id, {{"error", OutputTrouble(head)}});
    } else if (op == "forget") {
      desk_.frames().Forget(head.value("of", std::uint64_t{0}));
    } else if (op == "look") {
      desk_.LookAt(head.value("frame", std::int64_t{0}));
    }
  }

 private:
  // Answers may come when this is gone: the channel and the desk stay.
  static void AnswerBy(Channel& channel, std::uint64_t id, nlohmann::json head,
                       std::string bytes = {}) {
    head["id"] = id;
    channel.Send({std::move(head), std::move(bytes)});
  }
  void Answer(std::uint64_t id, nlohmann::json head) { AnswerBy(channel_, id, std::move(head)); }

  std::string OutputTrouble(const nlohmann::json& head) {
    try {
      return desk_.OutputTrouble(head.value("path", ""),
                                 EncodeSettingsOf(head.value("encode", nlohmann::json::object())));
    } catch (const std::invalid_argument& refused) {
      return refused.what();
    }
  }

  nlohmann::json TracksOf(const nlohmann::json& head) {
    Lasso lasso;
    lasso.frame = head.value("frame", std::int64_t{0});
    lasso.any_frame = head.value("any_frame", false);
    for (const auto& [x, y] : head.value("corners", std::vector<std::pair<double, double>>())) {
      lasso.corners.push_back({x, y});
    }
    nlohmann::json tracks = nlohmann::json::array(), places = nlohmann::json::array();
    for (const LassoedTrack& track : desk_.TracksIn(lasso)) {
      tracks.push_back({track.point.frame, track.point.slot});
      places.push_back({track.place.x, track.place.y});
    }
    return {{"tracks", std::move(tracks)}, {"places", std::move(places)}};
  }

  void AskFrame(std::uint64_t id, const nlohmann::json& head) {
    const FrameRequest request{.frame = head.value("frame", std::int64_t{0}),
                               .before = head.value("before", false),
                               .after = head.value("after", false),
                               .tracks = head.value("tracks", false),
                               .width = head.value("width", 640)};
    desk_.frames().Ask(
        id, request,
        [&channel = channel_, &desk = desk_, id, frame = request.frame](
            std::string jpeg, NoFrame why, const std::string& text) {
          if (why == NoFrame::shot) desk.LookAt(frame);
          if (why == NoFrame::tracks) desk.ShowTracks();
          AnswerBy(channel, id, {{"why", NameOf(why)}, {"error", text}}, std::move(jpeg));
        });
  }

  Channel& channel_;
  ClipDesk& desk_;
};

}  // namespace

void RunWorker(int socket, const std::string& plugin) {
  Channel channel(socket);
  ClipDesk desk(plugin, [&channel](nlohmann::json part) {
    channel.Send({{{"tells", std::move(part)}}, {}});
  });
  std::thread listening([&] {
    Worker worker(channel, desk);
    while (const std::optional<Message> message = channel.Receive()) {
      try {
        worker.Take(message->head);
      } catch (const std::exception&) {  // what isn't understood is left
      }
    }
    desk.End();
  });
  desk.Run();
  listening.join();
}

}  // namespace calmframe::studio
