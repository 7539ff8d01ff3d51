#pragma once

#include <string>

#include "platform/URLSession.h"

namespace telvane::testing {

// What stands between the first of the start text and the next of the end text, or to the end of all where the latter
// is missing; empty without the start text.
std::string between(const std::string& text, const std::string& start, const std::string& end);

// A page of docs/ that describes a protocol, for the tests that hold it against what the code sends. A value.
class ProtocolPage {
 public:
  // fileName: without the folder. A page that cannot be read fails the test and is empty.
  explicit ProtocolPage(const std::string& fileName);

  const std::string& text() const noexcept { return _text; }
  // The lines of the example that is marked with the name, as they stand there; empty when there is none.
  std::string example(const std::string& name) const;
  // What stands under the heading, up to the next one; empty when there is none.
  std::string section(const std::string& heading) const;

 private:
  std::string _text;
};

// A request's headers as the pages write them: one to a line, in the order in which they go out.
std::string headerLines(const URLRequest& request);

}  // namespace telvane::testing
