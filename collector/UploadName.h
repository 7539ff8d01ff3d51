#pragma once

#include <string>
#include <string_view>

namespace telvane {

// The name under which an upload may be kept, made of what its request's target says: the value of "filename", percent
// decoded. Only letters, digits, '-', '_' and '.' stay, every other byte becomes '_', and so does a leading '.', so no
// name leads out of a folder, hides, or surprises a terminal. Names without any of it, or none, become "upload"; longer
// ones than 200 bytes lose their beginning.
std::string uploadName(std::string_view target);

// The value of a key in the target's query, percent-decoded; empty when there is none.
std::string queryValue(std::string_view target, std::string_view key);

}  // namespace telvane
