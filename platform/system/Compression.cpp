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

}  // namespace

boost::system::result<Data, Failure> deflate(Framing framing, std::string_view input) {
  // zlib counts what it is given in an unsigned int; more would be cut without a word.
  if (input.size() > std::numeric_limits<uInt>::max()) return Failure{Failure::Step::Initialise, Z_MEM_ERROR, ""};
  Stream stream(::deflateEnd);
  setInput(stream, input);
  const int windowBits = framing == Framing::Gzip ? kWindowBitsGzip : kWindowBitsZlib;
  int code =
      deflateInit2(stream.get(), Z_DEFAULT_COMPRESSION, Z_DEFLATED, windowBits, kMemoryLevel, Z_DEFAULT_STRATEGY);
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
