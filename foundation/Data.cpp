#include "foundation/Data.h"

#include <utility>

namespace telvane {
namespace {

constexpr char kHexadecimalDigits[] = "0123456789abcdef";

// Keeps the container and the view of its bytes together; moved nowhere once made, so that the view stays true.
template <class Container>
struct Owner {
  explicit Owner(Container bytes)
      : container(std::move(bytes)), view(reinterpret_cast<const char*>(container.data()), container.size()) {}
  Owner(const Owner&) = delete;
  Owner& operator=(const Owner&) = delete;

  Container container;
  std::string_view view;
};

template <class Container>
std::shared_ptr<const std::string_view> share(Container bytes) {
  if (bytes.empty()) return nullptr;
  auto owner = std::make_shared<Owner<Container>>(std::move(bytes));
  const std::string_view* view = &owner->view;
  return {std::move(owner), view};
}

}  // namespace

Data::Data(std::vector<uint8_t> bytes) : _bytes(share(std::move(bytes))) {}

Data::Data(std::string bytes) : _bytes(share(std::move(bytes))) {}

Data Data::copyOf(std::string_view bytes) { return Data(std::string(bytes)); }

Data Data::copyOf(std::span<const uint8_t> bytes) { return Data(std::vector<uint8_t>(bytes.begin(), bytes.end())); }

std::string Data::description() const {
  std::string text = "<";
  text.reserve(2 + size() * 2 + size() / 4);
  size_t position = 0;
  for (const char c : view()) {
    if (position != 0 && position % 4 == 0) text += ' ';
    const auto byte = static_cast<uint8_t>(c);
    text += kHexadecimalDigits[byte >> 4];
    text += kHexadecimalDigits[byte & 15];
    ++position;
  }
  text += '>';
  return text;
}

}  // namespace telvane
