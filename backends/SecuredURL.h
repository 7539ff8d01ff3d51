#pragma once

#include <string>
#include <string_view>

namespace telvane {

// The address that a backend posts to when its bag or the settings name this URL: only an internal build may send
// without encryption, every other takes https whatever the URL's scheme. What stands between the first and the second
// "://" is kept; a URL without one leaves nothing but the scheme, which is no address.
std::string securedURL(std::string_view url, bool isInternalBuild);

}  // namespace telvane
