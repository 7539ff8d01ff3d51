#pragma once

// Marks what the shared library libtelvane exports; everything else has hidden visibility.
#define TELVANE_EXPORT __attribute__((visibility("default")))
