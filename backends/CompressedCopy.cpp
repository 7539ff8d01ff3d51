#include "backends/CompressedCopy.h"

#include <algorithm>
#include <string>

#include "platform/Compression.h"

namespace telvane {
namespace {

// Beside the storebags, on a disk: what is in /tmp may be in memory.
constexpr char kFolder[] = "~/Library/Caches/telvaned/uploads";
constexpr size_t kPieceBytes = 128u << 10;

// Reads the next piece of the first size bytes; nothing when reading failed.
std::optional<std::string_view> nextPiece(const SandboxExtension& extension, uint64_t offset, uint64_t size,
                                          std::string& buffer) {
  const Result<size_t> count =
      extension.readAt(offset, buffer.data(), static_cast<size_t>(std::min<uint64_t>(buffer.size(), size - offset)));
  if (count.has_error()) return std::nullopt;
  return std::string_view(buffer).substr(0, *count);
}

// Moves what is ready of the compressed stream into the file.
bool store(std::string& compressed, TemporaryFile& file) {
  const bool isStored = compressed.empty() || file.append(compressed).has_value();
  compressed.clear();
  return isStored;
}

}  // namespace

CompressedCopy compressedCopyOf(const SandboxExtension& extension, uint64_t size, FileSystem& files,
                                const std::function<bool()>& isCancelled) {
  using Outcome = CompressedCopy::Outcome;
  if (size == 0) return {Outcome::NothingToRead, nullptr};
  std::string buffer(kPieceBytes, '\0');
  std::optional<std::string_view> piece = nextPiece(extension, 0, size, buffer);
  if (!piece.has_value() || piece->empty()) return {Outcome::NothingToRead, nullptr};
  auto deflater = compression::Deflater::make(compression::Framing::Gzip);
  Result<std::unique_ptr<TemporaryFile>> file = files.newTemporaryFile(kFolder);
  if (deflater.has_error() || file.has_error()) return {};
  std::string compressed;
  for (uint64_t offset = 0; !piece->empty();) {
    if (isCancelled()) return {};
    offset += piece->size();
    if (deflater->add(*piece, compressed).has_error() || !store(compressed, **file)) return {};
    if (offset == size) break;
    piece = nextPiece(extension, offset, size, buffer);
    if (!piece.has_value()) return {Outcome::NothingToRead, nullptr};
  }
  if (deflater->finish(compressed).has_error() || !store(compressed, **file)) return {};
  return {Outcome::Made, std::move(*file)};
}

}  // namespace telvane
