// SPDX-License-Identifier: Apache-2.0
// A body that is kept whole while it is received, unpacked and within bounds.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "gateway/request_router.h"
#include "support/gunzip.h"

namespace veltrad::gateway {

class BufferedBody {
 public:
  // `charge` is what it is charged without its bytes. `most`: of the body as it comes and unpacked, in bytes.
  BufferedBody(const HandlerServices& services, Charge charge, bool packed, std::uint64_t most);

  // Takes the next bytes from the front; an answer refuses them.
  std::optional<Answer> add(std::string_view& bytes);
  // After the last byte: a gzip stream that is cut short is refused.
  std::optional<Answer> end();
  const std::string& text() const { return _text; }
  // Leaves it empty.
  std::string take();
  // Forgets everything: what is charged from now on, to the end, is the message. False: there is no room for
  // it.
  bool becomes(const Message& message);

 private:
  bool keep(std::string_view bytes);

  const HandlerServices& _services;
  const std::uint64_t _most;
  Charge _charge;
  const std::uint64_t _chargedWithoutText;
  std::optional<support::Gunzip> _gunzip;
  std::string _text;
  std::uint64_t _received = 0;
};

}  // namespace veltrad::gateway
