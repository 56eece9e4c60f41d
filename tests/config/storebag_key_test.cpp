// What counts as a signature, and what counts as a key: everything that comes close must not.
#include "config/storebag_key.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "rsa_key.h"

namespace veltrad {
namespace {

using namespace std::string_literals;

constexpr std::string_view kBag = "<plist version=\"1.0\"><dict/></plist>";

// RFC 8017, 9.2, note 1.
const std::string kSHA1Info = "\x30\x21\x30\x09\x06\x05\x2b\x0e\x03\x02\x1a\x05\x00\x04\x14"s;
const std::string kSHA256Info =
    "\x30\x31\x30\x0d\x06\x09\x60\x86\x48\x01\x65\x03\x04\x02\x01\x05\x00\x04\x20"s;

// 00 01 FF … FF 00, and then `content`; `garbage` behind it shortens the padding.
std::string padded(std::size_t length, const std::string& content, const std::string& garbage = "",
                   char type = 1, char filler = '\xff') {
  const std::size_t fill = length - 3 - content.size() - garbage.size();
  return "\0"s + type + std::string(fill, filler) + "\0"s + content + garbage;
}

StorebagKey keyOf(const std::string& der) {
  auto key = StorebagKey::fromDER(der);
  EXPECT_TRUE(key);
  return std::move(*key);
}

TEST(StorebagKey, VerifiesWhatItsOtherHalfSigned) {
  const RSAKey& signer = RSAKey::shared();
  for (const std::string& der : {signer.subjectPublicKeyInfo(), signer.rsaPublicKey()}) {
    const StorebagKey key = keyOf(der);
    EXPECT_TRUE(key.verifies(kBag, signer.sign(kBag)));
    EXPECT_TRUE(key.verifies("", signer.sign("")));
    // The block that the forgeries below depart from.
    EXPECT_TRUE(key.verifies(kBag, signer.signBlock(padded(signer.bytes(), kSHA1Info + sha1(kBag)))));
    EXPECT_TRUE(verifySignature(der, kBag, signer.sign(kBag)));
  }
}

TEST(StorebagKey, RefusesASignatureWithAnyBitChanged) {
  const StorebagKey key = keyOf(RSAKey::shared().subjectPublicKeyInfo());
  std::string signature = RSAKey::shared().sign(kBag);
  for (std::size_t bit = 0; bit < signature.size() * 8; ++bit) {
    signature[bit / 8] = static_cast<char>(signature[bit / 8] ^ (1 << bit % 8));
    EXPECT_FALSE(key.verifies(kBag, signature)) << "bit " << bit;
    signature[bit / 8] = static_cast<char>(signature[bit / 8] ^ (1 << bit % 8));
  }
  EXPECT_TRUE(key.verifies(kBag, signature));
}

TEST(StorebagKey, RefusesOtherLengthsBytesAndSigners) {
  const RSAKey& signer = RSAKey::shared();
  const StorebagKey key = keyOf(signer.subjectPublicKeyInfo());
  const std::string good = signer.sign(kBag);
  const std::vector<std::pair<const char*, std::string>> signatures = {
      {"none", ""},
      {"a byte short", good.substr(0, good.size() - 1)},
      {"a zero in front", "\0"s + good},
      {"a zero behind", good + "\0"s},
      {"twice", good + good},
      {"all zero", std::string(good.size(), '\0')},
      {"larger than the modulus", std::string(good.size(), '\xff')},
      {"over other bytes", signer.sign("other")},
      {"over SHA-256", signer.sign(kBag, "SHA256")},
      {"over MD5", signer.sign(kBag, "MD5")},
      {"of another key", RSAKey::generate().sign(kBag)},
  };
  for (const auto& [what, signature] : signatures) EXPECT_FALSE(key.verifies(kBag, signature)) << what;
  EXPECT_FALSE(key.verifies(std::string(kBag) + " ", good));
  EXPECT_FALSE(key.verifies("", good));
}

TEST(StorebagKey, RefusesEveryOtherPadding) {
  const RSAKey& signer = RSAKey::shared();
  const StorebagKey key = keyOf(signer.subjectPublicKeyInfo());
  const std::size_t length = signer.bytes();
  const std::string digest = sha1(kBag);
  std::string hole = padded(length, kSHA1Info + digest);
  hole[20] = '\xfe';
  const std::string garbage(length - 3 - 8 - kSHA1Info.size() - digest.size(), 'g');
  const std::vector<std::pair<const char*, std::string>> blocks = {
      {"no digest info", padded(length, digest)},
      {"SHA-256's digest info", padded(length, kSHA256Info + digest)},
      {"digest info without parameters",
       padded(length, "\x30\x1f\x30\x07\x06\x05\x2b\x0e\x03\x02\x1a\x04\x14"s + digest)},
      {"digest info in the long form", padded(length, "\x30\x81\x21"s + kSHA1Info.substr(2) + digest)},
      {"parameters with room for garbage",
       padded(length, "\x30\x25\x30\x0d\x06\x05\x2b\x0e\x03\x02\x1a\x05\x04gggg\x04\x14"s + digest)},
      {"garbage behind", padded(length, kSHA1Info + digest, "g")},
      {"eight bytes of padding and garbage behind", padded(length, kSHA1Info + digest, garbage)},
      {"no padding and garbage behind", padded(length, kSHA1Info + digest, garbage + "gggggggg")},
      {"encryption's padding", padded(length, kSHA1Info + digest, "", 2)},
      {"padding of zeros", padded(length, kSHA1Info + digest, "", 0, '\0')},
      {"a hole in the padding", hole},
      {"a digest cut short", padded(length, kSHA1Info + digest.substr(0, 19))},
      {"the digest of other bytes", padded(length, kSHA1Info + sha1("other"))},
  };
  for (const auto& [what, block] : blocks) {
    ASSERT_EQ(block.size(), length) << what;
    EXPECT_FALSE(key.verifies(kBag, signer.signBlock(block))) << what;
  }
}

// Against an exponent of 3, a forger without the private key makes a block whose start is in order, and
// leaves the rest to chance.
TEST(StorebagKey, RefusesCubeRootForgeries) {
  const RSAKey signer = RSAKey::generate(2'048, 3);
  const StorebagKey key = keyOf(signer.subjectPublicKeyInfo());
  EXPECT_TRUE(key.verifies(kBag, signer.sign(kBag)));
  const std::string start = "\0\x01"s + std::string(8, '\xff') + "\0"s + kSHA1Info + sha1(kBag);
  const std::string forged = cubeRootOf(start + std::string(signer.bytes() - start.size(), '\0'));
  ASSERT_EQ(cubeOf(forged).substr(0, start.size()), start);  // it would pass where the rest is not looked at
  EXPECT_FALSE(key.verifies(kBag, forged));
}

TEST(StorebagKey, TakesPublicKeysInBoundsAlone) {
  for (const int bits : {2'048, 3'072, 8'192}) {
    const auto key = StorebagKey::fromDER(publicKeyOfSize(bits));
    ASSERT_TRUE(key) << bits;
    EXPECT_EQ(key->modulusBits(), bits);
  }
  const RSAKey& good = RSAKey::shared();
  const std::string der = good.subjectPublicKeyInfo();
  const std::vector<std::pair<const char*, std::string>> table = {
      {"nothing", ""},
      {"no DER", "publicKey"},
      {"2,047 bits", publicKeyOfSize(2'047)},
      {"1,024 bits", publicKeyOfSize(1'024)},
      {"8,193 bits", publicKeyOfSize(8'193)},
      {"16,384 bits", publicKeyOfSize(16'384)},
      {"an exponent of 1", publicKeyOfSize(2'048, 1)},
      {"an even exponent", publicKeyOfSize(2'048, 4)},
      {"PEM", good.publicPEM()},
      {"a private key", good.rsaPrivateKey()},
      {"a private key info", good.privateKeyInfo()},
      {"cut short", der.substr(0, der.size() - 1)},
      {"a byte behind", der + "\0"s},
      {"twice", der + der},
      {"an elliptic curve", publicKeyOfAlgorithm("EC")},
      {"a key for another padding", publicKeyOfAlgorithm("RSA-PSS")},
  };
  for (const auto& [what, bytes] : table) {
    EXPECT_FALSE(StorebagKey::fromDER(bytes)) << what;
    EXPECT_FALSE(verifySignature(bytes, kBag, good.sign(kBag))) << what;
  }
}

}  // namespace
}  // namespace veltrad
