#include "interfaces/TelvaneErrors.h"

namespace telvane {

Error makeTelvaneError(String text, int64_t code) {
  return Error::withDescription(kTelvaneErrorDomain.string(), code, std::move(text));
}

}  // namespace telvane
