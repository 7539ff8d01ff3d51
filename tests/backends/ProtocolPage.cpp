#include "tests/backends/ProtocolPage.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>

namespace telvane::testing {

std::string between(const std::string& text, const std::string& start, const std::string& end) {
  const size_t from = text.find(start);
  if (from == std::string::npos) return "";
  const size_t begin = from + start.size();
  return text.substr(begin, text.find(end, begin) - begin);
}

ProtocolPage::ProtocolPage(const std::string& fileName) {
  std::ifstream file(TELVANE_SOURCE_DIR "/docs/" + fileName);
  EXPECT_TRUE(file.is_open()) << fileName;
  _text.assign(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

std::string ProtocolPage::example(const std::string& name) const {
  return between(_text, "<!-- example: " + name + " -->\n```\n", "\n```\n");
}

std::string ProtocolPage::section(const std::string& heading) const {
  return between(_text, "\n## " + heading + "\n", "\n## ");
}

std::string headerLines(const URLRequest& request) {
  std::string lines;
  for (const URLRequest::Header& header : request.headers) {
    lines += (lines.empty() ? "" : "\n") + header.name + ": " + header.value;
  }
  return lines;
}

}  // namespace telvane::testing
