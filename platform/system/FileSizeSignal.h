#pragma once

namespace telvane {

// Lets a write beyond the largest file that the process may make (RLIMIT_FSIZE) fail with EFBIG, as a full disk makes
// it fail, on every thread; the signal that comes with it would end the process. For programs only, never for the
// library: what a host does with its signals is its own affair. Called by main before anything is written.
void takeFileSizeLimitAsError();

}  // namespace telvane
