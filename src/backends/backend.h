// VeltraBackend: the base of every reporting backend. Its session's thread configures it, sends and flushes;
// other sessions' threads and the HTTP thread reach the properties, which are guarded.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/lock_ranks.h"
#include "base/mutex.h"
#include "base/value.h"
#include "platform/clock.h"
#include "wire/error.h"

namespace veltrad::platform {
class MemoryAccount;
class Random;
}  // namespace veltrad::platform

namespace veltrad::backends {

using SharedDictionary = std::shared_ptr<const Dictionary>;

// State of a backend. 2 and 3 count as reporting for the client.
enum BackendState : std::int32_t {
  kBackendWaiting = 0,  // before the first updateState, or user info is required and missing
  kBackendDisabled = 1,
  kBackendReporting = 2,
  kBackendHeld = 3,  // sampled out, but held instead of disabled
};

// One backend of one session. It outlives its session only while work of its own is under way.
class VeltraBackend : public std::enable_shared_from_this<VeltraBackend> {
 public:
  // A result text or none, an error or none; may run on another thread, exactly once.
  using FlushCompletion =
      std::function<void(std::optional<std::string>, std::optional<wire::ReportingError>)>;

  virtual ~VeltraBackend() = default;
  VeltraBackend(const VeltraBackend&) = delete;
  VeltraBackend& operator=(const VeltraBackend&) = delete;

  // Lower-case hexadecimal SHA-256 of the text's UTF-8 bytes, 64 characters.
  static std::string convertIntoSHA256(std::string_view text);

  // Called before the session lets the backend go.
  virtual void cleanup() {}
  // "9.3" gives 9 and 3, "10" gives 10 and 0; each modulo 256.
  void setSelfVersion(const std::string& version);
  void setStartTimestamp(platform::TimeValue timestamp);
  virtual void updateState();

  // Numbers the message (1, 2, … 65535, 0, …) and passes it on. The text that comes back says what was sent.
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::int32_t flag);
  virtual std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                                 std::uint16_t method, std::uint16_t respCode,
                                                 std::uint16_t eventID, std::int32_t flag);
  // The base completes at once with neither text nor error. `completion` may be empty.
  virtual std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion);
  virtual bool uploadFileAtPath(const std::string& path, const std::string& extensionToken);
  virtual bool uploadLogData(const Array& logData);
  virtual void setCorrelatedSessionID(const std::string& sessionID);

  // Constant after construction.
  const std::string& name() const { return _name; }
  const std::string& productFamily() const { return _productFamily; }
  double samplingFactor() const { return _samplingFactor; }  // in [0, 1), drawn once

  // Set once by the session before the first updateState, constant afterwards.
  std::uint32_t sessionID() const { return _sessionID; }
  void setSessionID(std::uint32_t value) { _sessionID = value; }
  std::int32_t compType() const { return _compType; }
  void setCompType(std::int32_t value) { _compType = value; }
  std::uint16_t clientVersion() const { return _clientVersion; }
  void setClientVersion(std::uint16_t value) { _clientVersion = value; }
  const std::string& udid() const { return _udid; }  // a copy of the session's identifier text; may be empty
  void setUdid(std::string value) { _udid = std::move(value); }
  const std::optional<std::string>& productVersion() const { return _productVersion; }
  void setProductVersion(std::optional<std::string> value) { _productVersion = std::move(value); }
  const std::optional<std::string>& buildVersion() const { return _buildVersion; }
  void setBuildVersion(std::optional<std::string> value) { _buildVersion = std::move(value); }
  const std::optional<std::string>& hardwareType() const { return _hardwareType; }
  void setHardwareType(std::optional<std::string> value) { _hardwareType = std::move(value); }
  bool isInternal() const { return _isInternal; }
  void setIsInternal(bool value) { _isInternal = value; }
  bool requireUserInfo() const { return _requireUserInfo; }
  void setRequireUserInfo(bool value) { _requireUserInfo = value; }
  // Whom what it keeps is charged to; null: nobody.
  const std::shared_ptr<platform::MemoryAccount>& memoryAccount() const { return _memoryAccount; }
  void setMemoryAccount(std::shared_ptr<platform::MemoryAccount> value) { _memoryAccount = std::move(value); }
  double startTimeStamp() const { return _startTimeStamp; }  // seconds since 1970
  std::uint8_t selfVersionMajor() const { return _selfVersionMajor; }
  std::uint8_t selfVersionMinor() const { return _selfVersionMinor; }

  // Any thread, at any time.
  std::int32_t state() const { return _state.load(std::memory_order_relaxed); }
  void setState(std::int32_t value) { _state.store(value, std::memory_order_relaxed); }
  std::int32_t hierarchy() const { return _hierarchy.load(std::memory_order_relaxed); }
  void setHierarchy(std::int32_t value) { _hierarchy.store(value, std::memory_order_relaxed); }
  bool batchEvents() const { return _batchEvents.load(std::memory_order_relaxed); }
  void setBatchEvents(bool value) { _batchEvents.store(value, std::memory_order_relaxed); }
  SharedDictionary userInfoDict() const;  // null: none
  void setUserInfoDict(SharedDictionary value);
  std::optional<std::string> combinedSessionIDString() const;
  void setCombinedSessionIDString(std::optional<std::string> value);
  std::optional<std::string> displayURL() const;
  void setDisplayURL(std::optional<std::string> value);
  std::optional<double> samplingThreshold() const;
  void setSamplingThreshold(std::optional<double> value);

 protected:
  // Stores copies and draws the sampling factor. The kinds' initWithName(…) come here.
  VeltraBackend(std::string name, std::string productFamily, platform::Random& random);

 private:
  // Constant after construction.
  const std::string _name;
  const std::string _productFamily;
  const double _samplingFactor;

  // Constant after configuration.
  std::uint32_t _sessionID = 0;
  std::int32_t _compType = 0;
  std::uint16_t _clientVersion = 0;
  std::string _udid;
  std::optional<std::string> _productVersion;
  std::optional<std::string> _buildVersion;
  std::optional<std::string> _hardwareType;
  bool _isInternal = false;
  bool _requireUserInfo = false;
  double _startTimeStamp = 0;
  std::shared_ptr<platform::MemoryAccount> _memoryAccount;
  std::uint8_t _selfVersionMajor = 0;
  std::uint8_t _selfVersionMinor = 0;

  // The session's thread only.
  std::uint16_t _eventID = 0;

  // Each indivisible on its own.
  std::atomic<std::int32_t> _state{kBackendWaiting};
  std::atomic<std::int32_t> _hierarchy{0};
  std::atomic<bool> _batchEvents{false};

  mutable Mutex _propertyMutex BACKEND_LOCK;
  SharedDictionary _userInfoDict GUARDED_BY(_propertyMutex);
  std::optional<std::string> _combinedSessionIDString GUARDED_BY(_propertyMutex);
  std::optional<std::string> _displayURL GUARDED_BY(_propertyMutex);
  std::optional<double> _samplingThreshold GUARDED_BY(_propertyMutex);
};

}  // namespace veltrad::backends
