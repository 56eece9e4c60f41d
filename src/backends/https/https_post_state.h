// SPDX-License-Identifier: Apache-2.0
// The reporting state of an HTTPS post back end for its current client. The session's thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "backends/backend.h"
#include "backends/https/client_decision.h"
#include "backends/https/filter_table.h"
#include "backends/https/post_identity.h"
#include "backends/https/post_links.h"
#include "config/storebag_content.h"
#include "platform/locale.h"

namespace veltrad::backends {

// Part of its back end: reads the back end's facts and sets its hierarchy and sampling threshold. A value
// that an update does not set stays.
class HTTPSPostState {
 public:
  // `profile` has "clients".
  HTTPSPostState(VeltraBackend& backEnd, std::shared_ptr<const config::HTTPSPostProfile> profile,
                 platform::Locale& locale, platform::Counters& counters,
                 const PostIdentity::Sources& identity)
      : _backEnd(backEnd),
        _profile(std::move(profile)),
        _locale(locale),
        _counters(counters),
        _identity(identity),
        _links(identity.preferences) {}

  // The state for the present user info.
  StateVerdict updateBackendState();

  bool batchEvents(const SessionFacts& facts) const { return _batchEvents.value_or(facts.batchEvents); }
  void renewIdentifiers() { _identity.renewIdentifiers(); }
  void rereadConsent() { _identity.rereadConsent(); }
  const PostIdentity& identity() const { return _identity; }
  const PostLinks& links() const { return _links; }
  const FilterTable& filters() const { return _filters; }
  std::int32_t eventThreshold() const { return _eventThreshold; }
  // The number of the client entry that holds; nothing: none does.
  std::optional<std::size_t> entry() const { return _match.entry; }
  const std::optional<double>& overrideSampling() const { return _overrideSampling; }
  // The match with the client entry that decides or, if the session requires no user info, provides the
  // address.
  const ClientMatch& match() const { return _match; }

 private:
  void applyExpedite(const config::ClientEntry& entry);
  StateVerdict counted(std::int32_t state, wire::Reason reason);
  StateVerdict reportForEveryone();
  StateVerdict reportForClient(const config::ClientEntry& entry, const std::optional<std::string>& clientName,
                               const std::optional<std::string>& serviceName);
  void logRefusal(const config::ClientEntry& entry, const ClientVerdict& verdict,
                  const std::optional<std::string>& country) const;
  void takeSampling(const ClientVerdict& verdict, const std::optional<std::string>& country);
  void resetBackendStateWithClient(const config::ClientEntry* entry);

  VeltraBackend& _backEnd;
  const std::shared_ptr<const config::HTTPSPostProfile> _profile;
  platform::Locale& _locale;
  platform::Counters& _counters;

  PostIdentity _identity;
  PostLinks _links;
  FilterTable _filters;
  // From an entry's "expedite".
  std::optional<bool> _batchEvents;
  std::int32_t _eventThreshold = 49;
  std::optional<double> _overrideSampling;
  ClientMatch _match;
};

}  // namespace veltrad::backends
