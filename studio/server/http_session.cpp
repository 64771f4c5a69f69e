#include "studio/server/http_session.h"

#include <boost/asio/steady_timer.hpp>
#include <boost/asio/write.hpp>
#include <boost/beast/core.hpp>
#include <boost/beast/http.hpp>
#include <charconv>
#include <chrono>
#include <deque>
#include <functional>
#include <optional>
#include <string_view>
#include <utility>

#include "host/base/json_bounds.h"
#include "studio/server/page_files.h"
#include "studio/server/trust.h"

namespace calmframe::studio {
namespace {

namespace beast = boost::beast;
namespace http = beast::http;
using boost::system::error_code;

constexpr std::uint32_t kMostHeader = 16 << 10;
constexpr std::size_t kMostBody = 256 << 10;
// For a whole request, from its first byte on, or from the one before; and to take an answer.
constexpr std::chrono::seconds kPatience(20);
constexpr int kMostConnections = 256;
constexpr int kMostStreams = 32;
constexpr int kMostGuesses = 4;  // wrong passwords a second
constexpr std::size_t kMostPending = std::size_t{8}
                                     << 20;  // bytes of events behind the one on its way

constexpr char kPolicy[] =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self' blob:; "
    "connect-src 'self'; base-uri 'none'; form-action 'self'; frame-ancestors 'none'";

const char* TypeOf(std::string_view path) {
  const std::string_view ending = path.substr(std::min(path.rfind('.'), path.size()));
  if (ending == ".html") return "text/html; charset=utf-8";
  if (ending == ".css") return "text/css; charset=utf-8";
  if (ending == ".js" || ending == ".mjs") return "text/javascript; charset=utf-8";
  if (ending == ".svg") return "image/svg+xml";
  return "text/plain; charset=utf-8";
}

std::int64_t NumberIn(std::string_view query, std::string_view name, std::int64_t otherwise) {
  const std::string text = FieldOf(query, name);
  std::int64_t number = otherwise;
  std::from_chars(text.data(), text.data() + text.size(), number);
  return number;
}

class Session : public std::enable_shared_from_this<Session> {
 public:
  Session(boost::asio::ip::tcp::socket socket, Studio& studio, Doors& doors)
      : stream_(std::move(socket)), studio_(studio), doors_(doors), timer_(stream_.get_executor()) {
    ++doors_.connections;
  }
  ~Session() {
    --doors_.connections;
    if (listener_ && !doors_.closed) {
      studio_.StopListening(*listener_);
      --doors_.streams;
    }
  }
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  void Read() {
    parser_.emplace();
    parser_->header_limit(kMostHeader);
    parser_->body_limit(kMostBody);
    stream_.expires_after(kPatience);
    http::async_read(stream_, buffer_, *parser_,
                     [self = shared_from_this()](error_code error, std::size_t) {
                       if (!error) return self->Handle();
                       if (error == http::error::header_limit) {
                         return self->Fail(http::status::request_header_fields_too_large, "", true);
                       }
                       if (error == http::error::body_limit) {
                         return self->Fail(http::status::payload_too_large, "", true);
                       }
                       self->Close();
                     });
  }

 private:
  using Response = http::response<http::string_body>;

  std::string_view Header(http::field field) const {
    const beast::string_view value = parser_->get()[field];
    return {value.data(), value.size()};
  }

  void Handle() {
    const auto& request = parser_->get();
    const beast::string_view target_view = request.target();
    const std::string_view target(target_view.data(), target_view.size());
    path_ = target.substr(0, target.find('?'));
    query_ = target.size() > path_.size() ? std::string(target.substr(path_.size() + 1)) : "";
    keeps_ = request.keep_alive();
    const std::string_view host = Header(http::field::host);
    if (!IsOwnHost(host, doors_.name)) {
      return Fail(http::status::misdirected_request, "this is not the name of this machine");
    }
    const std::string_view origin = Header(http::field::origin);
    if (!origin.empty() && !IsOwnOrigin(origin, host)) {
      return Fail(http::status::forbidden, "another page may not speak to the studio");
    }
    if (path_.empty() || path_[0] != '/') return Fail(http::status::bad_request, "no path");
    const bool posts = request.method() == http::verb::post;
    if (!posts && request.method() != http::verb::get) {
      return Fail(http::status::method_not_allowed, "");
    }
    if (posts && origin.empty()) return Fail(http::status::forbidden, "no origin");
    if (posts && path_ == "/login") return Login(request.body());
    if (path_ == "/" && !FieldOf(query_, "token").empty() && doors_.password.empty()) {
      return Enter(FieldOf(query_, "token"));
    }
    if (!BringsCookie(Header(http::field::cookie), doors_.cookie, studio_.secret())) {
      return Refuse();
    }
    if (posts) return path_ == "/api/do" ? Do(request.body()) : NotFound();
    if (path_.rfind("/api/", 0) == 0) return Get();
    const PageFile* const file = FindPageFile(path_ == "/" ? std::string_view("index.html")
                                                           : std::string_view(path_).substr(1));
    if (!file) return NotFound();
    Write(Make(http::status::ok, std::string(file->bytes), TypeOf(file->path)));
  }

