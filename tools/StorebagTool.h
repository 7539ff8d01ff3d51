#pragma once

#include <ostream>
#include <string>

#include "foundation/Error.h"
#include "platform/Crypto.h"
#include "platform/FileSystem.h"
#include "tools/StorebagExplain.h"

namespace telvane {

// The program telvane-storebag: makes keys, signs bags, verifies and shows envelopes, explains what bags do and names
// the mistakes in them. Made for one command line.
class StorebagTool {
 public:
  // files and streams outlive the tool. Results go to output, faults as one line each to errors.
  StorebagTool(FileSystem& files, std::ostream& output, std::ostream& errors)
      : _files(files), _output(output), _errors(errors), _explain(files, output) {}

  // Does what the command line says. Returns the exit status: 0, 1 on failure, 2 on wrong usage.
  int run(int argc, const char* const* argv);

 private:
  Result<void> keygen();
  Result<void> writeKeys(const crypto::PrivateKey& key);
  Result<void> sign();
  void tellMistakes(const Data& bag);
  Result<void> verify();
  Result<void> show();
  Result<void> lint();
  Result<void> dispatch(const std::string& command);
  Result<Data> readFile(const std::string& path) const;

  FileSystem& _files;
  std::ostream& _output;
  std::ostream& _errors;
  StorebagExplain _explain;
  int _status = 0;  // what a command that succeeded exits with
  // The command's arguments, as far as it has them.
  std::string _privateKeyFile;
  std::string _publicKeyFile;
  std::string _inputFile;
  std::string _outputFile;
  std::string _envelopeFile;
  std::string _bagFile;
};

}  // namespace telvane
