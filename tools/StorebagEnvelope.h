#pragma once

#include <string_view>

#include "foundation/Error.h"
#include "foundation/Value.h"
#include "platform/Crypto.h"

// Signed storebags as files: reading what an author wrote, sealing it for the server, and opening it again.
namespace telvane::storebagenvelope {

// The largest file of any kind that is read here.
inline constexpr uint64_t kMaximumFileBytes = 16u << 20;

// Reads a bag as its author wrote it: a property list, or JSON when it begins with a brace or bracket. Fails when it is
// neither or no dictionary.
Result<Dictionary> parseBag(const Data& text);

// Makes the envelope that a server hands out: an XML property list with the bag as a binary one and its signature, both
// in base64.
Result<Data> seal(const Dictionary& bag, const crypto::PrivateKey& key);

// What an envelope holds, not yet believed.
struct Content {
  Data bag;  // the bytes that were signed
  Data signature;
};
// Takes an envelope apart. Fails when it is no property list with the texts "bag" and "signature" in base64.
Result<Content> open(const Data& envelope);

// Reads the bag inside an envelope. Fails when it is no property list or no dictionary.
Result<Dictionary> parseSealedBag(const Content& content);

// A bag as a file held it.
struct FileContent {
  Dictionary bag;
  bool isSigned = false;  // it came in an envelope, whose signature nobody has checked
};
// Reads whichever of the two the file is: an envelope when it is a property list with a text under "bag", otherwise a
// bag as its author wrote it. Fails when it is neither.
Result<FileContent> parseFile(const Data& bytes);

// The name by which devices would ask for the bag of a file, as files are named by habit: "health" of
// "bags/health.json". A view of the path.
std::string_view bagNameOfFile(std::string_view path) noexcept;

}  // namespace telvane::storebagenvelope
