#include "platform/system/SystemProcessMemory.h"

#include <unistd.h>

#include <charconv>
#include <string_view>

#include "platform/system/FileAccess.h"

namespace telvane {
namespace {

constexpr uint64_t kLongestLine = 4096;

// Takes the next number off the text; 0 when there is none.
uint64_t takeNumber(std::string_view& text) {
  uint64_t number = 0;
  const size_t start = std::min(text.find_first_not_of(' '), text.size());
  const auto parsed = std::from_chars(text.data() + start, text.data() + text.size(), number);
  text.remove_prefix(static_cast<size_t>(parsed.ptr - text.data()));
  return number;
}

}  // namespace

uint64_t SystemProcessMemory::taskMemory() const {
  const Result<fileaccess::Content> status = fileaccess::read("/proc/self/statm", kLongestLine);
  if (!status) return 0;
  std::string_view text = status->data.view();
  takeNumber(text);  // the size of the address space
  const uint64_t resident = takeNumber(text);
  const uint64_t shared = takeNumber(text);
  return resident < shared ? 0 : (resident - shared) * static_cast<uint64_t>(::sysconf(_SC_PAGESIZE));
}

}  // namespace telvane
