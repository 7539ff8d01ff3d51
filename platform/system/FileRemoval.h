#pragma once

#include <sys/stat.h>

#include <string>

#include "foundation/Error.h"
#include "foundation/ExtensionToken.h"

// Deleting a client's file on its behalf, without becoming a tool to delete what the client itself could not.
//
// The daemon may have more rights than the client, so it must not follow the client's path with them: it walks from the
// root of the disk folder by folder, through descriptors and never through a symbolic link, and goes on only where the
// client's user and groups may search. In the last folder the client must have the right to delete the name (write,
// search, and the rule of sticky folders), and the name must be that of the very file whose descriptor it handed over.
// A daemon that runs as root takes on the client's user and groups for the one call that deletes, so that the kernel
// has the last word at the moment that counts: between the check and that call somebody could have put another file in
// the place, which in a sticky folder the client might not delete. Every other daemon has its own rights only, and the
// kernel asks for them, too. A thread that may override modes at that moment all the same deletes nothing.
//
// What mode bits do not tell is in doubt, and what is in doubt stays: a folder with an access list, a path with "..".
namespace telvane {

// What the kernel's rules for mode bits make of an identity. User 0 may everything.
bool maySearch(const PeerIdentity& who, const struct stat& folder);
// Whether it may take a name of the file away from the folder.
bool mayRemoveFrom(const PeerIdentity& who, const struct stat& folder, const struct stat& file);
// Whether both are the same file on the same disk.
bool isSameFile(const struct stat& one, const struct stat& other);

// Deletes the regular file at the absolute path, if the path names the file of the descriptor and the identity may.
Result<void> removeFileFor(const PeerIdentity& who, const std::string& path, int descriptor);

}  // namespace telvane
