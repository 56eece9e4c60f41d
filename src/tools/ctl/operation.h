// The operations of a session as its lines and answers name them. Constants; any thread.
#pragma once

namespace veltrad::ctl {

enum class Operation {
  start,
  send,
  oneShot,
  flush,
  states,
  displayURL,
  uploadFile,
  uploadLogData,
  restart,
  sleep,
  finish
};

// The "op" of a line and of its answer.
constexpr const char* operationName(Operation operation) {
  switch (operation) {
    case Operation::start:
      return "start";
    case Operation::send:
      return "send";
    case Operation::oneShot:
      return "oneShot";
    case Operation::flush:
      return "flush";
    case Operation::states:
      return "states";
    case Operation::displayURL:
      return "displayURL";
    case Operation::uploadFile:
      return "uploadFile";
    case Operation::uploadLogData:
      return "uploadLogData";
    case Operation::restart:
      return "restart";
    case Operation::sleep:
      return "sleep";
    case Operation::finish:
      return "finish";
  }
  return "";
}

}  // namespace veltrad::ctl
