// Not part of a program: the test ResultTest.cannotBeIgnored compiles this and wants the compiler's warning.
#include "foundation/Error.h"

namespace telvane::testing {

Result<int> readNumber();

void ignoresAResult() { readNumber(); }

}  // namespace telvane::testing
