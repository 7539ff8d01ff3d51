#pragma once

#include <ostream>

#include "client/ClientContext.h"
#include "tools/MessageOptions.h"
#include "tools/Printer.h"

namespace CLI {  // NOLINT(readability-identifier-naming): the library's
class App;
}

namespace telvane {

// The program telvanectl: reports by hand, shows a daemon's status, and changes this user's settings. Made for one
// command line.
class ControlTool {
 public:
  // The context outlives the tool and what is then still under way.
  ControlTool(ClientContext& context, std::ostream& output, std::ostream& errors)
      : _context(context), _output(output), _errors(errors), _printer("telvanectl", output, errors) {}

  // Does what the command line says. Returns the exit status: 0, 1 on failure, 2 on wrong usage.
  int run(int argc, const char* const* argv);

 private:
  void addReporting(CLI::App& app);
  void addMessageOptions(CLI::App& command);
  void addSettings(CLI::App& app);
  Result<void> perform(const CLI::App& command);
  Result<void> performDefaults(const std::string& action);

  ClientContext& _context;
  std::ostream& _output;
  std::ostream& _errors;
  Printer _printer;
  // The command's arguments, as far as it has them.
  MessageOptions _message;
  bool _isJSON = false;
  bool _isText = false;
  std::string _suite;
  std::string _key;
  std::string _value;
};

}  // namespace telvane
