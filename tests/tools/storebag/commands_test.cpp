// SPDX-License-Identifier: Apache-2.0
// veltra-storebag's commands on real files: what it makes, the daemon's own code must take.
#include "storebag/commands.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <utility>

#include "base/base64.h"
#include "config/storebag_container.h"
#include "config/storebag_signing.h"
#include "fakes/temporary_directory.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "storebag/publish.h"

namespace veltrad {
namespace {

using storebag::Outcome;
using testing::HasSubstr;

const Dictionary kStorebag{{"release", Dictionary{{"mivo", Dictionary{{"active", true}}}}},
                           {"version", "1.2"}};

class StorebagCommands : public testing::Test {
 protected:
  StorebagCommands() {
    const Outcome made = storebag::keygen(path("keys"), config::SigningKey::kFewestBits);
    EXPECT_THAT(made.text, testing::StartsWith(privateKey + "\n" + publicKey + "\nSHA-256 "));
  }
  std::string path(const std::string& name) const { return _directory.path(name); }
  std::string file(const std::string& name, const std::string& bytes) const {
    _directory.write(name, bytes);
    return path(name);
  }
  std::string read(const std::string& name) const { return _directory.read(name); }
  static std::string refusal(const Outcome& outcome) {
    EXPECT_FALSE(outcome.done) << outcome.text;
    return outcome.text;
  }

 private:
  TemporaryDirectory _directory;

