#pragma once

#include <sys/types.h>

namespace telvane::ipc {

// Tells a forked child from the process that made the marker, so that a child leaves alone what belongs to threads that
// it does not have. A page of memory that the kernel clears in the child: asking costs one read, takes no lock and no
// system call. Safe from any thread.
class ForkMarker {
 public:
  ForkMarker() noexcept;
  ~ForkMarker();
  ForkMarker(const ForkMarker&) = delete;
  ForkMarker& operator=(const ForkMarker&) = delete;

  bool isOriginalProcess() const noexcept;

 private:
  volatile const char* _page = nullptr;  // null when the kernel cannot clear pages: the process id tells then
  pid_t _pid;
};

}  // namespace telvane::ipc
