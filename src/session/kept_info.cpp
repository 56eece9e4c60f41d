// SPDX-License-Identifier: Apache-2.0
// Keeps a dictionary together with its charge.
#include "session/kept_info.h"

#include "platform/memory_budget.h"
#include "wire/constants.h"

namespace veltrad::session {

namespace {
struct Kept {
  Dictionary info;
  platform::Charge charge;
};

// The families keep three keys that contain these names.
std::size_t keyBytes(const Dictionary& info) {
  std::size_t bytes = 0;
  for (const char* name : {wire::kVeltraUserInfoClientName, wire::kVeltraUserInfoServiceName}) {
    if (const std::string* text = info.string(name)) bytes += 3 * text->size();
  }
  return bytes;
}
}  // namespace

backends::SharedDictionary keptInfo(Dictionary info,
                                    const std::shared_ptr<platform::MemoryAccount>& account) {
  auto kept = std::make_shared<Kept>();
  if (account) {
    auto charge = account->keep(sizeof(Kept) + keptBytes(info) + keyBytes(info));
    if (!charge) return nullptr;
    kept->charge = std::move(*charge);
  }
  kept->info = std::move(info);
  return {kept, &kept->info};
}

bool sameClient(const Dictionary& current, const Dictionary& updated) {
  for (const char* key : {wire::kVeltraUserInfoClientName, wire::kVeltraUserInfoServiceName}) {
    const std::string* before = current.string(key);
    const std::string* now = updated.string(key);
    if (!before || !now || *before != *now) return false;
  }
  return true;
}

}  // namespace veltrad::session
