#pragma once

#include <boost/asio/ip/tcp.hpp>
#include <string>
#include <string_view>

namespace calmframe::studio {

// Who may speak to the studio. Any page that a browser shows can send requests to this machine, and
// can have a name of its own stand for it; so a request has to name the machine as a person does,
// to come from the studio's own page, and to bring a secret.

// 256 random bits in hexadecimal digits. Throws std::system_error.
std::string NewSecret();
// Takes as long whatever the first difference is.
bool IsSame(std::string_view a, std::string_view b);

// "localhost", an address in numbers, or `name`; with any port, which a tunnel changes. Other names
// may be an attacker's, whatever they stand for by now.
bool IsOwnHost(std::string_view host, std::string_view name);
// Whether an Origin is that of the page at this Host.
bool IsOwnOrigin(std::string_view origin, std::string_view host);

// Whether another user of this machine than its own and root is at the other end, as the kernel
// lists it. The secret alone doesn't tell: a browser's command line and its requests to any port of
// this machine may have shown it to others. False where nothing is listed.
bool IsOfAnotherUser(const boost::asio::ip::tcp::socket& socket);

// Whether one of a Cookie header's cookies of that name has the value: another port of this machine
// may have set one, too, that comes first.
bool BringsCookie(std::string_view header, std::string_view name, std::string_view value);
// Of "a=b&c=d", the percent signs resolved; empty without, and of what is damaged.
std::string FieldOf(std::string_view form, std::string_view name);

}  // namespace calmframe::studio
