#include "tests/soak/WireScript.h"

#include <stdexcept>

#include "platform/PropertyList.h"

namespace telvane::testing {
namespace {

Dictionary infos(Dictionary sessionInfo, Value userInfo) {
  Dictionary arguments;
  arguments.set(WireScript::kSessionInfo, std::move(sessionInfo));
  if (userInfo.isPresent()) arguments.set(WireScript::kUserInfo, std::move(userInfo));
  return arguments;
}

}  // namespace

WireScript& WireScript::add(const char* name, Dictionary arguments) {
  arguments.set(kStep, name);
  _steps.append(std::move(arguments));
  return *this;
}

WireScript& WireScript::open(Dictionary sessionInfo, Dictionary userInfo) {
  return add("open", infos(std::move(sessionInfo), std::move(userInfo)));
}

WireScript& WireScript::tellAgain(Dictionary sessionInfo, Dictionary userInfo) {
  return add("tellAgain", infos(std::move(sessionInfo), std::move(userInfo)));
}

WireScript& WireScript::configure() { return add("configure"); }

WireScript& WireScript::send(int category, Dictionary payload) {
  Dictionary arguments;
  arguments.set(kCategory, category);
  arguments.set(kPayload, std::move(payload));
  return add("send", std::move(arguments));
}

WireScript& WireScript::flush() { return add("flush"); }

WireScript& WireScript::sendOneShot(Dictionary sessionInfo, Value userInfo, int category, Dictionary payload) {
  Dictionary arguments = infos(std::move(sessionInfo), std::move(userInfo));
  arguments.set(kCategory, category);
  arguments.set(kPayload, std::move(payload));
  return add("oneShot", std::move(arguments));
}

WireScript& WireScript::wait() { return add("wait"); }

std::string WireScript::text() const {
  return std::string(propertylist::serialize(_steps, propertylist::Format::Binary).value().view());
}

Array WireScript::parse(const std::string& text) {
  const Value steps = propertylist::parse(Data::copyOf(text)).value();
  if (!steps.isArray()) throw std::runtime_error("a script is a list of steps");
  return *steps.array();
}

}  // namespace telvane::testing
