#pragma once

#include "platform/SandboxExtensions.h"

namespace telvane {

// Tokens that are open file descriptors.
//
// Why a client gains nothing by what it says: the bytes come from its descriptor alone, which the kernel gave it only
// if it may read the file; a path is compared with the descriptor's device and inode and never opened. Where the daemon
// may not look a path up, or lives in another view of the disks, the kernel's own name of the descriptor has to be the
// path. A file is deleted as FileRemoval.h says.
class DescriptorExtensions final : public SandboxExtensions {
 public:
  std::unique_ptr<SandboxExtension> consume(const std::string& path, const ExtensionToken& token) override;
};

}  // namespace telvane
