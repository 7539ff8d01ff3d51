#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string_view>
#include <tuple>

#include "backends/GateObserver.h"
#include "connectivity/ReportingSessionConnectivityInterface.h"
#include "foundation/ExtensionToken.h"
#include "foundation/Value.h"
#include "platform/Dispatch.h"
#include "platform/Mutex.h"
#include "util/ProcessContext.h"

namespace telvane {

// What a backend does with events; clients are told the names of those that are enabled.
enum TelvaneBackendState : uint32_t {
  TelvaneBackendStateUnknown = 0,   // waits for user info; events are batched
  TelvaneBackendStateDisabled = 1,  // events are dropped
  TelvaneBackendStateEnabled = 2,
  TelvaneBackendStateSampledOut = 3,  // events are held until a promoting message arrives
};

// The product type of desktop devices, which have no wireless diagnostics.
inline constexpr std::string_view kDesktopProductType = "Desktop";

// One destination of a session's events. This base holds the identity, the state with its queue, the event lists, and
// a default for every operation; a kind of destination overrides what it supports.
//
// Made by newBackendWithName, owned by its session (shared, since completions of posts may outlive the session's hold).
// Operations are called by the session, one at a time on its connection's queue. What other sessions of the hierarchy
// call from their threads is safe from any: state, setState, the combined session identifier, the sampling threshold
// and batchedEventsSize. Plain fields are written before the first event or by the owning session only; a flush reads
// them on the state queue, but on the thread of its caller, the session.
class TelvaneBackend : public std::enable_shared_from_this<TelvaneBackend> {
 public:
  // The text for the message log and the client, or nothing; an error or nothing.
  using FlushCompletion = UniqueFunction<void(std::optional<String> text, std::optional<Error> error)>;

  // Makes the backend that the name stands for; null (and an error line) for an unknown name, null when the profile
  // lacks what its kind needs.
  static std::shared_ptr<TelvaneBackend> newBackendWithName(const ProcessContext& context, const String& name,
                                                            const Value& profile,
                                                            const std::optional<String>& productFamily,
                                                            uint32_t clientType);
  virtual ~TelvaneBackend();
  TelvaneBackend(const TelvaneBackend&) = delete;
  TelvaneBackend& operator=(const TelvaneBackend&) = delete;

