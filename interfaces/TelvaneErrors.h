#pragma once

#include "foundation/Error.h"

namespace telvane {

inline constexpr Key kTelvaneErrorDomain{"TelvaneErrorDomain"};

// Codes of kTelvaneErrorDomain. An error may also carry the request mode of a connectivity helper (4, 8 …), or the
// server's HTTP status (500 to 599), as its code.
enum class TelvaneErrorCode : int64_t {
  Failure = -1,
  MissingSessionInfo = 2,
  InvalidClientType = 3,
  MessageRefused = 4,
  MissingParameter = 7,
};

// Makes an error of kTelvaneErrorDomain whose localized description is the text.
Error makeTelvaneError(String text, int64_t code);

}  // namespace telvane
