#pragma once

#include <cstdint>
#include <memory>
#include <string>
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

// Deflates what comes in pieces, at the default level; holds a fixed quarter of a MiB, whatever comes. The result does
// not depend on where the pieces end. Used by one thread at a time; of no use after a failure.
class Deflater {
 public:
  static boost::system::result<Deflater, Failure> make(Framing framing);
  Deflater(Deflater&& other) noexcept;
  ~Deflater();

  // Appends to output what is ready of the stream, which may be nothing.
  boost::system::result<void, Failure> add(std::string_view piece, std::string& output);
  // Ends the stream. REQUIRES: the last call.
  boost::system::result<void, Failure> finish(std::string& output);

 private:
  struct State;
  explicit Deflater(std::unique_ptr<State> state) noexcept;
  boost::system::result<void, Failure> run(std::string_view piece, int flush, std::string& output);

  std::unique_ptr<State> _state;
};

// Inflates either framing, for receivers; more than maximumSize bytes is an error.
Result<Data> inflate(std::string_view input, uint64_t maximumSize);

}  // namespace telvane::compression
