#pragma once

#include <string>
#include <string_view>

namespace telvane {

// Returns the text as it may stand in the query of a URL: every byte that RFC 3986 (3.4) does not allow there becomes
// %XX. What has a meaning inside a query, as '&', '=' and '+', is allowed there and stays.
std::string percentEncodedForQuery(std::string_view text);

// Whether the text could be the URL of a web server: its scheme is http or https, a host follows, and every character
// may stand in a URL.
bool isWebURL(std::string_view text);

}  // namespace telvane
