#include "foundation/Error.h"

#include <fmt/format.h>

#include <stdexcept>

namespace telvane {

Error Error::withDescription(String domain, int64_t code, String text) {
  return Error(std::move(domain), code, Dictionary{{kLocalizedDescription, std::move(text)}});
}

std::string Error::description() const {
  const Value& text = _userInfo[kLocalizedDescription];
  return text.isString() ? std::string(text.text()) : fmt::format("{} error {}", _domain.view(), _code);
}

void throw_exception_from_error(const Error& error, const boost::source_location& location) {
  throw std::logic_error(fmt::format("{}:{}: the value of a failed result was read: {}", location.file_name(),
                                     location.line(), error.description()));
}

}  // namespace telvane
