// SPDX-License-Identifier: Apache-2.0
// An adaptor bundle with the fault that FAULT names; tests/e2e/test_adaptor.py has the expected result of
// each.
#include <veltra/adaptor.h>

#include <cstdlib>
#include <stdexcept>

namespace {

enum Fault {
  otherVersion,
  otherClass,
  noInstance,
  noOperation,
  throwsAtCreation,
  throws,
  exits,
  exitsQuickly
};

int instance;

void* create() {
  if (FAULT == throwsAtCreation) throw std::runtime_error("no creation today");
  return FAULT == noInstance ? nullptr : &instance;
}

void destroy(void*) {
  if (FAULT == throws) throw 42;
}

void send(void*, std::uint16_t, std::uint16_t, const veltra_adaptor_value*) {
  if (FAULT == exits) std::exit(0);
  if (FAULT == exitsQuickly) std::quick_exit(0);
  throw std::runtime_error("no message today");
}

const veltra_adaptor_operation operations[] = {{FAULT == noOperation ? "send" : VELTRA_ADAPTOR_SEND, send}};
const veltra_adaptor_class classes[] = {
    {FAULT == otherClass ? "Adaptor" : VELTRA_ADAPTOR_CLASS, create, destroy, 1, operations}};

}  // namespace

const veltra_adaptor_bundle veltra_adaptor = {
    FAULT == otherVersion ? VELTRA_ADAPTOR_VERSION + 1u : VELTRA_ADAPTOR_VERSION, 1, classes};
