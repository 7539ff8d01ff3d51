#include "tools/StorebagTool.h"

#include <CLI/CLI.hpp>

#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"
#include "platform/system/AppendFile.h"
#include "storebag/StorebagVerification.h"
#include "tools/StorebagEnvelope.h"
#include "tools/StorebagLint.h"

namespace telvane {
namespace {

constexpr int kFailure = 1;
constexpr int kWrongUsage = 2;
constexpr char kName[] = "telvane-storebag";

Error fault(const std::string& text) { return Error::withDescription("TelvaneStorebag", kFailure, text); }

std::string counted(size_t count, const char* what) {
  return std::to_string(count) + " " + what + (count == 1 ? "" : "s");
}

// Property lists hold more than JSON does; what JSON cannot show is shown as a property list.
Result<std::string> readableText(const Dictionary& bag) {
  Result<std::string> text = json::serialize(bag, json::Style::Pretty);
  if (text.has_value()) return *text + "\n";
  const Result<Data> xml = propertylist::serialize(bag, propertylist::Format::XML);
  if (xml.has_error()) return xml.error();
  return std::string(xml->view());
}

}  // namespace

int StorebagTool::run(int argc, const char* const* argv) {
  CLI::App app("Makes keys for storebags, signs bags, verifies and shows signed ones, and looks for mistakes in bags.",
               kName);
  app.set_version_flag("--version", "telvane-storebag " TELVANE_VERSION);
  app.require_subcommand(1);
  auto* keygen = app.add_subcommand("keygen", "make a key pair");
  keygen->add_option("--private-key", _privateKeyFile, "new PEM file of the signing key")->required();
  keygen->add_option("--public-key", _publicKeyFile, "DER file for the client bundle (publicKey.der)")->required();
  auto* sign = app.add_subcommand("sign", "sign a bag for the server");
  sign->add_option("--private-key", _privateKeyFile, "PEM file of the signing key")->required();
  sign->add_option("--input", _inputFile, "the bag, a property list or JSON")->required();
  sign->add_option("--output", _outputFile, "file for the signed envelope")->required();
  auto* verify = app.add_subcommand("verify", "check an envelope's signature");
  verify->add_option("--public-key", _publicKeyFile, "DER file of the public key")->required();
  verify->add_option("ENVELOPE", _envelopeFile, "the signed envelope")->required();
  auto* show = app.add_subcommand("show", "print the bag in an envelope, without believing it");
  show->add_option("ENVELOPE", _envelopeFile, "the signed envelope")->required();
  _explain.addTo(app);
  auto* lint = app.add_subcommand("lint", "name every mistake in a bag; exits 1 when one is an error");
  lint->add_option("BAG", _bagFile, "a bag, as a property list or JSON, or a signed envelope")->required();
  lint->footer(
      "One finding per line: severity, place, what is wrong and what to do.\n"
      "error: the bag does not do what it says. warning: it does, but that is probably not what was meant.\n"
      "Exits 0 without errors, 1 with errors or when the file cannot be read, 2 on wrong usage.");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error, _output, _errors);
    _errors << kName << ": " << error.what() << "; see telvane-storebag --help\n";
    return kWrongUsage;
  }
  Result<void> done = dispatch(app.get_subcommands().front()->get_name());
  // What was not printed was not told: a full disk behind the output must not look like a bag without mistakes.
  if (!done.has_error() && !_output.flush())
    done = fault("cannot write to standard output; see whether its disk is full");
  if (!done.has_error()) return _status;
  _errors << kName << ": " << done.error().description() << "\n";
  return kFailure;
}

Result<void> StorebagTool::dispatch(const std::string& command) {
  if (command == "keygen") return keygen();
  if (command == "sign") return sign();
  if (command == "verify") return verify();
  if (command == "lint") return lint();
  if (command == "explain") return _explain.run();
  return show();
}

Result<void> StorebagTool::keygen() {
  if (_files.modificationDate(_privateKeyFile).has_value()) {
    return fault(_privateKeyFile + " exists already; remove it, or name another file for the private key");
  }
  const Result<crypto::PrivateKey> key = crypto::PrivateKey::generate();
  if (key.has_error()) return key.error();
  Result<void> written = writeKeys(*key);
  // Half a pair is of no use, and would refuse the next attempt.
  if (written.has_error()) static_cast<void>(_files.remove(_privateKeyFile).has_error());
  return written;
}

Result<void> StorebagTool::writeKeys(const crypto::PrivateKey& key) {
  // Nobody but its owner may read a signing key.
  const Result<std::unique_ptr<AppendFile>> file = AppendFile::open(_files.resolve(_privateKeyFile));
  if (file.has_error()) return fault(_privateKeyFile + ": " + file.error().description());
  const Result<void> written = (*file)->append(key.pem().view());
  if (written.has_error()) return fault(_privateKeyFile + ": " + written.error().description());
  return _files.writeAtomically(_publicKeyFile, key.publicKeyDER());
}

