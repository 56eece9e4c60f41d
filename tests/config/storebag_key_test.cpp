// SPDX-License-Identifier: Apache-2.0
// Which signatures and keys are accepted, and that near misses are refused.
#include "config/storebag_key.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "rsa_key.h"

namespace veltrad {
namespace {

using namespace std::string_literals;
using Table = std::vector<std::pair<const char*, std::string>>;

const std::string kBag = "<plist version=\"1.0\"><dict/></plist>";

// RFC 8017, 9.2, note 1.
const std::string kSHA1Info = "\x30\x21\x30\x09\x06\x05\x2b\x0e\x03\x02\x1a\x05\x00\x04\x14"s;
const std::string kSHA256Info =
    "\x30\x31\x30\x0d\x06\x09\x60\x86\x48\x01\x65\x03\x04\x02\x01\x05\x00\x04\x20"s;

// 00 01 FF … FF 00 `content` in 256 bytes; `garbage` behind it shortens the padding.
std::string padded(const std::string& content, const std::string& garbage = "", char type = 1,
                   char filler = '\xff') {
  return "\0"s + type + std::string(253 - content.size() - garbage.size(), filler) + "\0"s + content +
         garbage;
}

TEST(StorebagKey, VerifiesOneSignatureOfItsOwnAndNothingClose) {
  const std::string digest = digestOf(kBag), info = kSHA1Info + digest;
  const std::string start = "\0\x01"s + std::string(8, '\xff') + "\0"s + info;
  std::string hole = padded(info);
  hole[20] = '\xfe';
  const Table blocks = {
      {"no digest info", padded(digest)},
      {"SHA-256's digest info", padded(kSHA256Info + digest)},
      {"no parameters", padded("\x30\x1f\x30\x07\x06\x05\x2b\x0e\x03\x02\x1a\x04\x14"s + digest)},
      {"the long form", padded("\x30\x81\x21"s + info.substr(2))},
      {"parameters with garbage",
       padded("\x30\x25\x30\x0d\x06\x05\x2b\x0e\x03\x02\x1a\x05\x04gggg\x04\x14" + digest)},
      {"garbage behind", padded(info, "g")},
      {"eight bytes of padding, garbage behind", start + std::string(256 - start.size(), 'g')},
      {"no padding, garbage behind", padded(info, std::string(253 - info.size(), 'g'))},
      {"encryption's padding", padded(info, "", 2)},
      {"padding of zeros", padded(info, "", 0, '\0')},
      {"a hole in the padding", hole},
      {"a digest cut short", padded(info.substr(0, info.size() - 1))},
      {"the digest of other bytes", padded(kSHA1Info + digestOf("other"))},
  };
  const RSAKey other(EVP_RSA_gen(2'048u));
  const RSAKey& signer = RSAKey::shared();
  const auto key = config::StorebagKey::fromDER(signer.encoded());
  ASSERT_TRUE(key);
  const std::string good = signer.sign(kBag);
  Table signatures = {
      {"none", ""},
      {"a byte short", good.substr(0, good.size() - 1)},
      {"a zero in front", "\0"s + good},
      {"a zero behind", good + "\0"s},
      {"twice", good + good},
      {"all zero", std::string(good.size(), '\0')},
      {"larger than the modulus", std::string(good.size(), '\xff')},
      {"over other bytes", signer.sign("other")},
      {"over SHA-256", signer.sign(kBag, EVP_sha256())},
      {"over MD5", signer.sign(kBag, EVP_md5())},
      {"of another key", other.sign(kBag)},
  };
  for (std::size_t bit = 0; bit < good.size() * 8; ++bit) {
    signatures.emplace_back("a bit changed", good);
    signatures.back().second[bit / 8] ^= static_cast<char>(1 << bit % 8);
  }
  for (const auto& [what, block] : blocks) signatures.emplace_back(what, signer.signBlock(block));
  for (const auto& [what, signature] : signatures) EXPECT_FALSE(key->verifies(kBag, signature)) << what;
  EXPECT_FALSE(key->verifies(kBag + " ", good));
  EXPECT_FALSE(key->verifies("", good));
  EXPECT_TRUE(key->verifies(kBag, good));
  EXPECT_TRUE(key->verifies("", signer.sign("")));
  EXPECT_TRUE(key->verifies(kBag, signer.signBlock(padded(info))));  // what the blocks above depart from
}

std::string der(char tag, const std::string& content) {
  const auto high = static_cast<char>(content.size() >> 8), low = static_cast<char>(content.size());
  return tag + (content.size() < 128 ? ""s : "\x82"s + high) + low + content;
}
// RSAPublicKey with a modulus of so many bits, without a private key.
std::string keyOf(int bits, const std::string& exponent = "\x01\x00\x01"s) {
  std::string modulus(static_cast<std::size_t>(bits + 7) / 8, '\x5b');
  modulus[0] = static_cast<char>(1 << (bits - 1) % 8);
  return der(0x30, der(2, (bits % 8 == 0 ? "\0"s : ""s) + modulus) + der(2, exponent));
}
// SubjectPublicKeyInfo with an algorithm next to RSA's: 1 is RSA itself, 10 is for another padding alone.
std::string infoOf(char algorithm, const std::string& parameters) {
  const std::string identifier = der(6, "\x2a\x86\x48\x86\xf7\x0d\x01\x01"s + algorithm);
  return der(0x30, der(0x30, identifier + parameters) + der(3, "\0"s + keyOf(2'048)));
}

TEST(StorebagKey, TakesPublicKeysInBoundsAlone) {
  for (const int bits : {2'048, 3'072, 8'192}) {
    const auto key = config::StorebagKey::fromDER(keyOf(bits));
    ASSERT_TRUE(key) << bits;
    EXPECT_EQ(key->modulusBits(), bits);
  }
  EXPECT_TRUE(config::StorebagKey::fromDER(infoOf(1, der(5, ""))));
  const RSAKey& good = RSAKey::shared();
  const std::string info = good.encoded();
  for (const std::string& form : {info, good.encoded("type-specific")}) {
    const auto key = config::StorebagKey::fromDER(form);
    EXPECT_TRUE(key && key->verifies(kBag, good.sign(kBag)));
  }
  for (const std::string& bytes :
       {std::string(), keyOf(2'047), keyOf(8'193), keyOf(2'048, "\1"), keyOf(2'048, "\4"),
        good.encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM"),
        good.encoded("type-specific", EVP_PKEY_KEYPAIR), good.encoded("PrivateKeyInfo", EVP_PKEY_KEYPAIR),
        info.substr(0, info.size() - 1), info + "\0"s,
        RSAKey(EVP_EC_gen("P-256")).encoded(),  // no RSA
        infoOf(10, "")}) {
    EXPECT_FALSE(config::StorebagKey::fromDER(bytes)) << bytes.size();
  }
}

TEST(StorebagKey, OfAFileIsRSAOrEd25519InEitherForm) {
  const RSAKey signer(EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519"));
  const std::string der = signer.encoded();
  EXPECT_FALSE(config::StorebagKey::fromDER(der));  // publicKey.der is RSA's
  std::string signature(64, '\0');
  std::size_t length = signature.size();
  const std::shared_ptr<EVP_MD_CTX> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  ASSERT_TRUE(EVP_DigestSignInit(context.get(), nullptr, nullptr, nullptr, signer.get()) == 1 &&
              EVP_DigestSign(context.get(), out(signature), &length, in(kBag), kBag.size()) == 1);
  for (const std::string& form :
       {der, signer.encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM"),
        "# ours\n" + signer.encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM")}) {
    const auto key = config::StorebagKey::fromFile(form);
    ASSERT_TRUE(key);
    EXPECT_EQ(key->kind(), config::StorebagKey::Kind::ed25519);
    EXPECT_TRUE(key->verifies(kBag, signature));
    EXPECT_FALSE(key->verifies(kBag + " ", signature));
    for (std::size_t bit = 0; bit < signature.size() * 8; ++bit) {
      std::string bad = signature;
      bad[bit / 8] ^= static_cast<char>(1 << bit % 8);
      EXPECT_FALSE(key->verifies(kBag, bad)) << bit;
    }
    for (const std::string& bad : {signature.substr(1), signature + "\0"s, ""s, RSAKey::shared().sign(kBag)})
      EXPECT_FALSE(key->verifies(kBag, bad)) << bad.size();
  }
  const RSAKey& rsa = RSAKey::shared();
  for (const std::string& form : {rsa.encoded(), rsa.encoded("type-specific"),
                                  rsa.encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM"),
                                  rsa.encoded("type-specific", EVP_PKEY_PUBLIC_KEY, "PEM")}) {
    const auto key = config::StorebagKey::fromFile(form);
    ASSERT_TRUE(key);
    EXPECT_EQ(key->kind(), config::StorebagKey::Kind::rsa);
    EXPECT_TRUE(key->verifies(kBag, rsa.sign(kBag)));
  }
  for (const std::string& bytes :
       {""s, "-----BEGIN PUBLIC KEY-----"s, der + "\0"s, der.substr(1),
        signer.encoded("PrivateKeyInfo", EVP_PKEY_KEYPAIR, "PEM"),
        RSAKey(EVP_PKEY_Q_keygen(nullptr, nullptr, "X25519")).encoded(),
        RSAKey(EVP_PKEY_Q_keygen(nullptr, nullptr, "ED448")).encoded(), std::string(1u << 17, 'A')}) {
    EXPECT_FALSE(config::StorebagKey::fromFile(bytes)) << bytes.size();
  }
}

}  // namespace
}  // namespace veltrad
