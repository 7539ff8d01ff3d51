#include "tools/StorebagExplain.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cmath>

#include "interfaces/ClientTypes.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tools/StorebagEnvelope.h"
#include "tools/StorebagExplainJSON.h"
#include "tools/StorebagExplainPlatform.h"
#include "tools/StorebagExplainText.h"

namespace telvane {
namespace {

constexpr char kCommand[] = "explain";
constexpr char kExampleClient[] = "example";
constexpr int kClientVersion = 1;
constexpr double kSamplingSteps = 10000;
constexpr double kRounding = 1e-9;  // what a decimal fraction may lack of its step

constexpr char kAfterword[] =
    "Options that are not given are assumed, and the output names them. An empty text means that there is none: a\n"
    "device without a country, a session without a client name. BAG is a property list or JSON as its author wrote "
    "it,\n"
    "or a signed envelope, whose signature is not checked here (verify does). Settings are not read from this machine\n"
    "and nothing is written or sent. Exits with 0 when it could explain, whatever the states are.";

Error fault(const std::string& text) { return Error::withDescription("TelvaneStorebag", 1, text); }

// Not-a-number is no share, though no comparison would find it too small or too large.
std::string checkShare(const std::string& text) {
  double share = -1;
  if (!CLI::detail::lexical_cast(text, share) || !(share >= 0 && share <= 1)) return text + " is not from 0 to 1";
  return {};
}

std::string checkVersion(const std::string& text) {
  const bool isVersion =
      std::all_of(text.begin(), text.end(), [](char c) { return c == '.' || (c >= '0' && c <= '9'); });
  return isVersion ? std::string() : text + " is no version of the form 8.1.2";
}

// A device draws whole steps, the last one before 1 at most.
double drawnFactor(double asked) {
  return std::min(std::floor(asked * kSamplingSteps + kRounding), kSamplingSteps - 1) / kSamplingSteps;
}

CLI::IsMember onOrOff() { return CLI::IsMember({"on", "off"}); }

}  // namespace

template <class T>
CLI::Option* StorebagExplain::addAssumed(CLI::App& command, const std::string& name, T& value,
                                         const std::string& description) {
  CLI::Option* option = command.add_option(name, value, description)->capture_default_str();
  _assumable.push_back(option);
  return option;
}

void StorebagExplain::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand(kCommand, "say why each backend of a bag would be in its state");
  command->add_option("BAG", _report.file, "the bag, or a signed envelope")->required();
  addSessionOptions(*command);
  addDeviceOptions(*command);
  command->add_option("--defaults", _defaultsFile,
                      "the user's settings (suite com.corvex.telvane), a property list or JSON");
  command->add_flag("--log", _showsLog, "show the lines that the daemon would log, too");
  command->add_flag("--json", _isJSON, "as JSON");
  command->footer(kAfterword);
}

void StorebagExplain::addSessionOptions(CLI::App& command) {
  StorebagExplainCase& situation = _report.situation;
  addAssumed(command, "--client-type", situation.clientType, "client type of the session")
      ->check(CLI::Range(kFirstClientType, kLastClientType));
  situation.clientName = kExampleClient;
  addAssumed(command, "--client-name", situation.clientName, "the reporting client");
  addAssumed(command, "--service-name", situation.serviceName, "the service within the client");
  addAssumed(command, "--require-user-info", _requiresUserInfo, "whether the session needs user info (names) to report")
      ->check(onOrOff());
  addAssumed(command, "--batch-events", _batchesEvents, "whether the session asks for batching")->check(onOrOff());
}

void StorebagExplain::addDeviceOptions(CLI::App& command) {
  StorebagExplainCase& situation = _report.situation;
  addAssumed(command, "--country", situation.country, "country code that the device is set to");
  addAssumed(command, "--product-family", situation.productFamily, "product family (device answer DeviceName)");
  addAssumed(command, "--hardware", situation.hardware, "hardware type (device answer ProductType)");
  addAssumed(command, "--framework-version", situation.frameworkVersion, "version of the client library")
      ->check(CLI::Validator(checkVersion, "VERSION"));
  addAssumed(command, "--consent", _consent, "the user's word on diagnostics")->check(onOrOff());
  addAssumed(command, "--sampling-factor", _samplingFactor, "the device's draw, from 0 to 1, in steps of 0.0001")
      ->check(CLI::Validator(checkShare, "SHARE"));
  command
      .add_option("--environment", situation.environment,
                  "section of the bag; when not given: release, corvex_internal with --internal")
      ->check(CLI::IsMember({std::string(kEnvironmentDevelopment.view()), std::string(kEnvironmentInternal.view()),
                             std::string(kEnvironmentSeed.view()), std::string(kEnvironmentRelease.view())}));
  command.add_flag("--internal", situation.isInternal, "an internal build");
}

