#include "platform/url/TrustStore.h"

#include <openssl/err.h>
#include <openssl/ssl.h>
#include <openssl/x509_vfy.h>

#include <utility>

namespace telvane {

TrustStore::TrustStore(std::string caFile, Log& log) : _caFile(std::move(caFile)), _log(log) {}

TrustStore::~TrustStore() { X509_STORE_free(_store); }

void TrustStore::useIn(SSL_CTX* context) {
  if (_store == nullptr) load();
  SSL_CTX_set1_cert_store(context, _store);
}

void TrustStore::load() {
  _store = X509_STORE_new();
  // What the file names is trusted, also when it is not the root of its chain.
  X509_STORE_set_flags(_store, X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN);
  const int isLoaded =
      _caFile.empty() ? X509_STORE_set_default_paths(_store) : X509_STORE_load_file(_store, _caFile.c_str());
  ERR_clear_error();
  if (isLoaded == 1) return;
  _log.error("No trusted certificate could be read from {}: no https server will be trusted",
             _caFile.empty() ? "the system's store" : _caFile);
}

}  // namespace telvane
