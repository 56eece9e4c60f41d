// SPDX-License-Identifier: Apache-2.0
// Writes records and steps.
#include "backends/https/spool_notes.h"

#include <memory>
#include <string_view>
#include <utility>

#include "config/owner_gate.h"
#include "http/header_lines.h"
#include "platform/fate_pen.h"
#include "support/spool_entry.h"

namespace veltrad::backends {

bool SpoolNotes::keepsRecords() const {
  return _gate.keepsRecords();
}

void SpoolNotes::record(const support::SpoolEntry& post, int transmissions, http::DepartureEnd end) const {
  if (!keepsRecords()) return;
  const http::Departure departure{http::Departure::Kind::post,
                                  post.url,
                                  post.events,
                                  post.body.size(),
                                  std::make_shared<const Dictionary>(post.client),
                                  post.about};
  end.transmissions = transmissions;
  const std::string host = http::addressOf(post.url).substr(std::string_view("https://").size());
  auto lines = http::sentLines(host, http::headerLines(post.headers, post.body.size()));
  _gate.ended(_gate.record(departure, std::move(lines), post.body, nullptr), end);
}

void SpoolNotes::note(wire::Step step, const NotedPost& post, std::optional<wire::Reason> reason,
                      int status) const {
  if (post.number == 0) return;
  wire::StepEntry entry;
  entry.post = post.number;
  entry.status = static_cast<std::uint16_t>(status);
  platform::FatePen(_fates, wire::kBackendNames[post.backend]).write(step, reason, entry);
}

void SpoolNotes::kept(const NotedPost& post, const std::string& error, double wait) const {
  if (post.number == 0) return;
  const platform::FatePen pen(_fates, wire::kBackendNames[post.backend]);
  wire::StepEntry entry;
  entry.post = post.number;
  entry.text = pen.textOf(error);
  entry.bytes = static_cast<std::uint32_t>(wait);
  pen.write(wire::Step::kept, wire::Reason::kept_in_spool, entry);
}

}  // namespace veltrad::backends
