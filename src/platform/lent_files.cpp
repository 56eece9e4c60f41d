// SPDX-License-Identifier: Apache-2.0
// Lent files by token.
#include "platform/lent_files.h"

#include "platform/uuid.h"

namespace veltrad::platform {

LentFiles::Loan LentFiles::lend(FileDescriptor file, pid_t lender, std::function<bool()> askForRemoval) {
  std::string token = randomUUIDText();
  auto lent = std::make_shared<const LentFile>(std::move(file), lender, std::move(askForRemoval));
  const Lock held(_mutex);
  _files.emplace(token, std::move(lent));
  return Loan(*this, std::move(token));
}

std::shared_ptr<const LentFile> LentFiles::consume(const std::string& token) const {
  const Lock held(_mutex);
  const auto found = _files.find(token);
  return found != _files.end() ? found->second : nullptr;
}

void LentFiles::takeBack(const std::string& token) {
  std::shared_ptr<const LentFile> last;  // destroyed after the lock was released
  const Lock held(_mutex);
  const auto found = _files.find(token);
  if (found == _files.end()) return;
  last = std::move(found->second);
  _files.erase(found);
}

}  // namespace veltrad::platform
