// SPDX-License-Identifier: Apache-2.0
// veltra-storebag's commands on real files: the daemon's own code must accept their output.
#include "storebag/commands.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <filesystem>
#include <optional>
#include <utility>

#include "base/base64.h"
#include "base/file_descriptor.h"
#include "config/storebag_container.h"
#include "config/storebag_signing.h"
#include "fakes/temporary_directory.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "storebag/publish.h"
#include "storebag/served_folder.h"

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

  const auto secondTime = time();
  EXPECT_THAT(refusal(storebag::rollback({{"quindle"}, path("served")})),
              HasSubstr("serial 4 is lower than 5, which is served. Devices can refuse that"));
  EXPECT_EQ(read("served/quindle"), second);
  ASSERT_TRUE(storebag::rollback({{"quindle"}, path("served"), true}).done);
  EXPECT_EQ(read("served/quindle"), first);
  EXPECT_GE(time(), secondTime + std::chrono::seconds(1));
  EXPECT_THAT(refusal(storebag::rollback({{"quindle"}, path("served"), true})),
              HasSubstr("nothing was published before"));
}

TEST_F(StorebagCommands, RollbackFindsTheWayBackWhateverWasRepeated) {
  const auto publish = [this](const std::string& version) {
    Dictionary bag = kStorebag;
    bag.set("version", version);
    const std::string in = file("bag.json", formats::writeJSON(bag));
    EXPECT_TRUE(storebag::sign({privateKey, in, path("quindle"), false}).done);
    const Outcome outcome = storebag::publish({{path("quindle")}, path("served"), publicKey});
    EXPECT_TRUE(outcome.done) << outcome.text;
    return read("served/quindle");
  };
  const auto rollback = [this] { return storebag::rollback({{"quindle"}, path("served")}); };
  const std::string first = publish("1");
  const auto time = std::filesystem::last_write_time(path("served/quindle"));
  EXPECT_EQ(publish("1"), first);
  EXPECT_EQ(std::filesystem::last_write_time(path("served/quindle")), time) << "devices would fetch it again";
  EXPECT_THAT(refusal(rollback()), HasSubstr("nothing was published before"));
  const std::string second = publish("2");
  // As a publication leaves it whose second half failed, and as a rollback does that was killed.
  file("served/.before/quindle/2", second);
  ASSERT_TRUE(rollback().done);
  EXPECT_EQ(read("served/quindle"), first);
  publish("3");
  publish("3");
  ASSERT_TRUE(rollback().done);
  EXPECT_EQ(read("served/quindle"), first);
}

TEST_F(StorebagCommands, PublishAndRollbackDoNothingOrAll) {
  const std::string bag = file("bag.json", formats::writeJSON(kStorebag));
  std::filesystem::create_directories(path("other"));
  const auto signedAs = [&](const std::string& name, const char* expires = nullptr) {
    storebag::SignRequest request{privateKey, bag, path(name), false};
    if (expires) request.expires = expires;
    EXPECT_TRUE(storebag::sign(request).done);
    return path(name);
  };
  const std::string served = path("served"), good = signedAs("mivo"), late = signedAs("late", "2001-01-01");
  const auto publish = [&](const std::vector<std::string>& files) {
    return storebag::publish({files, served, publicKey});
  };
  EXPECT_THAT(refusal(publish({good, signedAs("other/mivo")})), HasSubstr("mivo: is given twice"));
  EXPECT_FALSE(std::filesystem::exists(served));
  EXPECT_THAT(refusal(publish({good, late})), HasSubstr("late: expired on 2001-01-01"));
  ASSERT_TRUE(storebag::keygen(path("keys"), 0, true).done);
  EXPECT_THAT(refusal(storebag::publish({{good}, served, publicKey, path("keys/ed25519.der")})),
              HasSubstr("no Ed25519 signature"));
  EXPECT_FALSE(std::filesystem::exists(served + "/mivo"));
  // What cannot be read says nothing about its serial.
  std::filesystem::create_directories(served + "/mivo");
  EXPECT_THAT(refusal(publish({good})), HasSubstr("not a regular file"));
  std::filesystem::remove(served + "/mivo");
  file("served/mivo", "no storebag");
  ASSERT_TRUE(publish({good}).done);

  const std::pair<std::vector<std::string>, const char*> names[] = {
      {{"mivo", "mivo"}, "mivo: is given twice"},
      {{"../served/mivo"}, "expected the name of a storebag"},
      {{"mivo", "nothing"}, "served/nothing: nothing was published before"}};
  for (const auto& [given, reason] : names) {
    EXPECT_THAT(refusal(storebag::rollback({given, served, true})), HasSubstr(reason));
    EXPECT_NE(read("served/mivo"), "no storebag");
  }
  EXPECT_THAT(refusal(storebag::rollback({{"mivo"}, path("nowhere")})),
              HasSubstr("nothing was published there"));
  EXPECT_FALSE(std::filesystem::exists(path("nowhere")));
}

TEST_F(StorebagCommands, OneHasTheFolderAtATime) {
  std::optional folder(storebag::ServedFolder::open(path("served"), true));
  ASSERT_TRUE(folder->ok());
  const FileDescriptor other(::open(path("served/.before").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_NE(::flock(other.get(), LOCK_EX | LOCK_NB), 0);
  folder.reset();
  EXPECT_EQ(::flock(other.get(), LOCK_EX | LOCK_NB), 0);
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
