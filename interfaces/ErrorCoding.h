#pragma once

#include <optional>

#include "foundation/Error.h"
#include "foundation/Value.h"

// How an error travels between processes: as a dictionary of its domain, its code and, when there is one, its user
// info. Both sides of the local connection use these two functions and nothing else.
namespace telvane::errorcoding {

inline constexpr Key kDomain{"domain"};
inline constexpr Key kCode{"code"};
inline constexpr Key kUserInfo{"userInfo"};

// Returns the dictionary, or an absent value for no error.
Value encode(const std::optional<Error>& error);

// Reads what encode wrote. An absent value is no error; anything else is one, because the other side meant to report a
// failure: what is missing or of a wrong type in it reads as an empty domain, code 0 and no user info.
std::optional<Error> decode(const Value& value);

}  // namespace telvane::errorcoding
