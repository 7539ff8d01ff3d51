#include "tools/ControlTool.h"

#include <CLI/CLI.hpp>

#include "interfaces/ClientTypes.h"
#include "tools/DaemonCommands.h"
#include "tools/SettingsCommands.h"

namespace telvane {
namespace {

constexpr int kFailure = 1;
constexpr int kWrongUsage = 2;

}  // namespace

int ControlTool::run(int argc, const char* const* argv) {
  CLI::App app("Reports by hand, shows a daemon's status, and changes this user's settings.", "telvanectl");
  app.set_version_flag("--version", "telvanectl " TELVANE_VERSION);
  app.require_subcommand(1);
  addReporting(app);
  addSettings(app);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error, _output, _errors);
    _printer.error(std::string(error.what()) + "; see telvanectl --help");
    return kWrongUsage;
  }
  const Result<void> done = perform(*app.get_subcommands().front());
  if (!done.has_error() && _printer.hasPrinted()) return 0;
  _printer.error(done.has_error() ? done.error().description()
                                  : "cannot write to standard output; see whether its disk is full");
  return kFailure;
}

void ControlTool::addReporting(CLI::App& app) {
  auto* send = app.add_subcommand("send", "open a session, configure it, and send messages");
  addMessageOptions(*send);
  send->add_option("--flag", _message.flag, "1 at once, 2 promoting, 3 both");
  send->add_flag("--flush", _message.isFlushing, "batch the messages, and flush them at the end");
  auto* oneShot = app.add_subcommand("one-shot", "send messages without a session");
  addMessageOptions(*oneShot);
  auto* upload = app.add_subcommand("upload", "open a session, configure it, and upload a file");
  addMessageOptions(*upload);
  upload->add_option("FILE", _message.uploadFile, "the file")->required();
  for (CLI::App* command : {send, oneShot}) {
    command->get_option("--category")->required();
    command->get_option("--type")->required();
  }
  auto* status = app.add_subcommand("status", "show what the daemon is and holds");
  status->add_flag("--json", _isJSON, "as JSON");
}

void ControlTool::addMessageOptions(CLI::App& command) {
  const std::string types = fmt::format("client type, {} to {}", kFirstClientType, kLastClientType);
  command.add_option("--client-type", _message.clientType, types)->required();
  command.add_option("--category", _message.category, "category of the message, from 1");
  command.add_option("--type", _message.type, "type of the message");
  command.add_option("--client-name", _message.clientName, "the reporting client");
  command.add_option("--service-name", _message.serviceName, "the service within the client");
  command.add_option("--payload", _message.payload, "the message's fields, a JSON object");
  command.add_option("--count", _message.count, "how many times to send it")->check(CLI::Range(1, 1000000));
  command.add_option("--session-info", _message.sessionInfo, "JSON object laid over the session info");
  command.add_option("--user-info", _message.userInfo, "JSON object laid over the user info");
  command.add_option("--digest-key", _message.digestKey, "key of the digest of each request, in hexadecimal");
}

void ControlTool::addSettings(CLI::App& app) {
  auto* defaults = app.add_subcommand("defaults", "show and change settings")->require_subcommand(1);
  auto* read = defaults->add_subcommand("read", "print a suite, or one key of it");
  auto* write = defaults->add_subcommand("write", "set a key; the value is JSON, or text when it is none");
  auto* remove = defaults->add_subcommand("delete", "remove a key, or all that this user has set in a suite");
  for (CLI::App* command : {read, write, remove}) {
    command->add_option("SUITE", _suite, "for example com.corvex.telvane")->required();
    command->add_option("KEY", _key, "the key")->required(command == write);
  }
  write->add_option("VALUE", _value, "the value")->required();
  write->add_flag("--string", _isText, "take the value as text, whatever it looks like");
  auto* consent = app.add_subcommand("consent", "this user's word on diagnostics")->require_subcommand(1);
  consent->add_subcommand("show", "print on or off");
  consent->add_subcommand("on", "agree to reporting");
  consent->add_subcommand("off", "do not agree");
}

Result<void> ControlTool::perform(const CLI::App& command) {
  const std::string& name = command.get_name();
  if (name == "defaults") return performDefaults(command.get_subcommands().front()->get_name());
  if (name == "consent") {
    SettingsCommands settings(_context.platform().userDefaults, _printer);
    const std::string& action = command.get_subcommands().front()->get_name();
    return action == "show" ? settings.showConsent() : settings.setConsent(action == "on");
  }
  DaemonCommands daemon(_context, _printer);
  if (name == "send") return daemon.send(_message);
  if (name == "one-shot") return daemon.oneShot(_message);
  if (name == "upload") return daemon.upload(_message);
  using Form = DaemonCommands::StatusForm;
  return daemon.status(_isJSON ? Form::JSON : Form::Readable);
}

Result<void> ControlTool::performDefaults(const std::string& action) {
  SettingsCommands settings(_context.platform().userDefaults, _printer);
  if (action == "read") return settings.read(_suite, _key);
  if (action == "delete") return settings.remove(_suite, _key);
  using Form = SettingsCommands::ValueForm;
  return settings.write(_suite, _key, _value, _isText ? Form::Text : Form::JSONOrText);
}

}  // namespace telvane
