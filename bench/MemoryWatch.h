#pragma once

#include <sys/types.h>

#include <vector>

namespace telvane::bench {

// The resident memory of a process over a run, in megabytes.
class MemoryWatch {
 public:
  struct Trend {
    double warm = 0;  // what it had after the first quarter, in which buffers and pools find their size
    double end = 0;   // what it had in the last quarter
    double peak = 0;
    // How much of the warm figure was added until the end; 0.1 is a tenth. Negative when it shrank.
    double growth() const { return warm > 0 ? end / warm - 1 : 0; }
  };

  explicit MemoryWatch(pid_t pid) : _pid(pid) {}
  // Takes a sample; nothing when the process is gone. To be called at even intervals.
  void sample();
  // The medians of the second and of the last quarter of the samples, so that a moment counts for little.
  Trend trend() const { return trendOf(_megabytes); }
  static Trend trendOf(const std::vector<double>& megabytes);

 private:
  const pid_t _pid;
  std::vector<double> _megabytes;
};

}  // namespace telvane::bench
