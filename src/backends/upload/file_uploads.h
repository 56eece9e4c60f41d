// SPDX-License-Identifier: Apache-2.0
// Limits how many files are uploaded at the same time. Any thread.
#pragma once

#include <chrono>
#include <cstddef>
#include <list>
#include <map>
#include <memory>
#include <optional>
#include <utility>

#include "base/mutex.h"
#include "base/value.h"
#include "http/http_client.h"

namespace veltrad::backends {

// One object serves all upload back ends, which it outlives. An upload holds a place from the first byte read
// until the server's answer. One user never holds all places.
class FileUploads {
 public:
  static constexpr std::size_t kMostAtOnce = 3;
  static constexpr std::size_t kMostOfOneUser = 2;
  // All clients without an account count as one user.
  using User = std::optional<unsigned>;

  // The clients whose files wait for a place or are being compressed.
  using Preparing = std::list<std::shared_ptr<const Dictionary>>;
  Preparing preparing() {
    const Lock held(_mutex);
    return _preparing;
  }

  // Its destructor frees the place.
  class Place {
   public:
    Place(FileUploads& uploads, User user, Preparing::iterator file)
        : _uploads(&uploads), _user(user), _file(file) {}
    Place(Place&& other) noexcept
        : _uploads(std::exchange(other._uploads, nullptr)), _user(other._user), _file(other._file) {}
    Place& operator=(Place&&) = delete;
    ~Place() {
      if (_uploads) _uploads->leave(_user, _file);
    }
    // From here on, the HTTP client knows of the file.
    void requests() { _uploads->prepared(_file); }

   private:
    FileUploads* _uploads;
    User _user;
    std::optional<Preparing::iterator> _file;
  };

  // Waits for a place. Places are given in order of arrival, passing over users that have their share.
  // Nothing if the daemon is stopping.
  std::optional<Place> enter(User user, const http::HTTPClient& http,
                             const std::shared_ptr<const Dictionary>& client = nullptr) {
    const auto [self, file] = arrive(user, client);
    while (true) {
      const bool stopping = http.stopping();
      const Lock held(_mutex);
      if (stopping || isNext(self)) {
        _waiting.erase(self);
        _changed.notifyAll();
        if (stopping) {
          _preparing.erase(file);
          return std::nullopt;
        }
        ++_underWay;
        ++_ofUser[user];
        return std::optional<Place>(std::in_place, *this, user, file);
      }
      _changed.waitUntil(_mutex, std::chrono::steady_clock::now() + kLookAgain);
    }
  }

 private:
  using Waiting = std::list<User>;
  static constexpr std::chrono::milliseconds kLookAgain{100};

  std::pair<Waiting::iterator, Preparing::iterator> arrive(User user,
                                                           const std::shared_ptr<const Dictionary>& client) {
    const Lock held(_mutex);
    return {_waiting.insert(_waiting.end(), user), _preparing.insert(_preparing.end(), client)};
  }
  void prepared(std::optional<Preparing::iterator>& file) {
    const Lock held(_mutex);
    if (file) _preparing.erase(*file);
    file.reset();
  }
  bool hasShare(User user) const REQUIRES(_mutex) {
    const auto found = _ofUser.find(user);
    return found != _ofUser.end() && found->second >= kMostOfOneUser;
  }
  bool isNext(Waiting::const_iterator self) const REQUIRES(_mutex) {
    if (_underWay == kMostAtOnce) return false;
    for (auto at = _waiting.begin(); at != _waiting.end(); ++at) {
      if (!hasShare(*at)) return at == self;
    }
    return false;
  }
  void leave(User user, std::optional<Preparing::iterator>& file) {
    prepared(file);
    const Lock held(_mutex);
    --_underWay;
    if (--_ofUser[user] == 0) _ofUser.erase(user);
    _changed.notifyAll();
  }

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::size_t _underWay GUARDED_BY(_mutex) = 0;
  std::map<User, std::size_t> _ofUser GUARDED_BY(_mutex);
  // In order of arrival.
  Waiting _waiting GUARDED_BY(_mutex);
  Preparing _preparing GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
