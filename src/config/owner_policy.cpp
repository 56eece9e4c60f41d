// SPDX-License-Identifier: Apache-2.0
// Chooses the valid content of policy.json. Any thread.
#include "config/owner_policy.h"

namespace veltrad::config {

namespace {
std::shared_ptr<const Policy> policyIn(const platform::LocalContent& content,
                                       const std::shared_ptr<const Policy>&, SettingsLines& lines) {
  using Kind = platform::LocalContent::Kind;
  if (content.warning) lines.warnings.push_back("Policy: " + *content.warning);
  if (content.kind == Kind::absent) return std::make_shared<const Policy>();
  std::string error = content.error;
  auto policy = content.kind == Kind::good ? Policy::of(content, error) : nullptr;
  if (policy) return policy;
  lines.errors.push_back("Policy could not be read, nothing leaves: " + error);
  return Policy::closed();
}
}  // namespace

OwnerPolicy::OwnerPolicy(platform::FileStore& files, const std::string& path)
    : SettingsFollower(files, path, policyIn, Policy::closed()) {}

}  // namespace veltrad::config
