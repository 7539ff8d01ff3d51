#pragma once

#include <poll.h>
#include <unistd.h>

#include <string>

namespace telvane::testing {

// Reads what comes through the descriptor until the other end is closed, or nothing has come for a long time.
inline std::string readAll(int descriptor) {
  constexpr int kDeadlineMilliseconds = 30000;
  std::string text;
  char buffer[4096];
  for (;;) {
    pollfd readable{descriptor, POLLIN, 0};
    if (poll(&readable, 1, kDeadlineMilliseconds) != 1) return text + "(nothing came)";
    const ssize_t count = read(descriptor, buffer, sizeof buffer);
    if (count <= 0) return text;
    text.append(buffer, static_cast<size_t>(count));
  }
}

// Reads until the text ends with a line feed.
inline std::string readLine(int descriptor) {
  constexpr int kDeadlineMilliseconds = 30000;
  std::string text;
  while (text.empty() || text.back() != '\n') {
    pollfd readable{descriptor, POLLIN, 0};
    if (poll(&readable, 1, kDeadlineMilliseconds) != 1) return text + "(nothing came)";
    char character = 0;
    if (read(descriptor, &character, 1) != 1) return text + "(end)";
    text += character;
  }
  return text;
}

}  // namespace telvane::testing
