#include "tests/support/TestCertificates.h"

#include <openssl/ec.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include <cstdio>
#include <filesystem>
#include <stdexcept>

namespace telvane::testing {

namespace {

using Key = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;
using Certificate = std::unique_ptr<X509, decltype(&X509_free)>;
using File = std::unique_ptr<FILE, decltype(&fclose)>;

constexpr long kHour = 3600;
constexpr long kDay = 24 * kHour;
constexpr const char* kLocalNames = "DNS:localhost,IP:127.0.0.1,IP:0:0:0:0:0:0:0:1";

void check(bool isFine, const char* what) {
  if (!isFine) throw std::runtime_error(std::string("certificate for a test: ") + what);
}

Key newKey() {
  Key key(EVP_EC_gen("P-256"), &EVP_PKEY_free);
  check(key != nullptr, "key");
  return key;
}

void addExtension(X509& certificate, X509& issuer, int kind, const char* value) {
  X509V3_CTX context;
  X509V3_set_ctx(&context, &issuer, &certificate, nullptr, nullptr, 0);
  X509_EXTENSION* extension = X509V3_EXT_conf_nid(nullptr, &context, kind, value);
  check(extension != nullptr && X509_add_ext(&certificate, extension, -1) == 1, value);
  X509_EXTENSION_free(extension);
}

// An unsigned certificate for the key; the times are seconds from now.
Certificate newCertificate(EVP_PKEY& key, const std::string& name, long from, long until) {
  Certificate certificate(X509_new(), &X509_free);
  X509_set_version(certificate.get(), X509_VERSION_3);
  uint64_t serial = 0;
  check(RAND_bytes(reinterpret_cast<unsigned char*>(&serial), sizeof serial) == 1, "serial number");
  ASN1_INTEGER_set_uint64(X509_get_serialNumber(certificate.get()), serial >> 1);
  X509_gmtime_adj(X509_getm_notBefore(certificate.get()), from);
  X509_gmtime_adj(X509_getm_notAfter(certificate.get()), until);
  X509_set_pubkey(certificate.get(), &key);
  X509_NAME_add_entry_by_txt(X509_get_subject_name(certificate.get()), "CN", MBSTRING_UTF8,
                             reinterpret_cast<const unsigned char*>(name.c_str()), -1, -1, 0);
  return certificate;
}

File openForWriting(const std::string& path) {
  File file(fopen(path.c_str(), "wb"), &fclose);
  check(file != nullptr, path.c_str());
  return file;
}

void writeCertificate(const std::string& path, X509& certificate) {
  check(PEM_write_X509(openForWriting(path).get(), &certificate) == 1, path.c_str());
}

void writeKey(const std::string& path, EVP_PKEY& key) {
  const File file = openForWriting(path);
  check(PEM_write_PrivateKey(file.get(), &key, nullptr, nullptr, 0, nullptr, nullptr) == 1, path.c_str());
}

}  // namespace

struct TestCertificates::Terms {
  const char* subjects = kLocalNames;
  long from = -kDay;
  long until = kDay;
};

class TestCertificates::Authority {
 public:
  explicit Authority(const std::string& name) : _key(newKey()), _certificate(newCertificate(*_key, name, -kDay, kDay)) {
    X509_set_issuer_name(&certificate(), X509_get_subject_name(&certificate()));
    addExtension(certificate(), certificate(), NID_basic_constraints, "critical,CA:TRUE");
    addExtension(certificate(), certificate(), NID_key_usage, "critical,keyCertSign,cRLSign");
    addExtension(certificate(), certificate(), NID_subject_key_identifier, "hash");
    sign(certificate());
  }

  X509& certificate() const { return *_certificate; }
  void sign(X509& certificate) const { check(X509_sign(&certificate, _key.get(), EVP_sha256()) > 0, "signature"); }

 private:
  Key _key;
  Certificate _certificate;
};

TestCertificates::TestCertificates(std::string folder)
    : _folder(std::move(folder)),
      _authorityFile(_folder + "/authority.pem"),
      _authority(std::make_unique<Authority>("Telvane test authority")) {
  writeCertificate(_authorityFile, _authority->certificate());
}

TestCertificates::~TestCertificates() = default;

TestCertificates::Server TestCertificates::valid() { return make("valid", *_authority, {}); }

TestCertificates::Server TestCertificates::expired() { return make("expired", *_authority, {.until = -kHour}); }

TestCertificates::Server TestCertificates::forAnotherHost() {
  return make("another-host", *_authority, {.subjects = "DNS:another.example"});
}

TestCertificates::Server TestCertificates::fromUnknownAuthority() {
  return make("unknown-authority", Authority("Unknown authority"), {});
}

TestCertificates::Server TestCertificates::make(const std::string& name, const Authority& authority,
                                                const Terms& terms) {
  Server files{_folder + "/" + name + ".pem", _folder + "/" + name + ".key"};
  if (std::filesystem::exists(files.privateKeyFile)) return files;
  const Key key = newKey();
  const Certificate certificate = newCertificate(*key, name, terms.from, terms.until);
  X509_set_issuer_name(certificate.get(), X509_get_subject_name(&authority.certificate()));
  addExtension(*certificate, authority.certificate(), NID_basic_constraints, "critical,CA:FALSE");
  addExtension(*certificate, authority.certificate(), NID_ext_key_usage, "serverAuth");
  addExtension(*certificate, authority.certificate(), NID_subject_alt_name, terms.subjects);
  authority.sign(*certificate);
  writeCertificate(files.certificateFile, *certificate);
  writeKey(files.privateKeyFile, *key);
  return files;
}

}  // namespace telvane::testing
