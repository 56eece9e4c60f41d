// SPDX-License-Identifier: Apache-2.0
// Files that clients lend to the daemon for the duration of one call, each under a random token. Any thread.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "wire/file_origin.h"

namespace veltrad::platform {

// A client's open file. The daemon never opens a path that a client names.
class LentFile {
 public:
  // `askForRemoval` returns true if the request was sent.
  LentFile(FileDescriptor file, pid_t lender, std::function<bool()> askForRemoval)
      : _file(std::move(file)), _lender(lender), _askForRemoval(std::move(askForRemoval)) {}

  int descriptor() const { return _file.get(); }
  // To be checked before the descriptor is used.
  wire::FileOrigin origin() const { return wire::FileOrigin::of(_file.get(), _lender); }
  // Asks the client to remove its file, which the client may refuse; does not wait. False if the client
  // cannot be asked.
  [[nodiscard]] bool askForRemoval() const { return _askForRemoval(); }

 private:
  const FileDescriptor _file;
  const pid_t _lender;
  const std::function<bool()> _askForRemoval;
};

// Keeps each lent file under its token until the loan ends. Must outlive its loans. Its lock is a leaf.
class LentFiles {
 public:
  // Removes the token when it ends. A file that was consumed before stays open.
  class Loan {
   public:
    Loan(LentFiles& files, std::string token) : _files(files), _token(std::move(token)) {}
    ~Loan() { _files.takeBack(_token); }
    Loan(const Loan&) = delete;
    const std::string& token() const { return _token; }

   private:
    LentFiles& _files;
    const std::string _token;
  };

  [[nodiscard]] Loan lend(FileDescriptor file, pid_t lender, std::function<bool()> askForRemoval);
  // Null if nothing is lent under this token.
  std::shared_ptr<const LentFile> consume(const std::string& token) const;

 private:
  void takeBack(const std::string& token);

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::shared_ptr<const LentFile>> _files GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
