#pragma once

#include <string>

#include "platform/system/Environment.h"

namespace telvane {

// Where this instance lives. A value.
struct Paths {
  std::string root;  // put in front of system paths; empty, or absolute without a slash at its end
  std::string home;  // absolute without a slash at its end; empty when the user has none

  // The home folder comes from the user database when HOME is not set. Relative paths count from the working folder.
  static Paths fromEnvironment(const Environment& environment);
  // Puts the home folder in place of a leading "~", and the root in front of a path below /run, /etc, /var
  // or /tmp/tvnstorage. Every other path, and one that is below the root already, stays as it is. A path in the home of
  // a user without one leads to nothing ("/nonexistent/…").
  std::string resolve(const std::string& path) const;
  // Puts the root in front, whatever the absolute path.
  std::string belowRoot(const std::string& path) const { return root + path; }
};

}  // namespace telvane
