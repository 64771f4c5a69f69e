// Whatever a stranger sends to the studio's port, or a worker to the studio, it is answered or
// dropped: one input is one connection, or the bytes of one worker.
//
// What a page knows is put into what is sent, so that what lies behind the doors is reached too.

#include <algorithm>
#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/write.hpp>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

#include "fuzz/scratch_file.h"
#include "fuzz/studio_input.h"
#include "studio/server/http_session.h"
#include "studio/wire/message.h"
#include "studio/wire/told.h"

namespace {

using namespace calmframe::studio;
using boost::asio::ip::tcp;

// A studio over an empty folder, whose workers end as soon as they begin.
class Room {
 public:
  Room() {
    std::filesystem::create_directory(clips_);
    std::ofstream(clips_ + "/walk.mp4");
    studio_ = std::make_unique<Studio>(
        context_, StudioSettings{"/bin/false", {}, {clips_}, scratch_.folder() + "/session"});
    doors_.cookie = "c";
    clip_ = studio_->Add(clips_ + "/walk.mp4");
    acceptor_ = std::make_unique<tcp::acceptor>(
        context_, tcp::endpoint(boost::asio::ip::address_v4::loopback(), 0));
  }
  ~Room() {
    doors_.closed = true;
    studio_->StopAll();
  }

  // False where the fuzzer's own signal came between.
  bool Connect(const std::string& input) {
    tcp::socket stranger(context_), own(context_);
    boost::system::error_code refused;
    stranger.connect(acceptor_->local_endpoint(), refused);
    if (!refused) acceptor_->accept(own, refused);
    if (refused) return false;
    ServeConnection(std::move(own), *studio_, doors_);
    std::size_t begin = 0;
    while (begin < input.size()) {
      const std::size_t end = std::min(input.find(kPause, begin), input.size());
      const std::string part = Filled(input.substr(begin, end - begin));
      boost::system::error_code error;
      // What nobody reads by now is more than the kernel holds of it.
      stranger.non_blocking(true);
      stranger.write_some(boost::asio::buffer(part), error);
      Turn();
      begin = end + 1;
    }
    boost::system::error_code ignored;
    stranger.close(ignored);
    Turn();
    // Those that wait for a timer; of many the studio takes no more.
    while (doors_.connections > kMostWaiting) {
      context_.restart();
      context_.run_one_for(std::chrono::milliseconds(50));
    }
    return true;
  }

 private:
  static constexpr int kMostWaiting = 100;

  void Turn() {
    context_.restart();
    while (context_.poll() > 0) {
    }
  }

  std::string Filled(const std::string& text) const {
    std::string filled;
    for (const char c : text) {
      if (c == kSecret) {
        filled += "c=" + studio_->secret();
      } else if (c == kClip) {
        filled += clip_;
      } else if (c == kHere) {
        filled += clips_;
      } else {
        filled += c;
      }
    }
    return filled;
  }

  const calmframe::fuzz::ScratchFile scratch_;
  const std::string clips_ = scratch_.folder() + "/clips";
  std::string clip_;
  Doors doors_;  // ahead of the context, whose sessions go with it
  boost::asio::io_context context_{1};
  std::unique_ptr<Studio> studio_;
  std::unique_ptr<tcp::acceptor> acceptor_;
};

// What is heard of it is heard again as the same.
void TakeAsHeard(const Message& message) try {
  if (message.head.contains("tells")) {
    const nlohmann::json told = ToldOf(message.head["tells"]);
    if (ToldOf(told) != told) std::abort();
    return;
  }
  constexpr int kWidth = 640;
  for (const char* op : {"panel", "curves", "lasso", "frame", "save"}) {
    const Message once = AnswerOf(op, kWidth, message);
    const Message again = AnswerOf(op, kWidth, once);
    if (again.head != once.head || again.bytes != once.bytes) std::abort();
  }
} catch (const BadMessage&) {
} catch (const std::invalid_argument&) {
}

// In pieces as small as they come; each message is taken as both ends take it.
void TakeApart(const std::string& input) {
  MessageReader reader;
  try {
    for (std::size_t at = 0; at < input.size(); at += 7) {
      reader.Add(input.data() + at, std::min<std::size_t>(7, input.size() - at));
      while (const std::optional<Message> message = reader.Next()) {
        MessageReader again;
        const std::string once = Encode(*message);
        again.Add(once.data(), once.size());
        const std::optional<Message> same = again.Next();
        if (!same || Encode(*same) != once) std::abort();
        TakeAsHeard(*message);
      }
    }
  } catch (const BadMessage&) {
  } catch (const nlohmann::json::exception&) {
  } catch (const std::invalid_argument&) {
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 2) return 0;
  const std::string input(reinterpret_cast<const char*>(data + 1), size - 1);
  if (data[0] == kOfWorker) {
    TakeApart(input);
    return 0;
  }
  // Threads of workers that have ended stay with a studio until its end.
  constexpr int kInputs = 300;
  static std::unique_ptr<Room> room;
  static int inputs = 0;
  if (!room || inputs++ % kInputs == 0) {
    room.reset();
    room = std::make_unique<Room>();
  }
  if (!room->Connect(input)) room.reset();
  return 0;
}
