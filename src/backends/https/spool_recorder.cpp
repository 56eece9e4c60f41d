// SPDX-License-Identifier: Apache-2.0
// Writes records and steps.
#include "backends/https/spool_recorder.h"

#include <memory>
#include <string_view>
#include <utility>

#include "config/owner_gate.h"
#include "http/header_lines.h"
#include "platform/fate_writer.h"
#include "support/spool_index.h"

namespace veltrad::backends {

bool SpoolRecorder::keepsRecords() const {
  return _gate.keepsRecords();
}

void SpoolRecorder::record(const support::SpoolEntry& post, int transmissions, http::DepartureEnd end) const {
  if (!keepsRecords()) return;
  const http::Departure departure{http::Departure::Kind::post,
                                  post.url,
                                  post.events,
                                  post.body.size(),
                                  std::make_shared<const Dictionary>(post.client),
                                  post.about};
  end.transmissions = transmissions;
  const std::string host(http::authorityOf(post.url));
  auto lines = http::sentLines(host, http::headerLines(post.headers, post.body.size()));
  _gate.ended(_gate.record(departure, std::move(lines), post.body, nullptr), end);
}

void SpoolRecorder::note(wire::Step step, const support::SpoolPlace& post, std::optional<wire::Reason> reason,
                         wire::StepEntry entry) const {
  if (post.fate == 0) return;
  entry.post = post.fate;
  platform::FateWriter(_fates, wire::kBackendNames[post.backend]).write(step, reason, entry);
}

void SpoolRecorder::answered(const support::SpoolPlace& post, wire::Reason reason, int status) const {
  wire::StepEntry entry;
  entry.status = static_cast<std::uint16_t>(status);
  note(wire::Step::answered, post, reason, entry);
}

void SpoolRecorder::kept(const support::SpoolPlace& post, const std::string& error, double wait) const {
  if (post.fate == 0) return;
  wire::StepEntry entry;
  entry.text = platform::FateWriter(_fates, {}).textOf(error);
  entry.bytes = static_cast<std::uint32_t>(wait);
  note(wire::Step::kept, post, wire::Reason::kept_in_spool, entry);
}

}  // namespace veltrad::backends
