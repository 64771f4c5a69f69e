#include "studio/server/server.h"

#include <fcntl.h>

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/signal_set.hpp>
#include <boost/asio/steady_timer.hpp>
#include <chrono>
#include <csignal>

#include "studio/server/http_session.h"
#include "studio/server/trust.h"

namespace calmframe::studio {
namespace {

using boost::asio::ip::tcp;
using boost::system::error_code;

class Acceptor {
 public:
  Acceptor(boost::asio::io_context& context, const ServerSettings& settings)
      : acceptor_(context), pause_(context) {
    error_code error;
    const auto address = boost::asio::ip::make_address(settings.address, error);
    if (error) throw CannotListen(settings.address + ": is no address in numbers");
    const tcp::endpoint endpoint(address, static_cast<std::uint16_t>(settings.port));
    acceptor_.open(endpoint.protocol(), error);
    fcntl(acceptor_.native_handle(), F_SETFD, FD_CLOEXEC);  // the browser outlives the studio
    if (!error) acceptor_.set_option(tcp::acceptor::reuse_address(true), error);
    if (!error) acceptor_.bind(endpoint, error);
    if (!error) acceptor_.listen(boost::asio::socket_base::max_listen_connections, error);
    if (error) {
      throw CannotListen("port " + std::to_string(settings.port) + " of " + settings.address +
                         " can't be had: " + error.message() +
                         "; --port names another one, and 0 any that is free");
    }
    const std::string host = address.is_v6() ? "[" + settings.address + "]" : settings.address;
    port_ = acceptor_.local_endpoint().port();
    place_ = "http://" + (address.is_unspecified() ? "localhost" : host) + ":" +
             std::to_string(port_) + "/";
  }

  int port() const { return port_; }
  const std::string& place() const { return place_; }

  void Accept(Studio& studio, Doors& doors) {
    acceptor_.async_accept([this, &studio, &doors](const error_code& error, tcp::socket socket) {
      if (error == boost::asio::error::operation_aborted) return;
      // With a password anybody may come who has it.
      if (!error && (!doors.password.empty() || !IsOfAnotherUser(socket))) {
        ServeConnection(std::move(socket), studio, doors);
      }
      if (!error) return Accept(studio, doors);
      // Such as no descriptor left: others end meanwhile.
      pause_.expires_after(std::chrono::milliseconds(100));
      pause_.async_wait([this, &studio, &doors](const error_code&) { Accept(studio, doors); });
    });
  }

 private:
  tcp::acceptor acceptor_;
  boost::asio::steady_timer pause_;
  int port_ = 0;
  std::string place_;
};

}  // namespace

void Serve(const ServerSettings& settings) {
  Doors doors;  // ahead of the context, whose sessions go with it
  boost::asio::io_context context(1);
  Acceptor acceptor(context, settings);
  Studio studio(context, settings.studio);
  doors.name = settings.name;
  doors.password = settings.studio.password;
  doors.cookie = "calmframe_" + std::to_string(acceptor.port());
  // The first is there by the time that the page is.
  std::string first;
  for (const std::string& clip : settings.clips) {
    const std::string id = studio.Add(clip);
    if (first.empty()) first = id;
  }
  if (!first.empty()) studio.Do({{"op", "open"}, {"clip", first}}, [](const nlohmann::json&) {});
  boost::asio::signal_set signals(context, SIGINT, SIGTERM, SIGHUP);
  signals.async_wait([&context](const error_code&, int) { context.stop(); });
  acceptor.Accept(studio, doors);
  if (settings.listens) {
    settings.listens(settings.studio.password.empty()
                         ? acceptor.place() + "?token=" + studio.secret()
                         : acceptor.place());
  }
  context.run();
  doors.closed = true;
  studio.StopAll();
}

}  // namespace calmframe::studio
