#include "platform/Compression.h"

#include <zlib.h>

#include <algorithm>
#include <limits>
#include <vector>

#include "platform/system/PlatformError.h"

namespace telvane::compression {
namespace {

constexpr int kWindowBitsZlib = 15;
constexpr int kWindowBitsGzip = 31;
constexpr int kWindowBitsEither = 47;
constexpr int kMemoryLevel = 8;
constexpr size_t kInflateStep = 64u << 10;
constexpr size_t kDeflateStep = 64u << 10;

using EndFunction = int (*)(z_streamp);

// A zlib stream, ended with the object.
class Stream {
 public:
  explicit Stream(EndFunction end) noexcept : _end(end) {}
  Stream(const Stream&) = delete;
  Stream& operator=(const Stream&) = delete;
  ~Stream() { _end(&_stream); }

  z_stream* operator->() noexcept { return &_stream; }
  z_stream* get() noexcept { return &_stream; }
  std::string message() const { return _stream.msg == nullptr ? "" : _stream.msg; }

 private:
  z_stream _stream{};
  EndFunction _end;
};

uInt clamped(size_t size) { return static_cast<uInt>(std::min<size_t>(size, std::numeric_limits<uInt>::max())); }

void setInput(Stream& stream, std::string_view input) {
  stream->next_in = reinterpret_cast<Bytef*>(const_cast<char*>(input.data()));
  stream->avail_in = clamped(input.size());
}

void setOutput(Stream& stream, std::vector<uint8_t>& output, size_t written) {
  stream->next_out = output.data() + written;
  stream->avail_out = clamped(output.size() - written);
}

Failure failure(Failure::Step step, int code, const Stream& stream) { return {step, code, stream.message()}; }

Error inflateError(int code, const std::string& message) {
  return platformError(code, "Cannot inflate: " + (message.empty() ? "the data is cut short" : message));
}

// Prepares a stream for deflating.
int begin(Stream& stream, Framing framing) {
  const int windowBits = framing == Framing::Gzip ? kWindowBitsGzip : kWindowBitsZlib;
  return deflateInit2(stream.get(), Z_DEFAULT_COMPRESSION, Z_DEFLATED, windowBits, kMemoryLevel, Z_DEFAULT_STRATEGY);
}

}  // namespace

boost::system::result<Data, Failure> deflate(Framing framing, std::string_view input) {
  // zlib counts what it is given in an unsigned int; more would be cut without a word.
  if (input.size() > std::numeric_limits<uInt>::max()) return Failure{Failure::Step::Initialise, Z_MEM_ERROR, ""};
  Stream stream(::deflateEnd);
  setInput(stream, input);
  int code = begin(stream, framing);
  if (code != Z_OK) return failure(Failure::Step::Initialise, code, stream);
  std::vector<uint8_t> output(::deflateBound(stream.get(), input.size()));
  do {
    setOutput(stream, output, stream->total_out);
    code = ::deflate(stream.get(), Z_FINISH);
  } while (code == Z_OK);
  if (code != Z_STREAM_END) return failure(Failure::Step::Deflate, code, stream);
  // The buffer is several times what was written, and the result may wait for the network.
  return Data::copyOf(std::span(output.data(), stream->total_out));
}

struct Deflater::State {
  Stream stream{::deflateEnd};
  std::vector<uint8_t> buffer = std::vector<uint8_t>(kDeflateStep);
};

Deflater::Deflater(std::unique_ptr<State> state) noexcept : _state(std::move(state)) {}
Deflater::Deflater(Deflater&& other) noexcept = default;
Deflater::~Deflater() = default;

boost::system::result<Deflater, Failure> Deflater::make(Framing framing) {
  auto state = std::make_unique<State>();
  const int code = begin(state->stream, framing);
  if (code != Z_OK) return failure(Failure::Step::Initialise, code, state->stream);
  return Deflater(std::move(state));
}

boost::system::result<void, Failure> Deflater::add(std::string_view piece, std::string& output) {
  // zlib counts what it is given in an unsigned int.
  constexpr size_t kMost = std::numeric_limits<uInt>::max();
  for (; piece.size() > kMost; piece.remove_prefix(kMost)) {
    const auto added = run(piece.substr(0, kMost), Z_NO_FLUSH, output);
    if (added.has_error()) return added;
  }
  return run(piece, Z_NO_FLUSH, output);
}

boost::system::result<void, Failure> Deflater::finish(std::string& output) { return run({}, Z_FINISH, output); }

boost::system::result<void, Failure> Deflater::run(std::string_view piece, int flush, std::string& output) {
  Stream& stream = _state->stream;
  setInput(stream, piece);
  int code = Z_OK;
  do {
    setOutput(stream, _state->buffer, 0);
    code = ::deflate(stream.get(), flush);
    // Z_BUF_ERROR says that there was nothing to do.
    if (code != Z_OK && code != Z_STREAM_END && code != Z_BUF_ERROR) {
      return failure(Failure::Step::Deflate, code, stream);
    }
    output.append(reinterpret_cast<const char*>(_state->buffer.data()), kDeflateStep - stream->avail_out);
  } while (stream->avail_out == 0);
  return {};
}

Result<Data> inflate(std::string_view input, uint64_t maximumSize) {
  if (input.size() > std::numeric_limits<uInt>::max()) return inflateError(Z_MEM_ERROR, "the data is too large");
  Stream stream(::inflateEnd);
  setInput(stream, input);
  int code = inflateInit2(stream.get(), kWindowBitsEither);
  std::vector<uint8_t> output;
  while (code == Z_OK) {
    if (stream->total_out > maximumSize) break;
    if (stream->total_out == output.size()) output.resize(output.size() + std::max(output.size(), kInflateStep));
    setOutput(stream, output, stream->total_out);
    code = ::inflate(stream.get(), Z_NO_FLUSH);
  }
  if (stream->total_out > maximumSize) return platformError(Z_BUF_ERROR, "Cannot inflate: the content is too large");
  if (code != Z_STREAM_END) return inflateError(code, stream.message());
  if (stream->avail_in != 0) return platformError(Z_DATA_ERROR, "Cannot inflate: something follows the end");
  output.resize(stream->total_out);
  return Data(std::move(output));
}

}  // namespace telvane::compression
