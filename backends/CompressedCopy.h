#pragma once

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
// size less than half a MiB is in memory at a time. The file counts as large as it is when this is called: what it
// grows by meanwhile is left out, and of one that shrinks goes what is there. NothingToRead: it is empty, or cannot be
// read to its end. NotMade: there is no room for the copy.
// isCancelled: asked before each piece; once it says yes, the copy is NotMade.
CompressedCopy compressedCopyOf(const SandboxExtension& extension, FileSystem& files,
                                const std::function<bool()>& isCancelled);

}  // namespace telvane