void StorebagExplain::completeCase() {
  StorebagExplainCase& situation = _report.situation;
  const auto isGiven = [this](const std::string& name) {
    return std::any_of(_assumable.begin(), _assumable.end(), [&name](const CLI::Option* option) {
      return option->get_name() == name && option->count() != 0;
    });
  };
  // Who names a service alone means a session that has only that.
  if (isGiven("--service-name") && !isGiven("--client-name")) situation.clientName.clear();
  situation.hasConsent = _consent == "on";
  situation.requiresUserInfo = _requiresUserInfo == "on";
  situation.batchesEvents = _batchesEvents == "on";
  situation.samplingFactor = drawnFactor(_samplingFactor);
  for (const CLI::Option* option : _assumable) {
    if (option->count() != 0) continue;
    const bool isEmptyName = option->get_name() == "--client-name" && situation.clientName.empty();
    const std::string assumed = isEmptyName ? std::string() : option->get_default_str();
    _report.assumed.push_back(option->get_name() + " " + (assumed.empty() ? "''" : assumed));
  }
}

Result<Dictionary> StorebagExplain::readDefaults() const {
  if (_defaultsFile.empty()) return Dictionary();
  const Result<Data> bytes = _files.read(_defaultsFile, storebagenvelope::kMaximumFileBytes);
  if (bytes.has_error()) return bytes.error();
  Result<Dictionary> settings = storebagenvelope::parseBag(*bytes);
  if (settings.has_error())
    return fault(_defaultsFile + " holds no settings, a property list or JSON with a dictionary");
  return settings;
}

Dictionary StorebagExplain::sessionInfo() const {
  const StorebagExplainCase& situation = _report.situation;
  return {{kTelvaneSessionInfoClientType, situation.clientType},
          {kTelvaneSessionInfoClientVersion, kClientVersion},
          {kTelvaneSessionInfoSessionID, 1},
          {kTelvaneSessionInfoBatchEvent, situation.batchesEvents},
          {kTelvaneSessionInfoRequireUserInfo, situation.requiresUserInfo}};
}

Value StorebagExplain::userInfo() const {
  Dictionary info;
  if (!_report.situation.clientName.empty()) info.set(kTelvaneUserInfoClientName, _report.situation.clientName);
  if (!_report.situation.serviceName.empty()) info.set(kTelvaneUserInfoServiceName, _report.situation.serviceName);
  return info.empty() ? Value() : Value(std::move(info));
}

Result<void> StorebagExplain::run() {
  completeCase();
  Result<Dictionary> settings = readDefaults();
  if (settings.has_error()) return settings.error();
  _report.situation.defaults = std::move(*settings);
  const Result<Data> bytes = _files.read(_report.file, storebagenvelope::kMaximumFileBytes);
  if (bytes.has_error()) return bytes.error();
  const Result<storebagenvelope::FileContent> content = storebagenvelope::parseFile(*bytes);
  if (content.has_error()) return fault(_report.file + ": " + content.error().description());
  _report.isSigned = content->isSigned;
  StorebagExplainPlatform device(_report.situation);
  _report.explanation = explainStorebag(device.platform(), device.log(), content->bag, sessionInfo(), userInfo());
  if (!_isJSON) {
    _output << explanationText(_report, _showsLog ? ExplainedLog::Shown : ExplainedLog::Hidden);
    return {};
  }
  const Result<std::string> text = json::serialize(explanationDictionary(_report), json::Style::Pretty);
  if (text.has_error()) return text.error();
  _output << *text << "\n";
  return {};
}

}  // namespace telvane
