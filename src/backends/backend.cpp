// The base behaviour of every backend.
#include "backends/backend.h"

#include <openssl/evp.h>

#include <cstdlib>

#include "base/text.h"
#include "platform/random.h"

namespace veltrad::backends {

VeltraBackend::VeltraBackend(std::string name, std::string productFamily, platform::Random& random)
    : _name(std::move(name)), _productFamily(std::move(productFamily)), _samplingFactor(random.uniform()) {}

std::string VeltraBackend::convertIntoSHA256(std::string_view text) {
  unsigned char digest[32];
  unsigned length = 0;
  if (EVP_Digest(text.data(), text.size(), digest, &length, EVP_sha256(), nullptr) != 1) std::abort();
  return hex({reinterpret_cast<const char*>(digest), length});
}

void VeltraBackend::setSelfVersion(const std::string& version) {
  const auto leadingInteger = [](const std::string& text) {
    return static_cast<std::uint8_t>(std::strtoll(text.c_str(), nullptr, 10));
  };
  const std::size_t dot = version.find('.');
  _selfVersionMajor = leadingInteger(version.substr(0, dot));
  _selfVersionMinor = dot == std::string::npos ? std::uint8_t{0} : leadingInteger(version.substr(dot + 1));
}

void VeltraBackend::setStartTimestamp(platform::TimeValue timestamp) {
  _startTimeStamp = platform::timevalToSeconds(timestamp);
}

void VeltraBackend::updateState() {
  setState(kBackendReporting);
}

std::optional<std::string> VeltraBackend::sendMessage(const Dictionary* payload,
                                                      platform::TimeValue timestamp, std::uint16_t method,
                                                      std::uint16_t respCode, std::int32_t flag) {
  ++_eventID;
  return sendMessage(payload, timestamp, method, respCode, _eventID, flag);
}

std::optional<std::string> VeltraBackend::sendMessage(const Dictionary*, platform::TimeValue, std::uint16_t,
                                                      std::uint16_t, std::uint16_t, std::int32_t) {
  return std::nullopt;
}

std::optional<std::string> VeltraBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (completion) completion(std::nullopt, std::nullopt);
  return std::nullopt;
}

bool VeltraBackend::uploadFileAtPath(const std::string&, const std::string&) {
  return false;
}

bool VeltraBackend::uploadLogData(const Array&) {
  return false;
}

void VeltraBackend::setCorrelatedSessionID(const std::string& sessionID) {
  setCombinedSessionIDString(sessionID);
}

SharedDictionary VeltraBackend::userInfoDict() const {
  const Lock held(_propertyMutex);
  return _userInfoDict;
}

void VeltraBackend::setUserInfoDict(SharedDictionary value) {
  const Lock held(_propertyMutex);
  _userInfoDict = std::move(value);
}

std::optional<std::string> VeltraBackend::combinedSessionIDString() const {
  const Lock held(_propertyMutex);
  return _combinedSessionIDString;
}

void VeltraBackend::setCombinedSessionIDString(std::optional<std::string> value) {
  const Lock held(_propertyMutex);
  _combinedSessionIDString = std::move(value);
}

std::optional<std::string> VeltraBackend::displayURL() const {
  const Lock held(_propertyMutex);
  return _displayURL;
}

void VeltraBackend::setDisplayURL(std::optional<std::string> value) {
  const Lock held(_propertyMutex);
  _displayURL = std::move(value);
}

std::optional<double> VeltraBackend::samplingThreshold() const {
  const Lock held(_propertyMutex);
  return _samplingThreshold;
}

void VeltraBackend::setSamplingThreshold(std::optional<double> value) {
  const Lock held(_propertyMutex);
  _samplingThreshold = value;
}

}  // namespace veltrad::backends
