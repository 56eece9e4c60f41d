// SPDX-License-Identifier: Apache-2.0
// Envelopes and datagrams from anyone: what is accepted becomes whole rows, which COPY can read.
#include <algorithm>
#include <cstdlib>

#include "gateway/datagram_receiver.h"
#include "gateway/envelope.h"
#include "gateway/table_rows.h"
#include "tools/dashboard_packet.h"

namespace {

using namespace veltrad;

void mustBeRows(const std::string& rows, std::size_t count, std::size_t columns) {
  const auto lines = static_cast<std::size_t>(std::count(rows.begin(), rows.end(), '\n'));
  const auto tabs = static_cast<std::size_t>(std::count(rows.begin(), rows.end(), '\t'));
  if (lines + (count > 0) != count || tabs != count * (columns - 1) || rows.find('\0') != std::string::npos)
    std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  const std::string text(reinterpret_cast<const char*>(bytes), size);
  gateway::StreamMessage message;
  gateway::TableRows rows;
  if (const auto envelope = gateway::parseEnvelope(text)) {
    if (!rows.addEvents(message, text)) std::abort();
    mustBeRows(rows.events, envelope.value().events.size(), 13);
  }
  if (!tools::problemOfPacket(text)) {
    message.body = gateway::messageOfDatagram(text).body;
    if (!rows.addDatagram(message)) std::abort();
    mustBeRows(rows.datagrams, 1, 11);
  }
  return 0;
}
