// The platform transaction: open while the daemon serves, so that a stop drains first. Any thread.
#pragma once

#include <atomic>

namespace veltrad::platform {

class ServiceManager;

class Transaction {
 public:
  virtual ~Transaction() = default;
  // Strictly alternating; anything else is a broken invariant.
  virtual void open() = 0;
  virtual void close() = 0;
};

// Tells the service manager, as STATUS text, whether sessions are served.
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
