#include "tests/support/StorebagBuilder.h"

#include "foundation/Base64.h"
#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Crypto.h"
#include "platform/PropertyList.h"

namespace telvane::testing {
namespace {

const crypto::PrivateKey& signingKey() {
  static const crypto::PrivateKey key = crypto::PrivateKey::generate().value();
  return key;
}

std::string textOf(const Data& data) { return std::string(data.view()); }

Data bytesOf(const Value& bag) { return propertylist::serialize(bag, propertylist::Format::Binary).value(); }

std::string signedEnvelope(const crypto::PrivateKey& key, const Data& bagBytes) {
  const std::span<const uint8_t> bytes(bagBytes.bytes(), bagBytes.size());
  const Data signature = key.signSHA1(bytes).value();
  return StorebagBuilder::rawEnvelope(base64Encode(bytes), base64Encode({signature.bytes(), signature.size()}));
}

}  // namespace

StorebagBuilder::StorebagBuilder()
    : _bag{{kStorebagVersion, "3.1"}, {kEnvironmentRelease, section(kTelvaneBackendHTTPPost.view().data())}} {}

StorebagBuilder& StorebagBuilder::set(const Key& key, Value value) {
  _bag.set(key, std::move(value));
  return *this;
}

std::string StorebagBuilder::envelope() const { return envelopeOf(_bag); }

Dictionary StorebagBuilder::section(const char* backendName, Dictionary client) {
  Dictionary result;
  result.set(backendName, Dictionary{{kProfileClients, Array{Value(std::move(client))}}});
  return result;
}

Dictionary StorebagBuilder::permissiveClient() {
  return {{kClientEntryLocaleWhitelist, Array{"US"}},
          {kClientEntryFilters, Array()},
          {kClientEntrySamplingThreshold, 1.0},
          {kClientEntryPostURL, kPostURL}};
}

Data StorebagBuilder::publicKey() { return signingKey().publicKeyDER(); }

std::string StorebagBuilder::envelopeAround(const Data& bagBytes) { return signedEnvelope(signingKey(), bagBytes); }

std::string StorebagBuilder::envelopeOf(const Value& bag) { return envelopeAround(bytesOf(bag)); }

std::string StorebagBuilder::envelopeOfAStranger(const Value& bag) {
  static const crypto::PrivateKey stranger = crypto::PrivateKey::generate().value();
  return signedEnvelope(stranger, bytesOf(bag));
}

std::string StorebagBuilder::rawEnvelope(const Value& bag, const Value& signature) {
  Dictionary envelope;
  envelope.set(kEnvelopeBag, bag);
  envelope.set(kEnvelopeSignature, signature);
  return textOf(propertylist::serialize(envelope, propertylist::Format::XML).value());
}

}  // namespace telvane::testing
