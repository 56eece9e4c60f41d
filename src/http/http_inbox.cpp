// The HTTP thread's inbox. Any thread.
#include "http/http_inbox.h"

namespace veltrad::http {

HTTPInbox::Added HTTPInbox::add(Transfers& transfer) {
  const Lock lock(_mutex);
  if (transfer.front()->lane() == HTTPRequest::Lane::event) {
    if (_events >= kMostEvents) return Added::refused;
    ++_events;
  }
  ++_underWay;
  _arrived.splice(_arrived.end(), transfer);
  return _arrived.size() == 1 ? Added::first : Added::more;
}

void HTTPInbox::failBlocking() {
  const Lock lock(_mutex);
  _failBlocking = true;
}

bool HTTPInbox::blockingFails() const {
  const Lock lock(_mutex);
  return _failBlocking;
}

void HTTPInbox::stop(bool forGood) {
  const Lock lock(_mutex);
  _stopping = true;
  _last = _last || forGood;
}

bool HTTPInbox::waitUntilIdle(Time deadline) {
  const Lock lock(_mutex);
  while (_underWay != 0) {
    if (!_changed.waitUntil(_mutex, deadline)) return _underWay == 0;
  }
  return true;
}

std::uint64_t HTTPInbox::addEmptyTask() {
  const Lock lock(_mutex);
  return ++_tasksAdded;
}

bool HTTPInbox::waitForEmptyTask(std::uint64_t task, Time deadline) {
  const Lock lock(_mutex);
  while (_tasksPassed < task) {
    if (!_changed.waitUntil(_mutex, deadline)) return _tasksPassed >= task;
  }
  return true;
}

std::size_t HTTPInbox::events() const {
  const Lock lock(_mutex);
  return _events;
}

HTTPInbox::Taken HTTPInbox::take() {
  Taken taken;
  const Lock lock(_mutex);
  taken.transfers.swap(_arrived);
  taken.failBlocking = _failBlocking;
  taken.stopping = _stopping;
  taken.last = _last;
  if (_tasksPassed != _tasksAdded) {
    _tasksPassed = _tasksAdded;
    _changed.notifyAll();
  }
  return taken;
}

void HTTPInbox::ended(HTTPRequest::Lane lane) {
  if (lane != HTTPRequest::Lane::event) return;
  const Lock lock(_mutex);
  --_events;
}

void HTTPInbox::completed() {
  const Lock lock(_mutex);
  if (--_underWay == 0) _changed.notifyAll();
}

}  // namespace veltrad::http
