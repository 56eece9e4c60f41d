// SPDX-License-Identifier: Apache-2.0
// The names in frames (docs/wire-protocol.md): operations, events and keys.
#pragma once

namespace veltrad::wire {

// The calls of a client.
namespace operation {
inline constexpr const char* kFetchDisplayURL = "fetchDisplayURL:";
inline constexpr const char* kFetchStates = "fetchStatesWithUserInfo:completionHandler:";
inline constexpr const char* kFinishSession = "finishSessionWithReply:";
inline constexpr const char* kFlushMessages = "flushMessagesWithCompletion:";
inline constexpr const char* kSendDictionary = "sendMessageWithDictionary:reply:";
inline constexpr const char* kSendMessage = "sendMessageWithCategory:type:payload:reply:";
inline constexpr const char* kSendOneShot =
    "sendMessageWithSessionInfo:userInfo:category:type:payload:reply:";
inline constexpr const char* kSetSessionInfo =
    "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:";
inline constexpr const char* kStartConfig = "startConfigWithCompletionHandler:";
inline constexpr const char* kUploadFile = "uploadFileAtPath:extensionToken:completionHandler:";
inline constexpr const char* kUploadLogData = "uploadLogData:completionHandler:";
}  // namespace operation

// Questions on the control socket.
namespace question {
inline constexpr const char* kConfig = "config";
inline constexpr const char* kContents = "contents";
inline constexpr const char* kDoctor = "doctor";
inline constexpr const char* kDropFromSpool = "dropFromSpool";
inline constexpr const char* kFates = "fates";
inline constexpr const char* kHistory = "history";
inline constexpr const char* kHistoryBody = "historyBody";
inline constexpr const char* kMetrics = "metrics";
inline constexpr const char* kPrivacy = "privacy";
inline constexpr const char* kPurgeHistory = "purgeHistory";
inline constexpr const char* kRefresh = "refresh";
inline constexpr const char* kResetIdentifiers = "resetIdentifiers";
inline constexpr const char* kSendSpool = "sendSpool";
inline constexpr const char* kSessions = "sessions";
inline constexpr const char* kSetConfig = "setConfig";
inline constexpr const char* kSpool = "spool";
inline constexpr const char* kStatus = "status";
inline constexpr const char* kTurnReportingOff = "turnReportingOff";
inline constexpr const char* kTurnReportingOn = "turnReportingOn";
inline constexpr const char* kUnsetConfig = "unsetConfig";
inline constexpr const char* kVersions = "versions";
}  // namespace question

// The checks of `veltractl doctor`, in their order. The first one is veltractl's own, the daemon decides the
// others.
namespace check {
inline constexpr const char* kNames[] = {
    "daemon",      "entitlement", "storebagAddress", "nameResolution", "trust",   "storebag",    "signature",
    "environment", "clientTypes", "consent",         "messageLog",     "sandbox", "descriptors", "clock"};
}  // namespace check

// Events that the daemon sends.
namespace event {
inline constexpr const char* kGoodbye = "goodbye";
inline constexpr const char* kRemoveUploadedFile = "removeUploadedFile:";
inline constexpr const char* kSendMessageToClient = "sendMessageToClient:timestamp:category:type:payload:";
}  // namespace event

namespace key {
// Of a hello.
inline constexpr const char* kDaemon = "daemon";
inline constexpr const char* kLibrary = "library";
inline constexpr const char* kWire = "wire";

// Of a call or an event.
inline constexpr const char* kArguments = "args";
inline constexpr const char* kOperation = "op";

// Of a reply. The error also occurs in a refusal and in results.
inline constexpr const char* kError = "error";
inline constexpr const char* kResults = "results";

// Arguments.
inline constexpr const char* kCall = "call";
inline constexpr const char* kCalls = "calls";
inline constexpr const char* kCategory = "category";
inline constexpr const char* kData = "data";
inline constexpr const char* kFrameworksToCheck = "frameworksToCheck";
inline constexpr const char* kHasAggregationBlock = "hasAggregationBlock";
inline constexpr const char* kMessage = "message";
inline constexpr const char* kPath = "path";
inline constexpr const char* kPayload = "payload";
inline constexpr const char* kSessionInfo = "sessionInfo";
inline constexpr const char* kTimestamp = "timestamp";
inline constexpr const char* kType = "type";
inline constexpr const char* kUserInfo = "userInfo";

// Results.
inline constexpr const char* kBackends = "backends";
inline constexpr const char* kOutcomes = "outcomes";
inline constexpr const char* kReply = "reply";
inline constexpr const char* kUploaded = "uploaded";

// Of an outcome.
inline constexpr const char* kBackend = "backend";
inline constexpr const char* kOutcome = "outcome";
inline constexpr const char* kReason = "reason";
inline constexpr const char* kText = "text";
}  // namespace key

}  // namespace veltrad::wire