 protected:
  const std::string privateKey = path("keys/private.pem"), publicKey = path("keys/publicKey.der");
};

TEST_F(StorebagCommands, SignRefusesWhatTheDaemonWouldNotTake) {
  Dictionary deep;
  for (int i = 0; i < 40; ++i) deep = Dictionary{{"deeper", deep}};
  const std::pair<std::string, const char*> inputs[] = {
      {"[1,2]", "no dictionary"},
      {"{\"a\":", ":1:6: "},
      {formats::writeXMLPropertyList(Array{}), "no dictionary"},
      {formats::writeXMLPropertyList(deep), "beyond what the daemon takes"},
      {formats::writeXMLPropertyList(Dictionary{{"note", std::string(1'800'000, 'x')}}),
       "the daemon takes 2097152"},
  };
  for (const auto& [bytes, reason] : inputs) {
    EXPECT_THAT(refusal(storebag::sign({privateKey, file("in", bytes), path("out"), true})),
                HasSubstr(reason));
    EXPECT_FALSE(std::filesystem::exists(path("out"))) << reason;
  }
  const std::string in = file("in", "{}");
  EXPECT_THAT(refusal(storebag::sign({privateKey, in, path("out")})),
              testing::AllOf(HasSubstr("in: 2 errors\n"), HasSubstr("in:1:1: error: no \"release\""),
                             HasSubstr("\n--force signs it all the same")));
  EXPECT_TRUE(storebag::sign({privateKey, in, path("out"), true}).done);
  EXPECT_THAT(refusal(storebag::sign({privateKey, path("out"), path("again")})), HasSubstr("signed already"));
  std::filesystem::remove(path("out"));
  EXPECT_THAT(refusal(storebag::sign({publicKey, in, path("out")})), HasSubstr("RSA private key in PEM"));
  EXPECT_THAT(refusal(storebag::sign({privateKey, path("nowhere"), path("out")})), HasSubstr("nowhere"));
  EXPECT_THAT(refusal(storebag::sign({privateKey, in, path("no/out"), true})), HasSubstr("no/out"));
}

TEST_F(StorebagCommands, VerifyNamesTheStepThatFails) {
  const auto key = config::SigningKey::load(privateKey);
  ASSERT_TRUE(key);
  const std::string bag = formats::writeXMLPropertyList(kStorebag), bagText = encodeBase64(bag);
  const std::string signature = encodeBase64(key.value().sign(bag));
  const auto list = [](const Dictionary& entries) { return formats::writeXMLPropertyList(entries); };
  const std::pair<std::string, const char*> files[] = {
      {"hello", "the container is no property list"},
      {list({{"signature", signature}}), "the text \"bag\" is missing"},
      {list({{"signature", "a"}, {"bag", "a"}}), "no base64"},
      {list({{"signature", "c2ln"}, {"bag", bagText}}), "the signature has 3 bytes; one of this key has 256"},
      {list({{"signature", signature}, {"bag", encodeBase64("other")}}), "not this key's over this bag"},
      {config::makeStorebagContainerAround(key.value(), "no list"),
       "the bag is no property list of a dictionary"},
  };
  for (const auto& [bytes, reason] : files)
    EXPECT_THAT(refusal(storebag::verify(publicKey, file("signed", bytes))), HasSubstr(reason));
  const std::string good = file("good", config::makeStorebagContainer(key.value(), kStorebag));
  EXPECT_TRUE(storebag::verify(publicKey, good).done);
  EXPECT_THAT(refusal(storebag::verify(privateKey, good)), HasSubstr("in DER form of 2048 to 8192 bits"));
}

TEST_F(StorebagCommands, PublishKeepsWhatWasServedAndRefusesWhatDevicesWould) {
  const auto signedBag = [this](const char* name, const Dictionary& more) {
    Dictionary bag = kStorebag;
    bag.merge(more);
    file(std::string(name) + ".json", formats::writeJSON(bag));
    EXPECT_TRUE(storebag::sign({privateKey, path(std::string(name) + ".json"), path(name), false}).done);
    return path(name);
  };
  const auto publish = [this](const std::string& container) {
    return storebag::publish({{container}, path("served"), publicKey});
  };
  const auto time = [this] { return std::filesystem::last_write_time(path("served/quindle")); };
  ASSERT_TRUE(publish(signedBag("quindle", {{"serial", 4}})).done);
  const std::string first = read("served/quindle");
  const auto firstTime = time();
  ASSERT_TRUE(publish(signedBag("quindle", {{"serial", 5}})).done);
  EXPECT_GE(time(), firstTime + std::chrono::seconds(1)) << "a daemon that has the first would get 304";
  const std::string second = read("served/quindle");
  EXPECT_NE(first, second);
  ASSERT_TRUE(publish(path("quindle")).done) << "the same again";

  std::filesystem::create_directories(path("broken"));
  std::string broken = second;
  broken[broken.find("<key>signature</key>") + 40] ^= 1;
  EXPECT_THAT(refusal(publish(file("broken/quindle", broken))), HasSubstr("signature"));
  EXPECT_THAT(refusal(publish(signedBag("quindle", {{"serial", 4}}))), HasSubstr("serial 4 is lower than 5"));
  EXPECT_THAT(refusal(publish(signedBag("quindle", {}))), HasSubstr("no serial"));
  EXPECT_THAT(refusal(publish(signedBag("quindle", {{"serial", 6}, {"name", "ostvane"}}))),
              HasSubstr("ostvane"));
  EXPECT_EQ(read("served/quindle"), second);

  EXPECT_THAT(refusal(storebag::rollback({"quindle", "quindle"}, path("served"))), HasSubstr("twice"));
  EXPECT_THAT(refusal(storebag::rollback({"../quindle"}, path("served"))),
              HasSubstr("the name of a storebag"));
  const auto secondTime = time();
  ASSERT_TRUE(storebag::rollback({"quindle"}, path("served")).done);
  EXPECT_EQ(read("served/quindle"), first);
  EXPECT_GE(time(), secondTime + std::chrono::seconds(1));
  EXPECT_THAT(refusal(storebag::rollback({"quindle"}, path("served"))),
              HasSubstr("nothing was published before"));
}

TEST_F(StorebagCommands, SignWritesWhatARolloutNeedsAndSignsTwice) {
  const Outcome made = storebag::keygen(path("keys"), 0, true);
  const std::string second = path("keys/ed25519.pem"), secondPublic = path("keys/ed25519.der");
  EXPECT_THAT(made.text, testing::StartsWith(second + "\n" + secondPublic + "\nSHA-256 "));
  EXPECT_THAT(refusal(storebag::keygen(path("keys"), 0, true)), HasSubstr("exists already"));
  const std::string list = formats::writeXMLPropertyList(kStorebag), in = file("in", list), out = path("out");
  const auto bagOf = [&] {
    return config::decodeStorebagContainer(config::parseStorebagContainer(read("out")).value())->bag;
  };
  storebag::SignRequest request{privateKey, in, out, false, 7, "2026-12-31", "quindle", {second}};
  EXPECT_TRUE(storebag::sign(request).done);
  Dictionary stamped = kStorebag;
  stamped.merge({{"serial", 7}, {"expires", "2026-12-31"}, {"name", "quindle"}});
  EXPECT_EQ(config::parseStorebagBag(bagOf()), stamped);
  EXPECT_THAT(storebag::verify(publicKey, out, secondPublic).text,
              testing::AllOf(HasSubstr("the signature holds"),
                             HasSubstr(made.text.substr(made.text.find("256 ") + 4))));
  EXPECT_THAT(refusal(storebag::verify(publicKey, out, publicKey)), HasSubstr("an Ed25519 public key"));
  request.expires = "tomorrow";
  EXPECT_THAT(refusal(storebag::sign(request)), HasSubstr("--expires tomorrow: expected a date"));
  request = {privateKey, in, out, false, {}, {}, {}, {privateKey}};
  EXPECT_THAT(refusal(storebag::sign(request)), HasSubstr("an Ed25519 private key in PEM"));
  request.ed25519.clear();
  EXPECT_TRUE(storebag::sign(request).done);
  EXPECT_EQ(bagOf(), list);  // to the byte
  EXPECT_THAT(refusal(storebag::verify(publicKey, out, secondPublic)), HasSubstr("no Ed25519 signature"));
}

}  // namespace
}  // namespace veltrad
