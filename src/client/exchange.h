// SPDX-License-Identifier: Apache-2.0
// The calls and answers of one session, over all its successive connections.
#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "base/file_descriptor.h"
#include "client/answer_reader.h"
#include "client/call_table.h"
#include "client/calls.h"
#include "client/out_frames.h"
#include "client/reconnection.h"
#include "client/sent_record.h"

namespace veltrad::client {

struct ConnectionOptions {
  // The path of the daemon's socket.
  std::string path;
  // The time that a daemon has to greet, and that a waiting call waits for a connection.
  std::chrono::milliseconds patience;
  std::size_t queueBytes;
  // Both run on the connection's thread, and may be empty. Gets an event's body:
  std::function<void(const Dictionary&)> event;
  std::function<void(const StateChange&)> state;
};

// Combines the four parts of a session: writing (OutFrames), open calls (CallTable), the record of what was
// sent (SentRecord), and reconnecting (Reconnection). Used under its connection's lock; never waits. The
// thread that reads the socket also reports its end, so that answers and a "goodbye" before the end are not
// lost.
class Exchange {
 public:
  using Phase = Reconnection::Phase;

  // `description` is absent for a session that is not described on connecting. `options` must outlive it.
  Exchange(const ConnectionOptions& options, Phase first, const std::optional<SessionChange>& description);

  // A connection on which the hellos and the description were exchanged.
  void adopt(FileDescriptor socket);
  // Takes the connected socket of an attempt, on which no frame was sent yet.
  void attempted(FileDescriptor socket);
  void attemptFailed(const std::string& why);
  // The daemon's hello did not arrive in time.
  void greetingFailed();

  // Sends the call, or lets it wait. A waiter gets the call's ID.
  veltra_status add(OutCall call, CallTable::Call to);
  // Counts a call that is not taken.
  veltra_status refuse(veltra_status why) { return _out.refuse(why); }
  // Ends a call that was not written, if there is still no connection.
  void withdraw(Waiter& waiter);
  void writeWaiting();
  void take(std::vector<Arrived>& arrived);
  // The socket has ended. reset: the daemon has not read everything.
  void ended(bool reset);

  // No more calls are taken; what waits is still to be written.
  void beginClosing();
  // True if nothing is left to write and no answer is expected.
  bool drained() const;
  void finish();

  Phase phase() const { return _wish.phase(); }
  bool connected() const { return _wish.connected(); }
  const Reconnection& wish() const { return _wish; }
  CallTable& calls() { return _calls; }
  int socket() const { return _socket.get(); }
  bool writing() const { return _out.writing(); }
  // True if frames are expected that no waiting thread reads.
  bool expectsFrames() const;
  // In a forked child: closes its copy of the socket.
  void abandon() { _socket.reset(); }

  veltra_statistics statistics() const;
  std::uint64_t counter(veltra_counter which);
  // Calls that were lost since the counter was last read.
  std::uint64_t untoldLoss() const { return _record.untold(); }

 private:
  enum class Closing { no, draining, halfClosed };

  void greeted();
  void started(const veltra_reply& answer);
  void takeAnswer(Arrived arrived);
  void takeEvent(Dictionary event);
  void disconnect(const std::string& why);
  void giveUp();
  void closeHalf();
  void tell(veltra_connection_state state, const char* why = nullptr, ValuePointer backends = nullptr);

  const ConnectionOptions& _options;
  FileDescriptor _socket;
  SentRecord _record;
  OutFrames _out;
  CallTable _calls;
  Reconnection _wish;
  unsigned _added = 0;
  // The last call that starts the session; 0 if there is none.
  std::uint32_t _startID = 0;
  std::uint64_t _connections = 0;
  // The description in the daemon's refusal or "goodbye" that precedes the end.
  std::string _lastWords;
  Closing _closing = Closing::no;
};

}  // namespace veltrad::client
