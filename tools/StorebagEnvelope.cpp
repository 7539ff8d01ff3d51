#include "tools/StorebagEnvelope.h"

#include <string_view>

#include "foundation/Base64.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"

namespace telvane::storebagenvelope {
namespace {

constexpr char kDomain[] = "TelvaneStorebag";

constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";

Error fault(const std::string& text) { return Error::withDescription(kDomain, 1, text); }

bool looksLikeJSON(std::string_view text) {
  const size_t first = text.find_first_not_of(" \t\r\n");
  return first != std::string_view::npos && (text[first] == '{' || text[first] == '[');
}

std::string base64(const Data& data) { return base64Encode({data.bytes(), data.size()}); }

Result<Data> decodedEntry(const Dictionary& envelope, const Key& key) {
  const Value& text = envelope[key];
  if (!text.isString()) return fault("the envelope has no text under \"" + std::string(key.view()) + "\"");
  std::optional<Data> decoded = base64DecodeIgnoringUnknownCharacters(text.text());
  if (!decoded.has_value()) return fault("\"" + std::string(key.view()) + "\" in the envelope is no base64");
  return std::move(*decoded);
}

Result<Dictionary> dictionaryOf(const Result<Value>& parsed, const std::string& what) {
  if (parsed.has_error()) return fault(what + " cannot be read: " + parsed.error().description());
  const Dictionary* dictionary = parsed->dictionary();
  if (dictionary == nullptr) return fault(what + " is no dictionary");
  return *dictionary;
}

}  // namespace

Result<Dictionary> parseBag(const Data& bytes) {
  std::string_view text = bytes.view();
  if (text.empty()) return fault("the file is empty");
  // Some editors put one before JSON.
  if (text.starts_with(kByteOrderMark)) text.remove_prefix(kByteOrderMark.size());
  return dictionaryOf(looksLikeJSON(text) ? json::parse(text) : propertylist::parse(bytes), "the bag");
}

Result<Data> seal(const Dictionary& bag, const crypto::PrivateKey& key) {
  const Result<Data> bytes = propertylist::serialize(bag, propertylist::Format::Binary);
  if (bytes.has_error()) return bytes.error();
  const Result<Data> signature = key.signSHA1({bytes->bytes(), bytes->size()});
  if (signature.has_error()) return signature.error();
  const Dictionary envelope{{kEnvelopeBag, base64(*bytes)}, {kEnvelopeSignature, base64(*signature)}};
  return propertylist::serialize(envelope, propertylist::Format::XML);
}

Result<Content> open(const Data& envelope) {
  const Result<Dictionary> dictionary = dictionaryOf(propertylist::parse(envelope), "the envelope");
  if (dictionary.has_error()) return dictionary.error();
  Result<Data> bag = decodedEntry(*dictionary, kEnvelopeBag);
  if (bag.has_error()) return bag.error();
  Result<Data> signature = decodedEntry(*dictionary, kEnvelopeSignature);
  if (signature.has_error()) return signature.error();
  return Content{std::move(*bag), std::move(*signature)};
}

Result<Dictionary> parseSealedBag(const Content& content) {
  return dictionaryOf(propertylist::parse(content.bag), "the bag in the envelope");
}

Result<FileContent> parseFile(const Data& bytes) {
  Result<Dictionary> written = parseBag(bytes);
  if (written.has_error()) return written.error();
  if (!(*written)[kEnvelopeBag].isString()) return FileContent{.bag = std::move(*written)};
  const Result<Content> content = open(bytes);
  if (content.has_error()) return content.error();
  Result<Dictionary> sealed = parseSealedBag(*content);
  if (sealed.has_error()) return sealed.error();
  return FileContent{.bag = std::move(*sealed), .isSigned = true};
}

std::string_view bagNameOfFile(std::string_view path) noexcept {
  const std::string_view name = path.substr(path.rfind('/') + 1);
  return name.substr(0, name.find('.'));
}

}  // namespace telvane::storebagenvelope