  // Releases external resources before the session lets go.
  virtual void cleanup();
  void setReportingSessionConnectivityDelegate(std::weak_ptr<ReportingSessionConnectivityInterface> delegate);
  // version: "major.middle.minor"; each is read as an integer and cut to 8 bits, a missing one is 0.
  void setSelfVersion(std::string_view version);
  uint32_t state() const;
  // Takes effect behind what the state queue still has to do.
  void setState(uint32_t state);
  // Decides the state anew and returns it.
  virtual uint32_t updateState();
  // Takes one event. blob: see kTelvaneMessageBlob keys; given away, its payload becomes the event without a copy.
  // Returns a text for the message log, or nothing.
  virtual std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                            uint16_t eventID, uint32_t flag);
  // The same with the backend's next event number (the first is 1; wraps at 65536).
  std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode, uint32_t flag);
  void setStartTimestamp(Date timestamp);
  // completion may be empty; it is called at most once, from any thread.
  virtual std::optional<String> flushMessagesWithCompletion(FlushCompletion completion);
  // Returns whether this kind uploads files and took this one. extensionToken: the client's right to read it, borrowed
  // for the length of the call.
  virtual bool uploadFileAtPath(const String& path, const ExtensionToken& extensionToken);
  virtual bool uploadLogData(const Array& logData);
  virtual void setCorrelatedSessionID(const String& combinedSessionID);
  bool isWhitelistedEvent(uint16_t method) const;
  bool isBlacklistedEvent(uint16_t method) const;
  virtual uint64_t batchedEventsSize() const;
  // Whether this is exactly the HTTPS kind, which alone takes part in the client's event lists as such.
  virtual bool isHTTPSPostBackend() const noexcept { return false; }

  // SHA-256 of the text's bytes as 64 lowercase hexadecimal digits.
  static String convertIntoSHA256(std::string_view text);

  // Identity and configuration, set by createBackends and the session.
  const String& name() const noexcept { return _name; }
  const std::optional<String>& displayURL() const noexcept { return _displayURL; }
  void setSessionID(uint32_t sessionID) { _sessionID = sessionID; }
  void setCompType(uint32_t compType) { _compType = compType; }
  void setClientVersion(uint16_t clientVersion) { _clientVersion = clientVersion; }
  uint16_t clientVersion() const noexcept { return _clientVersion; }
  void setUdid(String udid) { _udid = std::move(udid); }
  void setProductVersion(std::optional<String> version) { _productVersion = std::move(version); }
  void setBuildVersion(std::optional<String> version) { _buildVersion = std::move(version); }
  void setHardwareType(std::optional<String> type) { _hardwareType = std::move(type); }
  void setIsInternal(bool isInternal) { _isInternal = isInternal; }
  void setRequireUserInfo(bool require) { _requireUserInfo = require; }
  bool requireUserInfo() const noexcept { return _requireUserInfo; }
  void setBatchEvents(bool batchEvents) { _batchEvents = batchEvents; }
  bool batchEvents() const noexcept { return _batchEvents; }
  void setAllowNestedData(bool allow) { _allowNestedData = allow; }
  bool allowNestedData() const noexcept { return _allowNestedData; }
  // An absent value, or anything but a dictionary, means no user info.
  virtual void setUserInfoDict(const Value& userInfo);
  void setCombinedSessionIDString(String combinedSessionID);
  std::optional<String> combinedSessionIDString() const;
  void setDigestKey(const Value& digestKey) { _digestKey = digestKey; }
  void setDigestAlgorithm(int32_t algorithm) { _digestAlgorithm = algorithm; }
  double samplingFactor() const noexcept { return _samplingFactor; }
  // An absent value means no threshold.
  Value samplingThreshold() const EXCLUDES(_samplingLock);
  void setSamplingThreshold(Value threshold) EXCLUDES(_samplingLock);
  // Absent, or an array of numbers.
  const Value& eventWhitelist() const noexcept { return _eventWhitelist; }
  const Value& eventBlacklist() const noexcept { return _eventBlacklist; }
  // Lets somebody hear how the next updateState() decides; null for nobody, which costs nothing. The observer outlives
  // the backend, or is taken away before.
  void setGateObserver(GateObserver* observer) noexcept { _gateObserver = observer; }

 protected:
  TelvaneBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily);

  Log& log() const noexcept { return _context.log(); }
  // Splits "major.middle.minor"; each is read as an integer and cut to 8 bits, a missing one is 0.
  static std::tuple<uint8_t, uint8_t, uint8_t> versionComponents(std::string_view version);
  // The framework's version as events carry it: "major.middle", and ".minor" unless that is 0. Kept ready, since every
  // event has it.
  const String& selfVersionText() const noexcept { return _selfVersionText; }

  // Constant after construction.
  const ProcessContext& _context;
  const Dictionary _profile;
  const String _name;
  const String _productFamily;
  const double _samplingFactor;  // this backend's draw in [0, 0.9999]
  const std::shared_ptr<SerialQueue> _stateQueue;

  // Guarded by the state queue.
  uint32_t _state GUARDED_BY(*_stateQueue) = TelvaneBackendStateUnknown;
  std::optional<String> _combinedSessionIDString GUARDED_BY(*_stateQueue);

  // Guarded by its lock, because a parent session sets it in its children.
  mutable Mutex _samplingLock;
  Value _samplingThreshold GUARDED_BY(_samplingLock);

  // Written by the owning session only.
  std::optional<String> _productVersion;
  std::optional<String> _buildVersion;
  std::optional<String> _hardwareType;
  double _startTimeStamp = 0;  // seconds since 1970
  uint32_t _sessionID = 0;
  uint32_t _compType = 0;
  uint16_t _clientVersion = 0;
  uint16_t _eventID = 0;
  uint8_t _selfVersionMajor = 0;
  uint8_t _selfVersionMiddle = 0;
  uint8_t _selfVersionMinor = 0;
  String _selfVersionText;
  bool _isInternal = false;
  bool _requireUserInfo = false;
  bool _shouldUseWiFiOnly = false;
  bool _batchEvents = false;
  bool _allowNestedData = false;
  bool _includeSessionIDInHeader = false;
  std::optional<Dictionary> _userInfoDict;
  String _udid;
  std::optional<String> _displayURL;
  Value _eventWhitelist;
  Value _eventBlacklist;
  GateObserver* _gateObserver = nullptr;
  Value _digestKey;
  int32_t _digestAlgorithm = 0;
  std::weak_ptr<ReportingSessionConnectivityInterface> _reportingSessionConnectivityDelegate;

  // Synchronised by themselves.
  std::atomic<uint32_t> _totalBytesSent{0};
  std::atomic<uint32_t> _bytesSentSinceLastReport{0};
};

}  // namespace telvane
