#pragma once

#include <memory>
#include <string>

namespace telvane::testing {

// An authority of a test's own and the certificates that it gives to servers, made on the spot as PEM files in a
// folder. Each certificate is made when it is first asked for. Not for several threads at once.
class TestCertificates {
 public:
  struct Server {
    std::string certificateFile;
    std::string privateKeyFile;
  };

  // folder: an existing folder, which the files are written to. Throws std::runtime_error when that fails.
  explicit TestCertificates(std::string folder);
  ~TestCertificates();
  TestCertificates(const TestCertificates&) = delete;
  TestCertificates& operator=(const TestCertificates&) = delete;

  // The authority's certificate, for clients that are to trust it.
  const std::string& authorityFile() const noexcept { return _authorityFile; }
  // For localhost, 127.0.0.1 and ::1, from yesterday until tomorrow.
  Server valid();
  // The same, until an hour ago.
  Server expired();
  // For another host.
  Server forAnotherHost();
  // For localhost and 127.0.0.1, from an authority that nobody trusts.
  Server fromUnknownAuthority();

 private:
  class Authority;
  struct Terms;
  Server make(const std::string& name, const Authority& authority, const Terms& terms);

  const std::string _folder;
  std::string _authorityFile;
  std::unique_ptr<Authority> _authority;
};

}  // namespace telvane::testing