Result<void> StorebagTool::sign() {
  const Result<Data> pem = readFile(_privateKeyFile);
  if (pem.has_error()) return pem.error();
  const Result<crypto::PrivateKey> key = crypto::PrivateKey::fromPEM(*pem);
  if (key.has_error()) return fault(_privateKeyFile + ": " + key.error().description());
  const Result<Data> text = readFile(_inputFile);
  if (text.has_error()) return text.error();
  const Result<Dictionary> bag = storebagenvelope::parseBag(*text);
  if (bag.has_error()) return fault(_inputFile + ": " + bag.error().description());
  if (!(*bag)[kStorebagVersion].isString()) {
    return fault(_inputFile + ": the bag has no text under \"version\"; give it one, devices report it");
  }
  const Result<Data> envelope = storebagenvelope::seal(*bag, *key);
  if (envelope.has_error()) return envelope.error();
  const Result<void> written = _files.writeAtomically(_outputFile, *envelope);
  if (written.has_value()) tellMistakes(*text);
  return written;
}

// A signed bag with mistakes may be meant, in a test; whom it surprises should hear of them before devices do.
void StorebagTool::tellMistakes(const Data& bag) {
  const Result<LintReport> report = StorebagLint::lintFile(bag, storebagenvelope::bagNameOfFile(_inputFile));
  const size_t errors = report.has_value() ? report->count(LintFinding::Severity::Error) : 0;
  if (errors == 0) return;
  _errors << kName << ": signed, but lint finds " << counted(errors, "error") << " in " << _inputFile
          << "; see telvane-storebag lint\n";
}

Result<void> StorebagTool::verify() {
  const Result<Data> der = readFile(_publicKeyFile);
  if (der.has_error()) return der.error();
  const std::optional<crypto::PublicKey> key = crypto::PublicKey::fromDER(*der);
  if (!key.has_value()) return fault(_publicKeyFile + " is no public RSA key in DER; make one with keygen");
  const Result<Data> envelope = readFile(_envelopeFile);
  if (envelope.has_error()) return envelope.error();
  const Result<storebagenvelope::Content> content = storebagenvelope::open(*envelope);
  if (content.has_error()) return fault(_envelopeFile + ": " + content.error().description());
  if (!verifyStorebagSignature(*key, content->bag, content->signature)) {
    return fault(_envelopeFile + ": the signature is not that of this key, or the bag was altered");
  }
  const Result<Dictionary> bag = storebagenvelope::parseSealedBag(*content);
  if (bag.has_error()) return fault(_envelopeFile + ": " + bag.error().description());
  _output << "the signature is good, version " << (*bag)[kStorebagVersion].text() << "\n";
  return {};
}

Result<void> StorebagTool::show() {
  const Result<Data> envelope = readFile(_envelopeFile);
  if (envelope.has_error()) return envelope.error();
  const Result<storebagenvelope::Content> content = storebagenvelope::open(*envelope);
  if (content.has_error()) return fault(_envelopeFile + ": " + content.error().description());
  const Result<Dictionary> bag = storebagenvelope::parseSealedBag(*content);
  if (bag.has_error()) return fault(_envelopeFile + ": " + bag.error().description());
  const Result<std::string> text = readableText(*bag);
  if (text.has_error()) return text.error();
  _output << *text;
  return {};
}

Result<void> StorebagTool::lint() {
  constexpr char kAdvice[] = "; name a property list, JSON or a signed envelope";
  const Result<Data> bytes = readFile(_bagFile);
  if (bytes.has_error()) return fault(bytes.error().description() + kAdvice);
  const Result<LintReport> report = StorebagLint::lintFile(*bytes, storebagenvelope::bagNameOfFile(_bagFile));
  if (report.has_error()) return fault(_bagFile + ": " + report.error().description() + kAdvice);
  for (const LintFinding& finding : report->findings()) {
    const bool isError = finding.severity == LintFinding::Severity::Error;
    _output << (isError ? "error: " : "warning: ") << finding.path << ": " << finding.text << "\n";
  }
  const size_t errors = report->count(LintFinding::Severity::Error);
  _output << counted(errors, "error") << ", " << counted(report->count(LintFinding::Severity::Warning), "warning")
          << "\n";
  if (errors > 0) _status = kFailure;
  return {};
}

Result<Data> StorebagTool::readFile(const std::string& path) const {
  return _files.read(path, storebagenvelope::kMaximumFileBytes);
}

}  // namespace telvane
