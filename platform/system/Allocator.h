#pragma once

namespace telvane {

// Tells the allocator to keep a few freed megabytes instead of giving them back at once: a program that fills and
// empties buffers of the same size all the time would otherwise return and fault in the same pages over and over.
// For programs, before their first thread; never for a library inside a host.
void keepFreedMemoryForReuse();

// For an entry point that ends without the program's usual end, at which a leak sanitizer looks for leaks: returns
// whether there are any, which it has then named on standard error. False in a build without it.
bool hasLeakedMemory();

}  // namespace telvane
