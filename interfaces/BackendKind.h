#pragma once

#include <cstdint>
#include <string_view>

namespace telvane {

// The kinds of backend that a name in a storebag's environment section can stand for.
enum class BackendKind : uint8_t { Dashboard, UploadServer, HTTPSPost, Wattbook, VDR, Unknown };

// Returns the kind that the name stands for, by the first rule that holds; any name that contains
// kTelvaneBackendHTTPPost is an HTTPS backend. Whether one is made may depend on more (the VDR kind: on the device).
BackendKind backendKindForName(std::string_view name) noexcept;

}  // namespace telvane
