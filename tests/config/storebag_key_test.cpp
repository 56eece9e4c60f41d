// What counts as a signature, and what counts as a key: everything that comes close must not.
#include "config/storebag_key.h"

#include <gtest/gtest.h>
#include <openssl/bn.h>

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

RSAKey keyWithExponent3() {
  const std::shared_ptr<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr),
                                              EVP_PKEY_CTX_free);
  const std::shared_ptr<BIGNUM> three(BN_new(), BN_free);
  EVP_PKEY* made = nullptr;
  EXPECT_TRUE(BN_set_word(three.get(), 3) && EVP_PKEY_keygen_init(context.get()) == 1 &&
              EVP_PKEY_CTX_set1_rsa_keygen_pubexp(context.get(), three.get()) == 1 &&
              EVP_PKEY_generate(context.get(), &made) == 1);
  return RSAKey(made);
}

// What a forger without the private key makes against an exponent of 3: 256 bytes whose cube begins with
// `start` and leaves the rest to chance.
std::string cubeRootOf(const std::string& start) {
  using Number = std::shared_ptr<BIGNUM>;
  const std::shared_ptr<BN_CTX> context(BN_CTX_new(), BN_CTX_free);
  const Number wanted(BN_bin2bn(in(start), static_cast<int>(start.size()), nullptr), BN_free);
  const Number root(BN_new(), BN_free), cube(BN_new(), BN_free), found(BN_new(), BN_free);
  for (int bit = 2'048 / 3; bit >= 0; --bit) {
    BN_set_bit(root.get(), bit);
    BN_sqr(cube.get(), root.get(), context.get());
    BN_mul(cube.get(), cube.get(), root.get(), context.get());
    BN_rshift(cube.get(), cube.get(), static_cast<int>(256 - start.size()) * 8);
    const bool fits = BN_cmp(cube.get(), wanted.get()) <= 0;
    fits ? BN_copy(found.get(), cube.get()) != nullptr : BN_clear_bit(root.get(), bit);
  }
  EXPECT_EQ(BN_cmp(found.get(), wanted.get()), 0);  // so it would pass where the rest is not looked at
  std::string signature(256, '\0');
  BN_bn2binpad(root.get(), out(signature), 256);
  return signature;
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
  for (const RSAKey& signer : {RSAKey::shared(), keyWithExponent3()}) {
    const auto key = StorebagKey::fromDER(signer.encoded());
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
        {"a cube root", cubeRootOf(start)},
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
}

std::string der(char tag, const std::string& content) {
  const auto high = static_cast<char>(content.size() >> 8), low = static_cast<char>(content.size());
  return tag + (content.size() < 128 ? ""s : "\x82"s + high) + low + content;
}
// RSAPublicKey with a modulus of so many bits; nobody has the other half.
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
    const auto key = StorebagKey::fromDER(keyOf(bits));
    ASSERT_TRUE(key) << bits;
    EXPECT_EQ(key->modulusBits(), bits);
  }
  EXPECT_TRUE(StorebagKey::fromDER(infoOf(1, der(5, ""))));
  const RSAKey& good = RSAKey::shared();
  const std::string info = good.encoded();
  for (const std::string& form : {info, good.encoded("type-specific")})
    EXPECT_TRUE(verifySignature(form, kBag, good.sign(kBag)));
  for (const std::string& bytes :
       {std::string(), keyOf(2'047), keyOf(8'193), keyOf(2'048, "\1"), keyOf(2'048, "\4"),
        good.encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM"),
        good.encoded("type-specific", EVP_PKEY_KEYPAIR), good.encoded("PrivateKeyInfo", EVP_PKEY_KEYPAIR),
        info.substr(0, info.size() - 1), info + "\0"s,
        RSAKey(EVP_EC_gen("P-256")).encoded(),  // no RSA
        infoOf(10, "")}) {
    EXPECT_FALSE(StorebagKey::fromDER(bytes)) << bytes.size();
    EXPECT_FALSE(verifySignature(bytes, kBag, good.sign(kBag)));
  }
}

}  // namespace
}  // namespace veltrad