  void Enter(const std::string& token) {
    if (!IsSame(token, studio_.secret())) return Refuse();
    Welcome();
  }

  void Login(const std::string& form) {
    if (doors_.guesses >= kMostGuesses) {
      return Fail(http::status::too_many_requests, "too many wrong passwords; try again", true);
    }
    if (!doors_.password.empty() && IsSame(FieldOf(form, "password"), doors_.password)) {
      return Welcome();
    }
    // Whoever guesses waits, and nobody else guesses much meanwhile.
    ++doors_.guesses;
    timer_.expires_after(std::chrono::seconds(1));
    timer_.async_wait([self = shared_from_this()](const error_code&) {
      --self->doors_.guesses;
      self->Refuse();
    });
  }

  void Welcome() {
    Response response = Make(http::status::see_other, "", "text/plain");
    response.set(http::field::location, "/");
    response.set(http::field::set_cookie,
                 doors_.cookie + "=" + studio_.secret() +
                     "; Path=/; HttpOnly; SameSite=Strict; Max-Age=2592000");
    Write(std::move(response));
  }

  void Refuse() {
    if (path_.rfind("/api/", 0) == 0) return Fail(http::status::forbidden, "not let in");
    // These two say nothing that isn't everybody's.
    const PageFile* file = nullptr;
    if (path_ == "/style.css") file = FindPageFile("style.css");
    if (path_ == "/" || path_ == "/login") {
      file = FindPageFile(doors_.password.empty() ? "refused.html" : "login.html");
    }
    if (!file) return Fail(http::status::forbidden, "not let in");
    Write(Make(path_ == "/style.css" ? http::status::ok : http::status::forbidden,
               std::string(file->bytes), TypeOf(file->path)));
  }

  void NotFound() { Fail(http::status::not_found, "there is no such thing"); }

  void Do(const std::string& body) {
    if (Header(http::field::content_type).substr(0, 16) != "application/json") {
      return Fail(http::status::unsupported_media_type, "JSON is wanted");
    }
    if (ExceedsBounds(body))
      return Fail(http::status::bad_request, "it is nested too deep, or has too many parts");
    const nlohmann::json asked = nlohmann::json::parse(body, nullptr, false);
    if (!asked.is_object()) return Fail(http::status::bad_request, "an object is wanted");
    stream_.expires_never();  // a save waits for a solve
    studio_.Do(asked, [weak = weak_from_this()](nlohmann::json answer) {
      if (const auto self = weak.lock()) self->Json(answer);
    });
    Hold();
  }

  void Get() {
    if (path_ == "/api/events") return Stream();
    if (path_ == "/api/folder") {
      try {
        return Json(studio_.roots().List(FieldOf(query_, "path")));
      } catch (const PathRefused& refused) {
        return Json({{"error", refused.what()}}, http::status::not_found);
      }
    }
    const std::string clip = FieldOf(query_, "clip");
    if (path_ == "/api/panel" || path_ == "/api/curves") {
      return Ask(clip, {{"op", path_.substr(5)}},
                 [](Session& self, const Message& answer) { self.Json(answer.head); });
    }
    if (path_ != "/api/frame") return NotFound();
    const std::string side = FieldOf(query_, "side");
    Ask(clip,
        {{"op", "frame"},
         {"frame",
          std::clamp<std::int64_t>(NumberIn(query_, "frame", 0), 0, media::kMaximumFrames)},
         {"width", std::clamp<std::int64_t>(NumberIn(query_, "width", 640), 16, 8192)},
         {"tracks", side == "tracks"},
         {"before", side != "after" && side != "tracks"},
         {"after", side != "before" && side != "tracks"}},
        [](Session& self, const Message& answer) { self.Picture(answer); });
  }

  void Ask(const std::string& clip, nlohmann::json head,
           void (*take)(Session& self, const Message& answer)) {
    stream_.expires_never();
    const auto number =
        studio_.Ask(clip, std::move(head), [weak = weak_from_this(), take](const Message& answer) {
          if (const auto self = weak.lock()) {
            self->asked_.reset();
            take(*self, answer);
          }
        });
    if (!number) return NotFound();
    if (is_answered_) return;
    asked_ = {clip, *number};
    Hold();
  }

  // While an answer is waited for nobody else keeps this alive; whoever hangs up is forgotten.
  void Hold() {
    if (is_answered_) return;
    stream_.socket().async_wait(
        boost::asio::ip::tcp::socket::wait_read, [self = shared_from_this()](const error_code&) {
          if (self->is_answered_) return;
          char byte = 0;
          error_code error;
          const std::size_t got = self->stream_.socket().receive(
              boost::asio::buffer(&byte, 1), boost::asio::socket_base::message_peek, error);
          if (error || got == 0) {
            if (self->asked_) self->studio_.Forget(self->asked_->first, self->asked_->second);
            return self->Close();
          }
          // More requests before this one is answered: the answer comes all the same.
          self->held_ = self;
        });
  }

