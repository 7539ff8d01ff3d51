#include "backends/ClientMessage.h"

#include "interfaces/SessionKeys.h"

namespace telvane {

Dictionary sentByClient(Dictionary blob) {
  const bool hasClientData = blob[kTelvaneMessageBlobClientData].isDictionary();
  const bool hasSharedData = blob[kTelvaneMessageBlobSharedData].isDictionary();
  const bool isWrapped = blob.size() > 0 && blob.size() == (hasClientData ? 1u : 0u) + (hasSharedData ? 1u : 0u);
  if (!isWrapped) return blob;
  if (!hasClientData) return {};
  return *blob[kTelvaneMessageBlobClientData].dictionary();
}

}  // namespace telvane
