#include "storebag/StorebagVerification.h"

#include "foundation/Base64.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"

namespace telvane {
namespace {

// An envelope that cannot be parsed is one in which nothing is found.
Dictionary parseEnvelope(Log& log, const Data& envelope) {
  const Result<Value> parsed = propertylist::parse(envelope);
  if (parsed.has_error()) {
    log.message("fetchStorebagWithName: propertyListWithData error {}", parsed.error());
    return {};
  }
  const Dictionary* dictionary = parsed->dictionary();
  return dictionary != nullptr ? *dictionary : Dictionary();
}

}  // namespace

bool verifyStorebagSignature(const crypto::PublicKey& key, const Data& decodedBag, const Data& decodedSignature) {
  return key.verifySHA1(crypto::sha1({decodedBag.bytes(), decodedBag.size()}), decodedSignature);
}

std::optional<Data> openStorebagEnvelope(Log& log, const ClientBundle& bundle, const Data& envelope) {
  const Dictionary dictionary = parseEnvelope(log, envelope);
  const Value& signatureText = dictionary[kEnvelopeSignature];
  if (!signatureText.isString()) {
    log.error("fetchStorebagWithName: Signature is missing");
    return std::nullopt;
  }
  const std::optional<Data> der = bundle.publicKey();
  if (!der.has_value()) return std::nullopt;
  const std::optional<crypto::PublicKey> key = crypto::PublicKey::fromDER(*der);
  if (!key.has_value()) return std::nullopt;
  const std::optional<Data> signature = base64DecodeIgnoringUnknownCharacters(signatureText.text());
  if (!signature.has_value() || !dictionary[kEnvelopeBag].isString()) return std::nullopt;
  std::optional<Data> bag = base64DecodeIgnoringUnknownCharacters(dictionary[kEnvelopeBag].text());
  if (!bag.has_value()) return std::nullopt;
  if (!verifyStorebagSignature(*key, *bag, *signature)) {
    log.error("fetchStorebagWithName: Signature can not be verified, {}", fmt::ptr(key->address()));
    return std::nullopt;
  }
  return bag;
}

}  // namespace telvane
