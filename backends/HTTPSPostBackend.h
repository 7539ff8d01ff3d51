#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "backends/EventFilter.h"
#include "backends/TelvaneBackend.h"

namespace telvane {

// A collector that takes events as JSON over HTTPS. The storebag section decides whether this device reports at all,
// what is filtered, and where events go; events go out one by one or in batches, by the session's choice.
//
// Made by initWithName through the factory; threads as in the base. The batch, its counts and the state change together
// on the state queue; flushes run there, on the caller's thread. Posts are handed to the connectivity helper and
// forgotten: an answer touches only the state and the flush's completion, also when this object is long gone.
//
// At most 50 events of one method wait (the storebag may say otherwise), and of all together what is estimated at 8
// MiB: an event that would come above either flushes the others first. Where such a flush has to wait for user info,
// the events that find no room are dropped, with one error line per burst. A failed post loses its events; a server
// error (500 to 599) disables the backend. The first flush that gave text freezes the configuration.
class HTTPSPostBackend final : public TelvaneBackend {
 public:
  // Null without a profile that lists clients (one error line when only the list is missing) or a product family.
  static std::shared_ptr<HTTPSPostBackend> initWithName(const ProcessContext& context, const String& name,
                                                        const Value& profile,
                                                        const std::optional<String>& productFamily);
  ~HTTPSPostBackend() override;

  // Reads the storebag section anew: consent, country, device, sampling, filters, lists, URLs.
  uint32_t updateState() override;
  using TelvaneBackend::sendMessage;
  std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID, uint32_t flag) override;
  // The completion comes with the server's answer; at once, on the caller's thread, when there is nothing to post.
  std::optional<String> flushMessagesWithCompletion(FlushCompletion completion) override;
  // Also corrects the events that wait.
  void setCorrelatedSessionID(const String& combinedSessionID) override;
  uint64_t batchedEventsSize() const override;
  bool isHTTPSPostBackend() const noexcept override { return true; }

 private:
  static constexpr int32_t kDefaultEventThreshold = 49;
  // The estimated bytes of events that wait together. One larger event may wait alone.
  static constexpr uint64_t kMaximumBatchBytes = 8u << 20;
  // The estimated bytes that user info may add to a batch, one copy for each event.
  static constexpr uint64_t kMaximumUserInfoBytes = 32u << 20;

  // How the user's consent to diagnostics and the client entry go together; the number is told to the collector.
  enum class DNUType : int32_t { Respected = 0, OverriddenWithoutConsent = 1, OverriddenWithConsent = 2 };

  // The session's names as matching sees them: null views when absent.
  struct SessionNames {
    std::string_view client;
    std::string_view service;
  };
  // What an event needs of the state queue, read in one visit.
  struct QueueState {
    uint32_t state = TelvaneBackendStateUnknown;
    bool hasBatch = false;
    Value sessionID;
  };
  struct PostMessage {
    std::string json;
    std::optional<String> prettyText;
  };
  struct FlushResult {
    std::optional<String> text;
    std::optional<Error> error;
  };
  struct EventNumbers {
    uint16_t method;
    uint16_t respCode;
    uint16_t eventID;
  };

  HTTPSPostBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily);

  // Configuration.
  void takeDefaultPostURLs();
  uint32_t updateBackendState();
  SessionNames sessionNames() const;
  void overrideBatching(const Array& clients, const SessionNames& names);
  uint32_t stateWithoutUserInfo(const Array& clients);
  bool hasUserInfo() const;
  // The entry that decides; null when there is none for this session.
  const Dictionary* matchingEntry(const Array& clients, const SessionNames& names) const;
  bool isMatchingEntry(const Value& entry, const SessionNames& names) const;
  uint32_t stateForClient(const Dictionary& client, const SessionNames& names);
  static bool matchClientName(const Dictionary& client, const SessionNames& names);
  static bool matchServiceID(const Dictionary& client, const SessionNames& names);
  static bool matchClientNameAndServiceID(const Dictionary& client, const SessionNames& names);
  bool isFrameworkEnabledForClient(const Dictionary& client) const;
  bool isConsentEnough(const Dictionary& client);
  bool isCountryListed(const Dictionary& client, const std::optional<String>& country) const;
  bool isProductFamilyListed(const Dictionary& client) const;
  bool isHardwareRefused(const Dictionary& client) const;
  bool createFilters(const Dictionary& client);
  void takeSamplingThreshold(const Dictionary& client, const std::optional<String>& country);
  void takeCountryThreshold(const Dictionary& client, const std::optional<String>& country);
  uint32_t sampledState(const Dictionary& client);
  uint32_t overriddenSampledState(const Dictionary& client);
  void resetBackendStateWithClient(const Dictionary* client);
  void takeCustomClientIdentifier(const Dictionary& client, const SessionNames& names);
  bool updatePostLink(const Dictionary& client);
  void updateRealtimePostLink(const Dictionary& client);
  void takeLists(const Dictionary& client);
  void takeSwitches(const Dictionary& client);
  // Tell the gate observer, if there is one; what is only told is made only then. passes() returns isPassed.
  void willLookAtEntry(std::optional<size_t> index) const;
  template <class Tested>
  void observe(Gate gate, GateOutcome outcome, const Tested& tested, const Value& against = Value::none()) const;
  template <class Tested>
  bool passes(Gate gate, bool isPassed, const Tested& tested, const Value& against = Value::none()) const;

  // Events.
  QueueState queueState() const;
  Dictionary newEventDictFromPayload(Dictionary blob, Date timestamp, const EventNumbers& numbers, Value sessionID);
  void addSessionStopEntries(Dictionary& payload);
  void addDeviceEntries(Dictionary& event) const;
  void prepareEvent(Dictionary& event, const Value& sharedData) const;
  int64_t timezoneOffset(Date timestamp);
  std::optional<String> sendStandaloneEvent(Dictionary event, const QueueState& before, const EventNumbers& numbers,
                                            uint32_t flag);
  std::optional<String> batchEvent(Dictionary event);
  bool countEvent(uint16_t method) REQUIRES(*_stateQueue);
  bool hasRoomFor(uint64_t bytes) const REQUIRES(*_stateQueue);
  // Flushes because of an event of this method, whose count begins anew.
  std::optional<String> flushForEvent(uint16_t method) REQUIRES(*_stateQueue);
  std::optional<String> flushForRoom(uint16_t method) REQUIRES(*_stateQueue);
  bool lacksUserInfo() const noexcept { return _requireUserInfo && !_userInfoDict.has_value(); }
  FlushResult flushOnStateQueue(FlushCompletion& completion) REQUIRES(*_stateQueue);
  // Ends the batch and returns its events.
  std::vector<Dictionary> takeBatch() REQUIRES(*_stateQueue);
  // Ends a burst of drops with its line.
  void tellDroppedEvents() REQUIRES(*_stateQueue);
  // Drops the newest events, with an error line, when user info that came after them would make them too large.
  void leaveRoomForUserInfo(std::vector<Dictionary>& events, const std::optional<Dictionary>& userInfo) const;
  // Returns the text, which the completion gets with the answer.
  std::optional<String> postBatch(PostMessage message, FlushCompletion& completion);
  std::vector<Dictionary> takeListedEvents(std::vector<Dictionary> events, const std::optional<Dictionary>& userInfo);
  std::optional<PostMessage> createMessageForPostAndLogging(std::vector<Dictionary> events);
  void removeWhatJSONCannotHold(Dictionary& event) const;
  bool isPrettyTextAllowed() const;
  String clientIdentifier() const;

  // Requests. numbers: of the one event that is posted, null for a batch. completion: may be empty.
  void postJSONMessage(std::string json, uint32_t flag, const EventNumbers* numbers, FlushCompletion completion);
  static void finishPost(const ProcessContext& context, const String& name,
                         const std::weak_ptr<TelvaneBackend>& weakSelf, const URLResponse* response,
                         const std::optional<Error>& error, FlushCompletion& completion);
  URLRequest newRequest(const String& url, std::string json, const EventNumbers* numbers);
  void addIdentityHeaders(URLRequest& request, const EventNumbers* numbers) const;
  // Chooses the body: compressed where that makes it smaller.
  void addBody(URLRequest& request, std::string json) const;
  void addSessionID(URLRequest& request) const;
  std::string_view senderName() const noexcept;

  // Written by the owning session only.
  std::optional<String> _postURL;
  bool _useDefaultPostURL = false;  // the URL comes from the user defaults, the storebag does not replace it
  std::optional<String> _realtimePostURL;
  bool _useDefaultRealtimePostURL = false;
  EventFilter _filters;
  bool _dnuEnabled = false;
  DNUType _dnuType = DNUType::Respected;
  int32_t _eventThreshold = kDefaultEventThreshold;
  int32_t _extrasOnInternal = 0;
  Value _overrideSampling;
  String _uuidRespectDnu;
  String _uuidOverrideDnu;
  std::optional<String> _uuidCustom;
  bool _forceEventLogging = false;
  bool _immutable = false;      // the configuration is frozen
  size_t _lastMessageSize = 0;  // bytes, so that the next body is not grown piece by piece
  int64_t _timezoneMinute = std::numeric_limits<int64_t>::min();  // the minute that the offset is of
  int64_t _timezoneOffset = 0;                                    // seconds east of GMT

  // Guarded by the state queue.
  std::optional<std::vector<Dictionary>> _batchedEvents GUARDED_BY(*_stateQueue);
  uint64_t _batchedBytes GUARDED_BY(*_stateQueue) = 0;   // estimated, of the events in the batch
  uint32_t _droppedEvents GUARDED_BY(*_stateQueue) = 0;  // for want of room, since the batch began
  std::unordered_map<uint16_t, int32_t> _eventMethodCounts GUARDED_BY(*_stateQueue);
};

}  // namespace telvane
