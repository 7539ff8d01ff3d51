#pragma once

#include <string>
#include <string_view>

#include "foundation/Key.h"
#include "foundation/Value.h"

namespace telvane::testing {

// A signed storebag as a server sends it. The key is made once per test process; its public half is what a client
// bundle is given. Not for several threads.
//
//   StorebagBuilder bag;                                  // "release" reports everything to one collector
//   bag.set(kStorebagRefreshCycle, 60);
//   world.network().answer(url, NetworkAnswer::ok(bag.envelope()));
class StorebagBuilder {
 public:
  static constexpr char kPostURL[] = "https://collector.example/events";

  StorebagBuilder();
  // Sets a key of the bag itself; an absent value removes it.
  StorebagBuilder& set(const Key& key, Value value);
  const Dictionary& bag() const noexcept { return _bag; }
  // The property list to be served.
  std::string envelope() const;

  // A section with one HTTPS backend of that name, whose only client entry is this.
  static Dictionary section(const char* backendName, Dictionary client = permissiveClient());
  // A client entry that lets every client, device, country and event through.
  static Dictionary permissiveClient();

  // The signing key's public half, as the client bundle holds it.
  static Data publicKey();
  // An envelope around any bytes, rightly signed.
  static std::string envelopeAround(const Data& bagBytes);
  // An envelope around any property list, rightly signed.
  static std::string envelopeOf(const Value& bag);
  // The same, signed by a key that nobody knows.
  static std::string envelopeOfAStranger(const Value& bag);
  // An envelope of parts as they are; absent ones are left out.
  static std::string rawEnvelope(const Value& bag, const Value& signature);

 private:
  Dictionary _bag;
};

}  // namespace telvane::testing
