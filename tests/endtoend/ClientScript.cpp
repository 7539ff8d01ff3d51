#include "tests/endtoend/ClientScript.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <stdexcept>

#include "platform/PropertyList.h"

namespace telvane::testing {
namespace {

// Stand-ins for what a property list cannot hold: a dictionary with one of these keys alone.
constexpr char kText[] = "$text";        // the bytes of a text
constexpr char kReal[] = "$real";        // the bytes of a number
constexpr char kEntries[] = "$entries";  // pairs of a key's bytes and a value

bool isPlain(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) { return c >= ' ' && c <= '~'; });
}

bool hasPlainKeys(const Dictionary& dictionary) {
  return std::all_of(dictionary.begin(), dictionary.end(),
                     [](const DictionaryEntry& entry) { return isPlain(entry.key) && !entry.key.empty(); });
}

Dictionary standIn(const char* key, Value value) {
  Dictionary result;
  result.set(key, std::move(value));
  return result;
}

Value encoded(const Value& value);

Value encodedReal(double number) {
  if (std::isfinite(number)) return number;
  return standIn(kReal, Data::copyOf(std::string_view(reinterpret_cast<const char*>(&number), sizeof number)));
}

Value encodedArray(const Array& array) {
  Array result;
  for (const Value& element : array) result.append(encoded(element));
  return result;
}

Value encodedDictionary(const Dictionary& dictionary) {
  Dictionary result;
  Array pairs;
  const bool isPlainOne = hasPlainKeys(dictionary);
  for (const DictionaryEntry& entry : dictionary) {
    if (isPlainOne) {
      result.set(entry.key, encoded(entry.value));
    } else {
      pairs.append(Array{Data::copyOf(entry.key.view()), encoded(entry.value)});
    }
  }
  return isPlainOne ? Value(result) : Value(standIn(kEntries, pairs));
}

Value encoded(const Value& value) {
  if (value.isString() && !isPlain(value.text())) return standIn(kText, Data::copyOf(value.text()));
  if (value.kind() == Value::Kind::Real) return encodedReal(*value.real());
  if (value.isArray()) return encodedArray(*value.array());
  if (value.isDictionary()) return encodedDictionary(*value.dictionary());
  return value;
}

Value decoded(const Value& value);

Value decodedReal(const Data& bytes) {
  double number = 0;
  if (bytes.size() == sizeof number) std::memcpy(&number, bytes.bytes(), sizeof number);
  return number;
}

Value decodedEntries(const Array& pairs) {
  Dictionary result;
  for (const Value& pair : pairs) {
    const Array& both = *pair.array();
    result.set(String(both[0].data()->view()), decoded(both[1]));
  }
  return result;
}

Value decodedDictionary(const Dictionary& dictionary) {
  if (dictionary.size() == 1) {
    if (const Data* bytes = dictionary[kText].data()) return bytes->view();
    if (const Data* bytes = dictionary[kReal].data()) return decodedReal(*bytes);
    if (const Array* pairs = dictionary[kEntries].array()) return decodedEntries(*pairs);
  }
  Dictionary result;
  for (const DictionaryEntry& entry : dictionary) result.set(entry.key, decoded(entry.value));
  return result;
}

Value decoded(const Value& value) {
  if (value.isDictionary()) return decodedDictionary(*value.dictionary());
  if (!value.isArray()) return value;
  Array result;
  for (const Value& element : *value.array()) result.append(decoded(element));
  return result;
}

}  // namespace

ClientScript& ClientScript::add(const char* name, Dictionary arguments) {
  arguments.set(kStep, name);
  _steps.append(std::move(arguments));
  return *this;
}

ClientScript& ClientScript::open(Dictionary sessionInfo, Value userInfo) {
  Dictionary arguments;
  arguments.set(kSessionInfo, std::move(sessionInfo));
  arguments.set(kUserInfo, std::move(userInfo));
  return add("open", std::move(arguments));
}

ClientScript& ClientScript::openAggregating(Dictionary sessionInfo, Value userInfo, const char* reaction) {
  Dictionary arguments;
  arguments.set(kSessionInfo, std::move(sessionInfo));
  arguments.set(kUserInfo, std::move(userInfo));
  arguments.set(kReaction, reaction);
  return add("openAggregating", std::move(arguments));
}

ClientScript& ClientScript::letGo() { return add("letGo"); }

ClientScript& ClientScript::configure() { return add("configure"); }

ClientScript& ClientScript::configure(std::chrono::seconds patience) {
  return add("configure", {{kSeconds, static_cast<int64_t>(patience.count())}});
}

ClientScript& ClientScript::fetchStates(Value userInfo) {
  Dictionary arguments;
  arguments.set(kUserInfo, std::move(userInfo));
  return add("fetchStates", std::move(arguments));
}

ClientScript& ClientScript::send(uint16_t category, uint16_t type, Value payload, uint32_t flag) {
  Dictionary arguments;
  arguments.set(kCategory, category);
  arguments.set(kType, type);
  arguments.set(kPayload, std::move(payload));
  arguments.set(kFlag, flag);
  return add("send", std::move(arguments));
}

ClientScript& ClientScript::sendMany(uint16_t category, const std::string& from, int count, int first, int textSize) {
  Dictionary arguments;
  arguments.set(kCategory, category);
  arguments.set(kFrom, from);
  arguments.set(kCount, count);
  arguments.set(kFirst, first);
  arguments.set(kTextSize, textSize);
  return add("sendMany", std::move(arguments));
}

ClientScript& ClientScript::flush() { return add("flush"); }

ClientScript& ClientScript::uploadLogData(Array logData) {
  Dictionary arguments;
  arguments.set(kPayload, std::move(logData));
  return add("uploadLogData", std::move(arguments));
}

ClientScript& ClientScript::upload(const std::string& path) {
  Dictionary arguments;
  arguments.set(kPath, path);
  return add("upload", std::move(arguments));
}

ClientScript& ClientScript::share(Dictionary sharedData) {
  Dictionary arguments;
  arguments.set(kPayload, std::move(sharedData));
  return add("share", std::move(arguments));
}

ClientScript& ClientScript::setDigestKey(const std::string& key, int32_t algorithm) {
  Dictionary arguments;
  arguments.set(kKey, Data::copyOf(key));
  arguments.set(kAlgorithm, algorithm);
  return add("setDigestKey", std::move(arguments));
}

ClientScript& ClientScript::sendOneShot(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type,
                                        Value payload) {
  Dictionary arguments;
  arguments.set(kSessionInfo, std::move(sessionInfo));
  arguments.set(kUserInfo, std::move(userInfo));
  arguments.set(kCategory, category);
  arguments.set(kType, type);
  arguments.set(kPayload, std::move(payload));
  return add("oneShot", std::move(arguments));
}

ClientScript& ClientScript::wait() { return add("wait"); }

std::string ClientScript::text() const {
  return std::string(propertylist::serialize(encoded(_steps), propertylist::Format::Binary).value().view());
}

Array ClientScript::parse(const std::string& text) {
  const Value steps = propertylist::parse(Data::copyOf(text)).value();
  if (!steps.isArray()) throw std::runtime_error("a script is a list of steps");
  return *decoded(steps).array();
}

}  // namespace telvane::testing
