// SPDX-License-Identifier: Apache-2.0
// libveltra-testing for C++20: a header-only interface to testing.h, whose rules apply.
//
//   veltra::testing::Daemon daemon;
//   veltra::Session session{{.clientType = 7, .root = daemon.root()}};
//   session.send(5, 1, {{"codec", "opus"}});
//   assert(daemon.wait(1) && daemon.message(0).payload.item("codec").string() == "opus");
#ifndef VELTRA_TESTING_HPP
#define VELTRA_TESTING_HPP

#include <veltra/testing.h>

#include <chrono>
#include <string>
#include <veltra/veltra.hpp>

namespace veltra::testing {

struct Message {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::uint32_t flag = 0;
  // Dictionaries, or nothing.
  Value payload;
  Value sessionInfo;
  Value userInfo;
};

// A daemon that runs as long as this exists. If it could not be started, it is false, and error() says why.
class Daemon {
 public:
  Daemon() {
    char* why = nullptr;
    _daemon = veltra_testing_start(&why);
    if (why) _error = why;
    veltra_free(why);
  }
  Daemon(const Daemon&) = delete;
  ~Daemon() { veltra_testing_stop(_daemon); }

  explicit operator bool() const { return _daemon != nullptr; }
  const std::string& error() const { return _error; }
  std::string root() const { return _daemon ? veltra_testing_root(_daemon) : ""; }

  bool wait(std::size_t count, std::chrono::milliseconds timeout = std::chrono::seconds(5)) {
    return _daemon && veltra_testing_wait(_daemon, count, static_cast<std::uint32_t>(timeout.count()));
  }
  std::size_t count() { return _daemon ? veltra_testing_count(_daemon) : 0; }
  // Empty if there is none of this number.
  Message message(std::size_t index) {
    const Value found = Value::share(_daemon ? veltra_testing_message(_daemon, index) : nullptr);
    return {static_cast<std::uint16_t>(found.item("category").asUnsigned()),
            static_cast<std::uint16_t>(found.item("type").asUnsigned()),
            static_cast<std::uint32_t>(found.item("flag").asUnsigned()),
            found.item("payload"),
            found.item("sessionInfo"),
            found.item("userInfo")};
  }

  void refuse(const std::string& text) {
    if (_daemon) veltra_testing_refuse(_daemon, text.c_str());
  }
  void acceptAgain() {
    if (_daemon) veltra_testing_refuse(_daemon, nullptr);
  }
  void delay(std::chrono::milliseconds time) {
    if (_daemon) veltra_testing_delay(_daemon, static_cast<std::uint32_t>(time.count()));
  }
  bool restart() { return _daemon && veltra_testing_restart(_daemon); }

 private:
  veltra_testing_daemon* _daemon = nullptr;
  std::string _error;
};

}  // namespace veltra::testing

#endif
