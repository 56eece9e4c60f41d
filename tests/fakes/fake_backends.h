// Backends that keep what they are asked, and answer as the test says. The test's thread.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "fakes/fake_random.h"

namespace veltrad {

class FakeBackend final : public VeltraBackend {
 public:
  struct Message {
    std::optional<Dictionary> payload;
    std::uint16_t method, respCode, eventID;
    std::int32_t flag;
  };

  FakeBackend(const std::string& name, const Dictionary& profile, FakeRandom& random)
      : VeltraBackend(name, profile, "", random) {
    if (const std::string* text = profile.string("answer")) answer = *text;
    if (const std::string* url = profile.string("url")) setDisplayURL(*url);
    nextState = profile.int32("state").value_or(kBackendReporting);
  }
  void updateState() override {
    ++updates;
    setState(nextState);
    setHierarchy(profile().int32("hierarchy").value_or(0));
    setSamplingThreshold(profile().real("threshold"));
  }
  using VeltraBackend::sendMessage;
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue, std::uint16_t method,
                                         std::uint16_t respCode, std::uint16_t eventID,
                                         std::int32_t flag) override {
    messages.push_back(
        {payload ? std::optional<Dictionary>(*payload) : std::nullopt, method, respCode, eventID, flag});
    return answer;
  }
  std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion) override {
    flush = std::move(completion);
    ++flushes;
    return std::nullopt;
  }
  void cleanup() override { cleaned = true; }

  std::vector<Message> messages;
  std::optional<std::string> answer;
  FlushCompletion flush;
  std::int32_t nextState = kBackendReporting;
  int updates = 0;
  int flushes = 0;
  bool cleaned = false;
};

// Knows every name but "unknown".
class FakeBackendFactory final : public BackendFactory {
 public:
  std::shared_ptr<VeltraBackend> newBackendWithName(const std::string& name, const Value& profile,
                                                    const std::optional<std::string>&,
                                                    std::int32_t) override {
    if (name == "unknown") return nullptr;
    const Dictionary* dictionary = profile.asDictionary();
    return last[name] = std::make_shared<FakeBackend>(name, dictionary ? *dictionary : Dictionary{}, _random);
  }
  std::map<std::string, std::shared_ptr<FakeBackend>> last;

 private:
  FakeRandom _random;
};

}  // namespace veltrad
