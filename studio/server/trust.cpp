#include "studio/server/trust.h"

#include <sys/random.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <boost/asio/ip/address.hpp>
#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <optional>
#include <sstream>
#include <system_error>

namespace calmframe::studio {
namespace {

// Without the port, and the brackets of an IPv6 address.
std::string_view NameOf(std::string_view host) {
  if (!host.empty() && host[0] == '[') {
    const std::size_t end = host.find(']');
    if (end == std::string_view::npos) return {};
    const std::string_view behind = host.substr(end + 1);
    return behind.empty() || behind[0] == ':' ? host.substr(1, end - 1) : std::string_view();
  }
  return host.substr(0, host.find(':'));
}

bool IsSameName(std::string_view a, std::string_view b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) {
    return std::tolower(static_cast<unsigned char>(x)) ==
           std::tolower(static_cast<unsigned char>(y));
  });
}

int DigitOf(char digit) {
  if (digit >= '0' && digit <= '9') return digit - '0';
  if (digit >= 'a' && digit <= 'f') return digit - 'a' + 10;
  if (digit >= 'A' && digit <= 'F') return digit - 'A' + 10;
  return -1;
}

// As the kernel lists an end of a connection: words of four bytes as this processor reads them, the
// port behind; `wide` as IPv6 has it, into which an IPv4 address is mapped.
std::string ListedAs(const boost::asio::ip::tcp::endpoint& end, bool wide) {
  namespace ip = boost::asio::ip;
  if (!wide && end.address().is_v6()) return "";
  std::string text;
  char part[9];
  const auto add = [&](const auto& bytes) {
    for (std::size_t at = 0; at < bytes.size(); at += 4) {
      std::uint32_t word = 0;
      std::memcpy(&word, bytes.data() + at, sizeof word);
      std::snprintf(part, sizeof part, "%08X", word);
      text += part;
    }
  };
  if (!wide) {
    add(end.address().to_v4().to_bytes());
  } else if (end.address().is_v6()) {
    add(end.address().to_v6().to_bytes());
  } else {
    add(ip::make_address_v6(ip::v4_mapped, end.address().to_v4()).to_bytes());
  }
  std::snprintf(part, sizeof part, ":%04X", static_cast<unsigned>(end.port()));
  return text + part;
}

std::optional<std::string> Resolved(std::string_view text) {
  std::string resolved;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      resolved.push_back(text[i] == '+' ? ' ' : text[i]);
      continue;
    }
    const int high = i + 2 < text.size() ? DigitOf(text[i + 1]) : -1;
    const int low = high >= 0 ? DigitOf(text[i + 2]) : -1;
    if (low < 0 || high * 16 + low == 0) return {};
    resolved.push_back(static_cast<char>(high * 16 + low));
    i += 2;
  }
  return resolved;
}

}  // namespace

std::string NewSecret() {
  std::array<unsigned char, 32> bytes;
  if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
    throw std::system_error(errno, std::generic_category());
  }
  std::string secret;
  for (const unsigned char byte : bytes) {
    secret.push_back("0123456789abcdef"[byte >> 4]);
    secret.push_back("0123456789abcdef"[byte & 15]);
  }
  return secret;
}

bool IsSame(std::string_view a, std::string_view b) {
  unsigned different = a.size() == b.size() ? 0 : 1;
  for (std::size_t i = 0; i < a.size(); ++i) {
    different |= static_cast<unsigned char>(a[i]) ^
                 (b.empty() ? 0u : static_cast<unsigned char>(b[i % b.size()]));
  }
  return different == 0 && !a.empty();
}

bool IsOwnHost(std::string_view host, std::string_view name) {
  const std::string_view own = NameOf(host);
  if (own.empty()) return false;
  if (IsSameName(own, "localhost") || (!name.empty() && IsSameName(own, name))) return true;
  boost::system::error_code error;
  boost::asio::ip::make_address(std::string(own), error);
  return !error;
}

bool IsOwnOrigin(std::string_view origin, std::string_view host) {
  constexpr std::string_view kScheme = "http://";
  return origin.substr(0, kScheme.size()) == kScheme && !host.empty() &&
         IsSameName(origin.substr(kScheme.size()), host);
}

bool IsOfAnotherUser(const boost::asio::ip::tcp::socket& socket) {
  boost::system::error_code error;
  const auto theirs = socket.remote_endpoint(error);
  if (error) return false;
  const auto own = socket.local_endpoint(error);
  if (error) return false;
  for (const bool wide : {false, true}) {
    const std::string from = ListedAs(theirs, wide), to = ListedAs(own, wide);
    std::ifstream list(wide ? "/proc/net/tcp6" : "/proc/net/tcp");
    for (std::string line; std::getline(list, line);) {
      std::istringstream words(line);
      std::string skipped, local, remote;
      words >> skipped >> local >> remote;
      if (local != from || remote != to) continue;
      std::uint64_t user = 0, socket_number = 0;
      words >> skipped >> skipped >> skipped >> skipped >> user >> skipped >> socket_number;
      // One that was closed already is nobody's, and listed as root's.
      return socket_number == 0 || (user != 0 && user != geteuid());
    }
  }
  return false;
}

bool BringsCookie(std::string_view header, std::string_view name, std::string_view value) {
  while (!header.empty()) {
    const std::size_t end = std::min(header.find(';'), header.size());
    std::string_view pair = header.substr(0, end);
    header.remove_prefix(std::min(end + 1, header.size()));
    while (!pair.empty() && pair[0] == ' ') pair.remove_prefix(1);
    const std::size_t sign = pair.find('=');
    if (sign != std::string_view::npos && pair.substr(0, sign) == name &&
        IsSame(pair.substr(sign + 1), value)) {
      return true;
    }
  }
  return false;
}

std::string FieldOf(std::string_view form, std::string_view name) {
  while (!form.empty()) {
    const std::size_t end = std::min(form.find('&'), form.size());
    const std::string_view pair = form.substr(0, end);
    form.remove_prefix(std::min(end + 1, form.size()));
    const std::size_t sign = pair.find('=');
    if (sign != std::string_view::npos && pair.substr(0, sign) == name) {
      return Resolved(pair.substr(sign + 1)).value_or("");
    }
  }
  return "";
}

}  // namespace calmframe::studio
