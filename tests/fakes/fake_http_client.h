// The HTTP client's twin: answers what waits by a function; nobody may post. Any thread.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <utility>

#include "platform/http_client.h"

namespace veltrad {

class FakeHTTPClient final : public platform::HTTPClient {
 public:
  using Answerer = std::function<platform::HTTPResult(platform::HTTPRequest)>;
  explicit FakeHTTPClient(Answerer answerer = nullptr) : _answerer(std::move(answerer)) {}

  std::optional<platform::HTTPError> start(platform::HTTPRequest request, platform::HTTPCompletion) override {
    ADD_FAILURE() << "a post to " << request.url;
    return std::nullopt;
  }
  platform::HTTPResult perform(platform::HTTPRequest request) override {
    return _answerer(std::move(request));
  }

 private:
  const Answerer _answerer;
};

}  // namespace veltrad
