// SPDX-License-Identifier: Apache-2.0
// A session for tests of the room ipc that answers every call. The connection's own thread.
#pragma once

#include "wire/client_session_interface.h"

namespace veltrad {

class AnsweringSession : public wire::ClientSessionInterface {
 public:
  std::size_t calls = 0;

  bool setSessionInfo(wire::OptionalDictionary, wire::OptionalDictionary, std::optional<Array>,
                      bool) override {
    return ++calls > 0;
  }
  void startConfigWithCompletionHandler(wire::NamesReply reply) override {
    answer(reply, std::vector<std::string>{"x"});
  }
  void fetchStatesWithUserInfo(wire::OptionalDictionary, wire::NamesReply reply) override {
    answer(reply, std::nullopt);
  }
  void fetchDisplayURL(wire::StringReply reply) override { answer(reply, "URL not available"); }
  void sendMessageWithCategory(std::uint16_t, std::uint16_t, wire::OptionalDictionary d,
                               wire::SentReply reply) override {
    answer(reply, d && d->string("text") ? std::optional(*d->string("text")) : std::nullopt,
           wire::Outcomes{});
  }
  void sendMessageWithDictionary(Dictionary, wire::SentReply) override { ++calls; }
  void flushMessagesWithCompletion(wire::FlushReply reply) override {
    answer(reply, "flushed", std::nullopt);
  }
  void finishSessionWithReply(wire::StringReply reply) override { answer(reply, std::nullopt); }
  void uploadFileAtPath(std::string, std::string, wire::BooleanReply reply) override { answer(reply, true); }
  void uploadLogData(Array data, wire::UploadLogDataReply reply) override {
    answer(reply, data.empty(), wire::makeReportingError("refused", 403));
  }
  void sendMessageWithSessionInfo(wire::OptionalDictionary, wire::OptionalDictionary, std::uint16_t,
                                  std::uint16_t, wire::OptionalDictionary, wire::SentReply reply) override {
    answer(reply, "finished", wire::Outcomes{});
  }
  void end() override {}
  std::string description() const override { return "answering session"; }

 private:
  template <typename R, typename... Results>
  void answer(const R& reply, Results... results) {
    ++calls;
    if (reply) reply(std::move(results)...);
  }
};

}  // namespace veltrad
