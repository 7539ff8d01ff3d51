#pragma once

#include <string>
#include <string_view>

namespace telvane {

// Returns the file-system path that a "file:" URL names (percent-encoding undone, the host passed over), or the text
// itself when it is no such URL. Empty when the URL has a path with a NUL or broken encoding in it.
std::string pathOfFileURL(std::string_view url);

// Returns the "file:" URL of an absolute path; a text that is no absolute path comes back as it is.
std::string fileURLOfPath(std::string_view path);

}  // namespace telvane
