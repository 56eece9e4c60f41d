// SPDX-License-Identifier: Apache-2.0
// The platform transaction, which is open while the daemon serves sessions.
#pragma once

#include <atomic>

namespace veltrad::platform {

class ServiceManager;

class Transaction {
 public:
  virtual ~Transaction() = default;
  // Must alternate.
  virtual void open() = 0;
  virtual void close() = 0;
};

// Tells the service manager whether sessions are served. A second open() or close() aborts.
class ServiceTransaction final : public Transaction {
 public:
  explicit ServiceTransaction(ServiceManager& manager) : _manager(manager) {}
  void open() override;
  void close() override;

 private:
  ServiceManager& _manager;
  std::atomic<bool> _isOpen{false};
};

}  // namespace veltrad::platform
