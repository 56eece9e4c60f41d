// SPDX-License-Identifier: Apache-2.0
// Names that the daemon, the library and storebags share.
#pragma once

namespace veltrad::wire {

// A client must hold this entitlement with the value true.
inline constexpr const char* kVeltraEntitlement = "com.florn.private.veltrad";

// The entitlements for peers of the control socket; root and the daemon's own user need neither. "control"
// includes "observe".
inline constexpr const char* kObserveEntitlement = "com.florn.veltrad.observe";
inline constexpr const char* kControlEntitlement = "com.florn.veltrad.control";

// Backend names: the keys of a storebag section.
inline constexpr const char* kVeltraBackendDashboard = "dashboard";
inline constexpr const char* kVeltraBackendUploadServer = "uploadserver";
inline constexpr const char* kVeltraBackendHTTPPost = "httppost";
inline constexpr const char* kVeltraBackendHTTPPost2 = "httppost2";
inline constexpr const char* kVeltraBackendAmpery = "ampery";
inline constexpr const char* kVeltraBackendMivo = "mivo";

inline constexpr const char* kVeltraErrorDomain = "com.florn.veltra.error";

// Keys of the session info: unsigned 32-bit, signed 32-bit, unsigned 16-bit, boolean, boolean.
inline constexpr const char* kVeltraSessionInfoSessionID = "sessionID";
inline constexpr const char* kVeltraSessionInfoClientType = "clientType";
inline constexpr const char* kVeltraSessionInfoClientVersion = "clientVersion";
inline constexpr const char* kVeltraSessionInfoRequireUserInfo = "requireUserInfo";
inline constexpr const char* kVeltraSessionInfoBatchEvent = "batchEvent";

// Keys of the user info that the daemon reads: texts.
inline constexpr const char* kVeltraUserInfoClientName = "clientName";
inline constexpr const char* kVeltraUserInfoServiceName = "serviceName";

// Keys of a message: unsigned 32-bit numbers, of which category and type use the low 16 bits, and a
// dictionary.
inline constexpr const char* kVeltraMessageParametersCategory = "category";
inline constexpr const char* kVeltraMessageParametersType = "type";
inline constexpr const char* kVeltraMessageParametersFlag = "flag";
inline constexpr const char* kVeltraMessageParametersPayload = "payload";

}  // namespace veltrad::wire
