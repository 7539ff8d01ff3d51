#pragma once

#include <cstdint>
#include <string_view>

#include "foundation/Data.h"
#include "foundation/Error.h"

// zlib streams (RFC 1950) and gzip files (RFC 1952).
namespace telvane::compression {

enum class Framing { Zlib, Gzip };

struct Failure {
  enum class Step { Initialise, Deflate };
  Step step;
  int code;             // zlib's code
  std::string message;  // the stream's own message, may be empty
};

// Deflates at the default level. REQUIRES: input is not empty. On failure returns what zlib said.
boost::system::result<Data, Failure> deflate(Framing framing, std::string_view input);
// Inflates either framing, for receivers; more than maximumSize bytes is an error.
Result<Data> inflate(std::string_view input, uint64_t maximumSize);

}  // namespace telvane::compression
