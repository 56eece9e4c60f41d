// The names that daemon, library and storebags share. Constants; any thread.
#pragma once

namespace veltrad::wire {

// The service and the entitlement that a client must hold (a boolean true).
inline constexpr const char* kVeltraServiceName = "com.florn.veltrad";
inline constexpr const char* kVeltraEntitlement = "com.florn.private.veltrad";

// What a peer of the control socket must hold; root and the daemon's own user need neither. "control"
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

// Session info dictionary.
inline constexpr const char* kVeltraSessionInfoSessionID = "sessionID";              // unsigned 32-bit
inline constexpr const char* kVeltraSessionInfoClientType = "clientType";            // signed 32-bit
inline constexpr const char* kVeltraSessionInfoClientVersion = "clientVersion";      // unsigned 16-bit
inline constexpr const char* kVeltraSessionInfoRequireUserInfo = "requireUserInfo";  // boolean
inline constexpr const char* kVeltraSessionInfoBatchEvent = "batchEvent";            // boolean

// User info dictionary.
inline constexpr const char* kVeltraUserInfoClientName = "clientName";    // text
inline constexpr const char* kVeltraUserInfoServiceName = "serviceName";  // text

// Message dictionary.
inline constexpr const char* kVeltraMessageParametersCategory =
    "category";                                                      // unsigned 32-bit, low 16 bits used
inline constexpr const char* kVeltraMessageParametersType = "type";  // unsigned 32-bit, low 16 bits used
inline constexpr const char* kVeltraMessageParametersPayload = "payload";  // dictionary
inline constexpr const char* kVeltraMessageParametersFlag = "flag";        // unsigned 32-bit

}  // namespace veltrad::wire
