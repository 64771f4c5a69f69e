#pragma once

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

// Of a Cookie header; empty without.
std::string CookieOf(std::string_view header, std::string_view name);
// Of "a=b&c=d", the percent signs resolved; empty without, and of what is damaged.
std::string FieldOf(std::string_view form, std::string_view name);

}  // namespace calmframe::studio