  void Picture(const Message& answer) {
    if (answer.bytes.empty()) {
      const std::string why = answer.head.value("why", "");
      const std::string error = answer.head.value("error", "");
      return Json({{"why", why}, {"error", error}},
                  why == "busy" || why == "shot" || why == "tracks"
                      ? http::status::service_unavailable
                      : http::status::not_found);
    }
    Response response = Make(http::status::ok, answer.bytes, "image/jpeg");
    // Its address has the number of the version that it shows.
    response.set(http::field::cache_control, "private, max-age=3600, immutable");
    Write(std::move(response));
  }

  void Stream() {
    if (doors_.streams >= kMostStreams) {
      return Fail(http::status::service_unavailable, "too many windows are open");
    }
    ++doors_.streams;
    stream_.expires_never();
    Push(std::make_shared<const std::string>(
        "HTTP/1.1 200 OK\r\nContent-Type: text/event-stream\r\nCache-Control: no-store\r\n"
        "X-Content-Type-Options: nosniff\r\nConnection: close\r\n\r\n"));
    listener_ = studio_.Listen([weak = weak_from_this()](const auto& event) {
      const auto self = weak.lock();
      if (self) self->Push(std::make_shared<const std::string>("data: " + *event + "\n\n"));
    });
    Beat();
    // Nothing more is to come; what does, or the end, ends the stream.
    stream_.socket().async_wait(boost::asio::ip::tcp::socket::wait_read,
                                [self = shared_from_this()](const error_code&) { self->Close(); });
  }

  void Beat() {
    timer_.expires_after(std::chrono::seconds(15));
    timer_.async_wait([weak = weak_from_this()](const error_code& error) {
      const auto self = weak.lock();
      if (!self || error || !self->stream_.socket().is_open()) return;
      self->Push(std::make_shared<const std::string>(": still here\n\n"));
      self->Beat();
    });
  }

  void Push(std::shared_ptr<const std::string> text) {
    // It doesn't read; one event by itself may be larger than all that.
    if (!events_.empty() && pending_ > kMostPending) return Close();
    if (!events_.empty()) pending_ += text->size();
    events_.push_back(std::move(text));
    if (events_.size() == 1) PushNext();
  }

  void PushNext() {
    boost::asio::async_write(stream_.socket(), boost::asio::buffer(*events_.front()),
                             [self = shared_from_this()](const error_code& error, std::size_t) {
                               if (error) return self->Close();
                               self->events_.pop_front();
                               if (self->events_.empty()) return;
                               self->pending_ -= self->events_.front()->size();
                               self->PushNext();
                             });
  }

  Response Make(http::status status, std::string body, const char* type) const {
    Response response(status, 11);
    response.set(http::field::content_type, type);
    response.set("Content-Security-Policy", kPolicy);
    response.set("X-Content-Type-Options", "nosniff");
    response.set("Referrer-Policy", "no-referrer");
    response.set("Cross-Origin-Opener-Policy", "same-origin");
    response.set("Cross-Origin-Resource-Policy", "same-origin");
    response.set(http::field::cache_control, "no-store");
    response.body() = std::move(body);
    return response;
  }

  void Json(const nlohmann::json& json, http::status status = http::status::ok) {
    Write(Make(status, json.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace),
               "application/json"));
  }

  void Fail(http::status status, const std::string& text, bool closes = false) {
    if (closes) keeps_ = false;
    Json({{"error", text}}, status);
  }

  void Write(Response response) {
    if (is_answered_) return;
    is_answered_ = true;
    error_code ignored;
    stream_.socket().cancel(ignored);  // the wait of Hold
    response.keep_alive(keeps_);
    response.prepare_payload();
    response_ = std::move(response);
    stream_.expires_after(kPatience);
    http::async_write(stream_, *response_,
                      [self = shared_from_this()](error_code error, std::size_t) {
                        self->held_.reset();
                        if (error || !self->keeps_) return self->Close();
                        self->is_answered_ = false;
                        self->response_.reset();
                        self->Read();
                      });
  }

  void Close() {
    error_code ignored;
    timer_.cancel();
    stream_.socket().shutdown(boost::asio::ip::tcp::socket::shutdown_both, ignored);
    stream_.socket().close(ignored);
    held_.reset();
  }

  beast::tcp_stream stream_;
  Studio& studio_;
  Doors& doors_;
  boost::asio::steady_timer timer_;
  beast::flat_buffer buffer_{kMostHeader + kMostBody + 4096};
  std::optional<http::request_parser<http::string_body>> parser_;
  std::optional<Response> response_;
  std::string path_, query_;
  bool keeps_ = false;
  bool is_answered_ = false;
  std::optional<std::pair<std::string, std::uint64_t>> asked_;  // clip and number
  std::shared_ptr<Session> held_;
  std::optional<std::uint64_t> listener_;
  std::deque<std::shared_ptr<const std::string>> events_;
  std::size_t pending_ = 0;  // bytes of all but the first
};

}  // namespace

void ServeConnection(boost::asio::ip::tcp::socket socket, Studio& studio, Doors& doors) {
  if (doors.connections >= kMostConnections) return;
  std::make_shared<Session>(std::move(socket), studio, doors)->Read();
}

}  // namespace calmframe::studio
