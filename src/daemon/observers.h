// SPDX-License-Identifier: Apache-2.0
// Answers the questions of administrators on the control socket.
#pragma once

#include <memory>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "config/preference_editor.h"
#include "daemon/metrics.h"
#include "daemon/privacy.h"
#include "daemon/services.h"
#include "ipc/connection.h"
#include "platform/fate_ring.h"

namespace veltrad::backends {
class PostSpool;
}  // namespace veltrad::backends

namespace veltrad::ipc {
class Listener;
}  // namespace veltrad::ipc

namespace veltrad::daemon {

class Doctor;
class VeltradAgent;

// Used by the threads of all observers' connections. Questions open neither a session nor a transaction. The
// arguments of the constructor, the listener of clients included, must outlive it.
class Observers final : public ipc::ListenerDelegate {
 public:
  // `started`: of the process, seconds since 1970.
  Observers(Services& services, VeltradAgent& agent, ipc::Listener& clients, Doctor& doctor, Privacy& privacy,
            platform::FateRing& fates, backends::PostSpool* spool, double started);

  // Accepts every peer; each question checks its entitlement.
  bool listener(ipc::Listener& listener, const std::shared_ptr<ipc::Connection>& connection) override;

  // Any thread.
  Gauges gauges();
  // The sum of all counts, which only grow.
  std::uint64_t countsTotal() const { return _services.counters.total(); }
  std::string metricsText();

 private:
  class Desk;
  struct Question;
  using Answer = Result<Dictionary, std::string>;  // or one line that says what is wrong

  static const Question* questionNamed(const std::string& name);
  Answer status(const Dictionary& arguments);
  Answer sessions(const Dictionary& arguments);
  Answer metrics(const Dictionary& arguments);
  Answer versions(const Dictionary& arguments);
  Answer preferences(const Dictionary& arguments);
  Answer setPreference(const Dictionary& arguments);
  Answer unsetPreference(const Dictionary& arguments);
  Answer refresh(const Dictionary& arguments);
  Answer doctor(const Dictionary& arguments, Desk& desk);
  Answer fates(const Dictionary& arguments);
  Answer contents(const Dictionary& arguments, Desk& desk);
  Answer privacy(const Dictionary&) { return _privacy.show(); }
  Answer turnReportingOff(const Dictionary&) { return _privacy.turnOff(); }
  Answer turnReportingOn(const Dictionary&) { return _privacy.turnOn(); }
  Answer resetIdentifiers(const Dictionary&) { return _privacy.resetIdentifiers(); }
  Answer history(const Dictionary& arguments);
  Answer historyBody(const Dictionary& arguments);
  Answer purgeHistory(const Dictionary& arguments);
  Answer spool(const Dictionary& arguments);
  Answer sendSpool(const Dictionary& arguments);
  Answer dropFromSpool(const Dictionary& arguments);
  double now() const;

  Services& _services;
  VeltradAgent& _agent;
  ipc::Listener& _clients;
  Doctor& _doctor;
  Privacy& _privacy;
  platform::FateRing& _fates;
  backends::PostSpool* const _spool;  // may be null
  const double _started;
  config::PreferenceEditor _preferences;
};

}  // namespace veltrad::daemon
