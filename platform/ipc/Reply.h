#pragma once

#include <cstdint>
#include <vector>

#include "foundation/Value.h"

namespace telvane::ipc {

// The answer of one received call, on its way back.
struct Reply {
  uint32_t replyID = 0;
  bool isDropped = false;  // the block was let go of unanswered
  bool isTooDeep = false;  // answered with values nested too deep to cross, so dropped
  Array values;
  size_t wireBytes = 0;  // as measured when the answer was given
  size_t textBytes = 0;
};

using Replies = std::vector<Reply>;

}  // namespace telvane::ipc
