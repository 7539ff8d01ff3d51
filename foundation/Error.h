#pragma once

#include <boost/assert/source_location.hpp>
#include <boost/system/result.hpp>
#include <cstdint>
#include <string>
#include <utility>

#include "foundation/Export.h"
#include "foundation/Value.h"

namespace telvane {

// A failure: the domain that its code belongs to, the code, and a dictionary of particulars. A value.
class TELVANE_EXPORT Error {
 public:
  Error() = default;
  Error(String domain, int64_t code, Dictionary userInfo = {})
      : _domain(std::move(domain)), _code(code), _userInfo(std::move(userInfo)) {}
  // Makes an error whose description is the given text.
  static Error withDescription(String domain, int64_t code, String text);

  const String& domain() const noexcept { return _domain; }
  int64_t code() const noexcept { return _code; }
  const Dictionary& userInfo() const noexcept { return _userInfo; }
  // The text under kLocalizedDescription, or "DOMAIN error CODE" when there is none.
  std::string description() const;

  friend bool operator==(const Error& a, const Error& b) noexcept {
    return a._domain == b._domain && a._code == b._code && a._userInfo == b._userInfo;
  }

  static constexpr Key kLocalizedDescription{"LocalizedDescription"};

 private:
  String _domain;
  int64_t _code = 0;
  Dictionary _userInfo;
};

// The domain of what the platform itself reports (network, files, coding, the local connection); codes are errno
// values, those of URLErrorCode for the network, or a code of who reports it, whose description tells more.
inline constexpr Key kPlatformErrorDomain{"TelvanePlatform"};

// A value or the Error that stands in its place; an ignored one is a compile error. `return value;` and
// `return Error(...);` both make one; a success of Result<void> is `return {};`. Reading the value of a failed one is a
// mistake of ours and throws std::logic_error: ask first.
template <class T>
class [[nodiscard]] Result : public boost::system::result<T, Error> {
 public:
  using boost::system::result<T, Error>::result;
};

// Called by Boost when the value of a failed result is read. Throws std::logic_error.
[[noreturn]] TELVANE_EXPORT void throw_exception_from_error(const Error& error, const boost::source_location& location);

}  // namespace telvane
