// Files that clients lend to the daemon for the time of one call: each is known by a random token. Any
// thread.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "wire/file_origin.h"

namespace veltrad::platform {

// A client's open file: the daemon's only way to it, whatever path the client names. Closed with its last
// owner.
class LentFile {
 public:
  // `askForRemoval` is true where the request is on its way.
  LentFile(FileDescriptor file, pid_t lender, std::function<bool()> askForRemoval)
      : _file(std::move(file)), _lender(lender), _askForRemoval(std::move(askForRemoval)) {}

  int descriptor() const { return _file.get(); }
  // To be asked before anything else is done with the descriptor.
  wire::FileOrigin origin() const { return wire::FileOrigin::of(_file.get(), _lender); }
  // Asks the lender to remove its file, without waiting; the lender may refuse. False: it cannot be asked.
  [[nodiscard]] bool askForRemoval() const { return _askForRemoval(); }

 private:
  const FileDescriptor _file;
  const pid_t _lender;
  const std::function<bool()> _askForRemoval;
};

// Job: keeps what is lent under its token until the loan ends. Outlives its loans. Its lock is a leaf.
class LentFiles {
 public:
  // What its lender holds; its end takes the token back. Who has consumed it by then keeps the file.
  class Loan {
   public:
    Loan(LentFiles& files, std::string token) : _files(files), _token(std::move(token)) {}
    ~Loan() { _files.takeBack(_token); }
    Loan(const Loan&) = delete;
    Loan& operator=(const Loan&) = delete;
    const std::string& token() const { return _token; }

   private:
    LentFiles& _files;
    const std::string _token;
  };

  [[nodiscard]] Loan lend(FileDescriptor file, pid_t lender, std::function<bool()> askForRemoval);
  // Null: nothing is lent under this token.
  std::shared_ptr<const LentFile> consume(const std::string& token) const;

 private:
  void takeBack(const std::string& token);

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::shared_ptr<const LentFile>> _files GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
