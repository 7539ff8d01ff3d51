#pragma once

#include <ostream>
#include <string>
#include <vector>

#include "foundation/Error.h"
#include "platform/FileSystem.h"
#include "tools/StorebagExplainReport.h"

namespace CLI {  // NOLINT(readability-identifier-naming): the library's
class App;
class Option;
}  // namespace CLI

namespace telvane {

// The command telvane-storebag explain: prints, step by step, why each backend of a bag would be in its state on a
// device that the command line describes. The daemon's own code decides. Made for one command line.
class StorebagExplain {
 public:
  // Both outlive it.
  StorebagExplain(FileSystem& files, std::ostream& output) : _files(files), _output(output) {}

  // Adds the command with its options, whose values are written here when the command line is parsed.
  void addTo(CLI::App& app);
  // REQUIRES: the command line was parsed. Fails when a file cannot be read, or holds no bag.
  Result<void> run();

 private:
  void addSessionOptions(CLI::App& command);
  void addDeviceOptions(CLI::App& command);
  // An option that stands in the output as assumed when it is not given.
  template <class T>
  CLI::Option* addAssumed(CLI::App& command, const std::string& name, T& value, const std::string& description);
  Result<Dictionary> readDefaults() const;
  // Puts the texts of the command line in their places, and names what was assumed.
  void completeCase();
  Dictionary sessionInfo() const;
  Value userInfo() const;

  FileSystem& _files;
  std::ostream& _output;
  StorebagExplainReport _report;
  // The command line, as far as it is not in the report.
  std::vector<CLI::Option*> _assumable;
  std::string _consent = "on";
  std::string _requiresUserInfo = "on";
  std::string _batchesEvents = "off";
  double _samplingFactor = 0;
  std::string _defaultsFile;
  bool _isJSON = false;
  bool _showsLog = false;
};

}  // namespace telvane
