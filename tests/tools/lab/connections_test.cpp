// SPDX-License-Identifier: Apache-2.0
// The certificates that connections trust, also while the process has no descriptor left.
#include "http/connections.h"

#include <glob.h>
#include <gtest/gtest.h>
#include <openssl/bio.h>
#include <openssl/pem.h>
#include <openssl/x509_vfy.h>

#include <memory>
#include <string>

#include "fakes/few_descriptors.h"
#include "fakes/recorded_log.h"
#include "fakes/temporary_directory.h"
#include "tools/lab/certificate.h"

namespace veltrad::platform {
namespace {

int certificatesIn(X509_STORE* store) {
  return store ? sk_X509_OBJECT_num(X509_STORE_get0_objects(store)) : -1;
}

TEST(Connections, TrustIsNeverWithoutWhatItCouldNotReadJustNow) {
  const RecordedLog log;
  const TemporaryDirectory directory;
  const std::string path = directory.path("ca.pem");
  const int system = certificatesIn(http::Connections("").trusted());
  ASSERT_FALSE(lab::makeCertificate(path, directory.path("key.pem")));
  http::Connections trust(path);
  {
    const FewDescriptors none;
    EXPECT_EQ(certificatesIn(trust.trusted()), -1);
  }
  EXPECT_EQ(certificatesIn(trust.trusted()), system + 1);
  // A new file: until it can be read, those of the old one are trusted.
  directory.write("ca.pem", directory.read("ca.pem") + "\n");
  {
    const FewDescriptors none;
    EXPECT_EQ(certificatesIn(trust.trusted()), system + 1);
  }
}

TEST(Connections, AHashedDirectoryIsReadWhenACertificateIsAskedFor) {
  glob_t found{};
  const std::string pattern = std::string(X509_get_default_cert_dir()) + "/[0-9a-f]*.0";
  const bool hashed = glob(pattern.c_str(), 0, nullptr, &found) == 0;
  const std::string path = hashed ? found.gl_pathv[0] : "";
  globfree(&found);
  if (!hashed) GTEST_SKIP() << "no certificates in " << X509_get_default_cert_dir();
  http::Connections connections("");
  X509_STORE* const store = connections.trusted();
  EXPECT_EQ(certificatesIn(store), 0);
  const std::unique_ptr<BIO, int (*)(BIO*)> file(BIO_new_file(path.c_str(), "r"), BIO_free);
  const std::unique_ptr<X509, void (*)(X509*)> root(PEM_read_bio_X509(file.get(), nullptr, nullptr, nullptr),
                                                    X509_free);
  const std::unique_ptr<X509_STORE_CTX, void (*)(X509_STORE_CTX*)> check(X509_STORE_CTX_new(),
                                                                         X509_STORE_CTX_free);
  ASSERT_EQ(X509_STORE_CTX_init(check.get(), store, root.get(), nullptr), 1);
  X509_STORE_CTX_set_flags(check.get(), X509_V_FLAG_NO_CHECK_TIME);
  EXPECT_EQ(X509_verify_cert(check.get()), 1) << path;
  EXPECT_EQ(certificatesIn(store), 1);
}

}  // namespace
}  // namespace veltrad::platform
