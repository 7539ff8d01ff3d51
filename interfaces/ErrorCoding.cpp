#include "interfaces/ErrorCoding.h"

namespace telvane::errorcoding {

Value encode(const std::optional<Error>& error) {
  if (!error) return {};
  Dictionary encoded{{kDomain, error->domain()}, {kCode, error->code()}};
  if (!error->userInfo().empty()) encoded.set(kUserInfo, error->userInfo());
  return encoded;
}

std::optional<Error> decode(const Value& value) {
  if (!value.isPresent()) return std::nullopt;
  const Dictionary* encoded = value.dictionary();
  if (encoded == nullptr) return Error();
  const String* domain = (*encoded)[kDomain].string();
  const Dictionary* userInfo = (*encoded)[kUserInfo].dictionary();
  return Error(domain != nullptr ? *domain : String(), (*encoded)[kCode].integerValue(),
               userInfo != nullptr ? *userInfo : Dictionary());
}

}  // namespace telvane::errorcoding
