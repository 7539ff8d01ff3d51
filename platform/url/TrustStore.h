#pragma once

#include <string>

#include "platform/Log.h"

using X509_STORE = struct x509_store_st;
using SSL_CTX = struct ssl_ctx_st;

namespace telvane {

// The certificates that servers are verified against, read once and shared by all connections: reading the system's
// store for each of them would cost tens of milliseconds and megabytes. Owned by the session provider; confined to the
// loop's thread. The files are read when the first connection needs them; a later change of a file is not seen.
class TrustStore {
 public:
  // caFile: PEM file of the only trusted certificates; empty means the system's, of which only those are read that a
  // server's chain asks for.
  TrustStore(std::string caFile, Log& log);
  ~TrustStore();
  TrustStore(const TrustStore&) = delete;
  TrustStore& operator=(const TrustStore&) = delete;

  // Makes connections of the context verify against this store. When the file cannot be read nothing is trusted: one
  // error line tells so, and every verification fails.
  void useIn(SSL_CTX* context);

 private:
  void load();

  const std::string _caFile;
  Log& _log;
  X509_STORE* _store = nullptr;
};

}  // namespace telvane
