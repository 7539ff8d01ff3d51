#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "foundation/Error.h"
#include "platform/BodyFile.h"
#include "platform/FileSystem.h"
#include "platform/SandboxExtensions.h"

namespace telvane {

// What became of making a compressed copy.
struct CompressedCopy {
  enum class Outcome { Made, NothingToRead, NotMade };
  Outcome outcome = Outcome::NotMade;
  std::shared_ptr<const BodyFile> file;  // when it was made
};

// Copies a client's file, compressed with gzip, into a temporary file of the daemon, piece by piece: of a file of any
// size less than half a MiB is in memory at a time. size: how large the caller found the file, which its bound on all
// uploads rests on: what the file has grown by since is left out, and of one that has shrunk goes what is there.
// NothingToRead: it is empty, or cannot be read to its end. NotMade: there is no room for the copy.
// isCancelled: asked before each piece; once it says yes, the copy is NotMade.
CompressedCopy compressedCopyOf(const SandboxExtension& extension, uint64_t size, FileSystem& files,
                                const std::function<bool()>& isCancelled);

}  // namespace telvane
