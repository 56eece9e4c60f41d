// A transaction that counts; an open or close out of turn fails the test. Any thread.
#pragma once

#include <gtest/gtest.h>

#include <atomic>

#include "platform/transaction.h"

namespace veltrad {

class FakeTransaction final : public platform::Transaction {
 public:
  void open() override {
    EXPECT_FALSE(_isOpen.exchange(true)) << "the transaction was opened twice";
    ++_opened;
  }
  void close() override {
    EXPECT_TRUE(_isOpen.exchange(false)) << "the transaction was closed while not open";
  }

  bool isOpen() const { return _isOpen; }
  int opened() const { return _opened; }

 private:
  std::atomic<bool> _isOpen{false};
  std::atomic<int> _opened{0};
};

}  // namespace veltrad
