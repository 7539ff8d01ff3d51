#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace telvane {

// The URL of a server, as far as its author can get it wrong. Views of the text that it was made of.
struct URLText {
  std::string_view scheme;
  std::string_view host;
  std::optional<uint16_t> port;
  // The text between "://" and the path is a mark like @COLLECTOR@, which is still to be replaced.
  bool isPlaceholder = false;

  struct Parsed;
  // Takes a URL apart. Fails with what is wrong with it, as the end of a sentence about it: "has no host".
  static Parsed parse(std::string_view text);
  bool hasScheme(std::string_view name) const noexcept;
};

struct URLText::Parsed {
  std::optional<URLText> url;
  std::string fault;  // when there is none
};

}  // namespace telvane
