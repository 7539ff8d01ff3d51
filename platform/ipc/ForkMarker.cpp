#include "platform/ipc/ForkMarker.h"

#include <sys/mman.h>
#include <unistd.h>

namespace telvane::ipc {

namespace {
constexpr size_t kPageSize = 4096;
}

ForkMarker::ForkMarker() noexcept : _pid(getpid()) {
  void* page = mmap(nullptr, kPageSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) return;
  if (madvise(page, kPageSize, MADV_WIPEONFORK) != 0) {
    munmap(page, kPageSize);
    return;
  }
  *static_cast<char*>(page) = 1;
  _page = static_cast<const char*>(page);
}

ForkMarker::~ForkMarker() {
  if (_page != nullptr) munmap(const_cast<char*>(_page), kPageSize);
}

bool ForkMarker::isOriginalProcess() const noexcept { return _page != nullptr ? *_page != 0 : getpid() == _pid; }

}  // namespace telvane::ipc
