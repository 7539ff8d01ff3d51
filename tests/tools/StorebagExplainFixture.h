#pragma once

#include <gmock/gmock.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/backends/BackendFixture.h"
#include "tests/support/ScratchFolder.h"
#include "tools/StorebagTool.h"

namespace telvane::testing {

using Arguments = std::vector<std::string>;

// Runs the program's explain on bags of the test, beside the real backend of the same bag and device.
class StorebagExplainFixture : public BackendFixture {
 protected:
  // The device and the session of the fixture.
  static Arguments fixtureCase() {
    return {"--client-type", "6",       "--client-name",    "player",     "--service-name",      "StreamMediaPlayer",
            "--country",     "US",      "--product-family", "TelvaneBox", "--hardware",          "Box2,1",
            "--consent",     "on",      "--batch-events",   "on",         "--framework-version", "8.1",
            "--environment", "release", "--sampling-factor"};
  }
  // Runs the program; "@bag" is the file that givenBag wrote.
  int run(Arguments arguments) {
    _output.str("");
    _errors.str("");
    arguments.insert(arguments.begin(), "telvane-storebag");
    std::vector<const char*> pointers;
    for (std::string& argument : arguments) {
      if (argument.starts_with("@")) argument = _scratch.at(argument.substr(1));
      pointers.push_back(argument.c_str());
    }
    return StorebagTool(_files, _output, _errors).run(static_cast<int>(pointers.size()), pointers.data());
  }
  std::string output() const { return _output.str(); }
  std::string errors() const { return _errors.str(); }
  void givenBag(const Dictionary& bag) {
    _scratch.write("bag", propertylist::serialize(bag, propertylist::Format::Binary).value().view());
  }
  Dictionary bag() const {
    Dictionary section;
    section.set(kName, profile());
    return {{kStorebagVersion, "7"}, {kEnvironmentRelease, section}};
  }
  // Explains the bag on the fixture's device, with these options laid over its own.
  Dictionary explain(double factor = 0, const Arguments& options = {}) {
    Arguments arguments = fixtureCase();
    arguments.push_back(fmt::format("{}", factor));
    for (size_t i = 0; i + 1 < options.size(); i += 2) replace(arguments, options[i], options[i + 1]);
    arguments.insert(arguments.begin(), {"explain", "@bag", "--json"});
    EXPECT_EQ(run(arguments), 0) << errors();
    const Result<Value> parsed = json::parse(output());
    if (parsed.has_error() || !parsed->isDictionary()) {
      ADD_FAILURE() << "the output is no JSON object: " << output();
      return {};
    }
    return *parsed->dictionary();
  }
  static void replace(Arguments& arguments, const std::string& option, const std::string& value) {
    const auto found = std::find(arguments.begin(), arguments.end(), option);
    if (found != arguments.end()) {
      *(found + 1) = value;
    } else {
      arguments.insert(arguments.end(), {option, value});
    }
  }
  // The only backend of the explained bag.
  Dictionary explainBackend(double factor = 0, const Arguments& options = {}) {
    givenBag(bag());
    const Dictionary explained = explain(factor, options);
    const Array* backends = explained["backends"].array();
    if (backends == nullptr || backends->size() != 1) {
      ADD_FAILURE() << "one backend was to be explained: " << output();
      return {};
    }
    return *(*backends)[0].dictionary();
  }
  static std::string text(const Dictionary& fields, const char* key) { return std::string(fields[key].text()); }
  // The reason of the state, as "step: word".
  static std::string because(const Dictionary& backend) {
    const Dictionary* reason = backend["because"].dictionary();
    return reason != nullptr ? text(*reason, "gate") + ": " + text(*reason, "outcome") : "nothing";
  }
  static std::vector<std::string> texts(const Value& list) {
    std::vector<std::string> texts;
    for (const Value& element : *list.array()) texts.emplace_back(element.text());
    return texts;
  }
  static const Dictionary& only(const Dictionary& explained) {
    return *(*explained["backends"].array())[0].dictionary();
  }
  std::vector<std::string> logged() {
    std::vector<std::string> lines;
    for (const LogLine& line : log().lines()) {
      if (line.level != LogLevel::Info) lines.push_back(line.message);
    }
    return withoutIdentifiers(lines);
  }
  // Lines without those that tell the device's identifiers, which explain does not know.
  static std::vector<std::string> withoutIdentifiers(std::vector<std::string> lines) {
    std::erase_if(lines, [](const std::string& line) { return line.starts_with("getPersistentIdentifierFor"); });
    return lines;
  }
  // Explains the bag, makes a real backend of it with this sampling factor, and compares state, batching and log.
  void expectTheSame(const Dictionary& explained, double factor) {
    givenSamplingFactor(factor);
    static_cast<void>(context());
    log().clear();
    makeUndecidedBackend();
    const uint32_t state = backend().updateState();
    EXPECT_EQ(explained["stateNumber"], Value(state)) << output();
    EXPECT_EQ(explained["batchesEvents"], Value(backend().batchEvents()));
    EXPECT_EQ(withoutIdentifiers(texts(explained["log"])), logged());
  }

  ScratchFolder _scratch;
  PosixFileSystem _files{Paths{}};
  std::ostringstream _output;
  std::ostringstream _errors;
};

}  // namespace telvane::testing
