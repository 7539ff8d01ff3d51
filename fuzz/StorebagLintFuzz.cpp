#include "fuzz/FuzzInput.h"
#include "tools/StorebagLint.h"

// Whatever the file is, lint ends, and each finding is one line.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  const auto report = StorebagLint::lintFile(Data::copyOf(fuzz::text(data, size)));
  if (!report) return 0;
  for (const LintFinding& finding : report->findings()) {
    fuzz::require(finding.path.find('\n') == std::string::npos && finding.text.find('\n') == std::string::npos);
  }
  return 0;
}
