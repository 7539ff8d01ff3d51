#pragma once

#include <optional>

#include "foundation/Value.h"
#include "platform/ClientBundle.h"
#include "platform/Crypto.h"
#include "platform/Log.h"

namespace telvane {

// Verifies an RSA signature (PKCS#1 v1.5 over SHA-1) of the decoded bag bytes.
bool verifyStorebagSignature(const crypto::PublicKey& key, const Data& decodedBag, const Data& decodedSignature);

// Opens an envelope: a property list {"bag": base64 text, "signature": base64 text}. Returns the bag's bytes when the
// signature is that of the key in the client bundle; nothing, with a log line that says why, otherwise.
std::optional<Data> openStorebagEnvelope(Log& log, const ClientBundle& bundle, const Data& envelope);

}  // namespace telvane
