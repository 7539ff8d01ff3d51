#include "tools/MessageOptions.h"

#include <charconv>
#include <vector>

#include "interfaces/SessionKeys.h"
#include "platform/JSON.h"

namespace telvane {
namespace {

constexpr int kClientVersion = 1;

Error fault(const std::string& text) { return Error::withDescription("TelvaneControl", 1, text); }

// The dictionary of a JSON object; an empty one for empty text.
Result<Dictionary> parseObject(const std::string& text, const char* option) {
  if (text.empty()) return Dictionary();
  const Result<Value> parsed = json::parse(text);
  if (parsed.has_error()) return fault(std::string(option) + " is no JSON: " + parsed.error().description());
  const Dictionary* dictionary = parsed->dictionary();
  if (dictionary == nullptr) return fault(std::string(option) + " wants a JSON object, as in '{\"key\": 1}'");
  return *dictionary;
}

}  // namespace

Result<Value> MessageOptions::makeUserInfo() const {
  Dictionary info;
  if (!clientName.empty()) info.set(kTelvaneUserInfoClientName, clientName);
  if (!serviceName.empty()) info.set(kTelvaneUserInfoServiceName, serviceName);
  const Result<Dictionary> given = parseObject(userInfo, "--user-info");
  if (given.has_error()) return given.error();
  info.addEntriesFrom(*given);
  return info.empty() ? Value() : Value(std::move(info));
}

Result<Dictionary> MessageOptions::makeSessionInfo(int64_t sessionID) const {
  const bool hasUserInfo = !clientName.empty() || !serviceName.empty() || !userInfo.empty();
  Dictionary info{{kTelvaneSessionInfoClientType, clientType},
                  {kTelvaneSessionInfoClientVersion, kClientVersion},
                  {kTelvaneSessionInfoSessionID, sessionID},
                  {kTelvaneSessionInfoBatchEvent, isFlushing},
                  {kTelvaneSessionInfoRequireUserInfo, hasUserInfo}};
  const Result<Dictionary> given = parseObject(sessionInfo, "--session-info");
  if (given.has_error()) return given.error();
  info.addEntriesFrom(*given);
  return info;
}

Result<Dictionary> MessageOptions::makeMessage() const {
  Dictionary message{{kTelvaneMessageParametersCategory, category},
                     {kTelvaneMessageParametersType, type},
                     {kTelvaneMessageParametersFlag, flag}};
  const Result<Dictionary> fields = parseObject(payload, "--payload");
  if (fields.has_error()) return fields.error();
  if (!payload.empty()) message.set(kTelvaneMessageParametersPayload, *fields);
  return message;
}

Result<Value> MessageOptions::makeDigestKey() const {
  if (digestKey.empty()) return Value();
  std::vector<uint8_t> bytes(digestKey.size() / 2);
  bool isHexadecimal = digestKey.size() % 2 == 0;
  for (size_t i = 0; i < bytes.size() && isHexadecimal; ++i) {
    const char* digits = digestKey.data() + 2 * i;
    isHexadecimal = std::from_chars(digits, digits + 2, bytes[i], 16).ptr == digits + 2;
  }
  if (!isHexadecimal) return fault("--digest-key wants pairs of hexadecimal digits");
  return Value(Data(std::move(bytes)));
}

}  // namespace telvane
