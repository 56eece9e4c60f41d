// SPDX-License-Identifier: Apache-2.0
// A fake HTTP client: a function answers blocking requests; posts are not allowed. Any thread.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <utility>

#include "http/http_client.h"

namespace veltrad {

class FakeHTTPClient final : public http::HTTPClient {
 public:
  using Answerer = std::function<http::HTTPResult(http::HTTPRequest)>;
  explicit FakeHTTPClient(Answerer answerer = nullptr) : _answerer(std::move(answerer)) {}

  Result<Done, http::HTTPError> start(http::HTTPRequest request, http::HTTPCompletion) override {
    ADD_FAILURE() << "a post to " << request.url;
    return Done();
  }
  http::HTTPResult perform(http::HTTPRequest request) override { return _answerer(std::move(request)); }

 private:
  const Answerer _answerer;
};

}  // namespace veltrad
