// SPDX-License-Identifier: Apache-2.0
// Whom connections trust while the process has no descriptor left.
#include "http/connections.h"

#include <gtest/gtest.h>
#include <openssl/x509_vfy.h>

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

}  // namespace
}  // namespace veltrad::platform
