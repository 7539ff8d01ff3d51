#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "backends/TelvaneBackend.h"
#include "backends/UDPPacketToSend.h"
#include "platform/DatagramSocket.h"
#include "platform/dispatch/RepeatingTimer.h"
#include "util/Places.h"

namespace telvane {

// A live dashboard that takes each event as one UDP datagram. The profile, or whoever makes it, names the dashboard's
// address; nobody's consent is asked, its state is always enabled. The format and the schedule are in
// docs/dashboard-protocol.md.
//
// Made by initWithName through the factory; threads as in the base. An event becomes its datagram on the caller's
// thread; the socket and what waits to be sent belong to the network queue. uploadLogData blocks its caller until the
// server has answered, or until it is clear that it cannot; the answer comes on the connectivity helper's queue, so the
// caller must be another one. Log data are uploads like files: they take one of the process's places for as long
// (RunningUploads), are refused when there is none, and wait no more when the process is to end.
//
// In reliable mode the server acknowledges each datagram by its event ID, and one that it does not acknowledge is sent
// again 2, 3, 5 and 9 periods after the time before, then given up. What could not be sent at all is tried each period.
// At most 50 datagrams wait; one more drops the oldest.
//
// The period is 500 ms, or in a profile the value of "reliable" in milliseconds. It is bounded, so that no bag makes a
// device busy with nothing or a session's end endless: 0 and less count as 500 ms, less than 10 ms as 10 ms, more than
// a minute as a minute.
//
// Let go of without cleanup it stops at once. After cleanup it goes on until nothing waits any more, for 9.5 s from the
// next tick of the timer at most, and the jobs of that clean-up keep it so long. A transaction is held from each event
// until its datagram was tried once, but not while acknowledgements are awaited: a dashboard that is not there does not
// keep the process from ending.
class DashboardBackend final : public TelvaneBackend {
 public:
  static constexpr std::chrono::milliseconds kDefaultPeriod{500};
  static constexpr std::chrono::milliseconds kShortestPeriod{10};
  static constexpr std::chrono::milliseconds kLongestPeriod{60000};
  static constexpr std::chrono::milliseconds kLastResort{9500};
  static constexpr size_t kMostPackets = 50;
  static constexpr size_t kLongestLogLine = 1151;   // bytes
  static constexpr size_t kLongestLocation = 4096;  // bytes

  // Takes the address from the profile. Each form returns null, with an error line, when there is no address, or no
  // socket can be had or connected to it.
  static std::shared_ptr<DashboardBackend> initWithName(const ProcessContext& context, const String& name,
                                                        const Value& profile,
                                                        const std::optional<String>& productFamily);
  // Without a profile; always reliable. Null without an error line when there is no IP.
  static std::shared_ptr<DashboardBackend> initWithName(const ProcessContext& context, const String& name,
                                                        const std::optional<String>& serverIP, uint16_t serverPort,
                                                        const std::optional<String>& productFamily);
  // profile: absent, or the section that names the address; then the address given does not count.
  // serverIP: a dotted IPv4 address.
  static std::shared_ptr<DashboardBackend> initWithName(const ProcessContext& context, const String& name,
                                                        const Value& profile, const std::optional<String>& serverIP,
                                                        uint16_t serverPort,
                                                        const std::optional<String>& productFamily);
  ~DashboardBackend() override;

  using TelvaneBackend::sendMessage;
  // Sends the event's fields, which are what the client sent; what its hierarchy shares may be other clients' and stays
  // here. The flag means nothing.
  std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID, uint32_t flag) override;
  // Makes a datagram of the event's fields, hands it to the network queue and returns the event as one line for people
  // to read; nothing when there is no memory.
  std::optional<String> sendMessage(const Dictionary& event, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID);
  // Posts the array as an archive (platform/KeyedArchive.h) to the profile's "post_url" and waits for the answer, whose
  // body is the data's location, of at most kLongestLocation, which is then sent as an event. Returns whether that went
  // well; true without a connectivity helper, where nothing is posted.
  bool uploadLogData(const Array& logData) override;
  void cleanup() override;

  // The line of a datagram's bytes. REQUIRES: they begin with a header.
  static String writeLocalLog(std::span<const uint8_t> datagram);

 private:
  enum class CleanupState : uint32_t { Running = 0, Requested = 1, LastResortScheduled = 2 };
  // Where and how to send. address: nothing when what was given is none.
  struct Server {
    std::optional<IPv4SocketAddress> address;
    bool isReliable = false;
    std::chrono::milliseconds period = kDefaultPeriod;
  };

  DashboardBackend(const ProcessContext& context, const String& name, Dictionary profile, const String& productFamily,
                   bool usingProfile, std::unique_ptr<DatagramSocket> socket);
  std::shared_ptr<DashboardBackend> shared();
  std::weak_ptr<DashboardBackend> weak() { return shared(); }

  // Steps of the initialisers.
  static bool hasServer(Log& log, const Dictionary& profile);
  static Server serverOfProfile(const Dictionary& profile);
  // Returns false when the socket cannot be connected or there is no timer.
  bool start(const Server& server) EXCLUDES(*_networkProcQueue);
  void useReliableUDP() REQUIRES(*_networkProcQueue);
  bool connect(const Server& server) REQUIRES(*_networkProcQueue);
  bool startTimer() REQUIRES(*_networkProcQueue);

  // On the network queue.
  void tryToSendMsg(const uint8_t* bytes, size_t length, uint16_t eventNumber) REQUIRES(*_networkProcQueue);
  bool sendCompletely(const uint8_t* bytes, size_t length) REQUIRES(*_networkProcQueue);
  void processSocketRead() REQUIRES(*_networkProcQueue);
  void myPeriodicTask() REQUIRES(*_networkProcQueue);
  // What one tick does with a packet; each returns whether it is to be kept.
  bool checkPacket(UDPPacketToSend& packet) REQUIRES(*_networkProcQueue);
  bool checkUnacknowledged(UDPPacketToSend& packet) REQUIRES(*_networkProcQueue);
  bool checkUnsent(UDPPacketToSend& packet) REQUIRES(*_networkProcQueue);
  void continueCleanup() REQUIRES(*_networkProcQueue);
  void requestCleanup() REQUIRES(*_networkProcQueue);
  void scheduleLastResort() REQUIRES(*_networkProcQueue);
  void cleanupSources() REQUIRES(*_networkProcQueue);

  void logDataUploaded(const Data& answer);

  // Constant after construction.
  const bool _usingProfile;
  const std::shared_ptr<SerialQueue> _networkProcQueue;

  // Constant once it is started.
  bool _reliableUDP = false;
  std::chrono::milliseconds _period = kDefaultPeriod;
  std::optional<String> _postURL;

  // Confined to the network queue. The socket is null once closed; the read source's cancel handler holds it too.
  std::shared_ptr<DatagramSocket> _socket GUARDED_BY(*_networkProcQueue);
  std::vector<UDPPacketToSend> _messageQueue GUARDED_BY(*_networkProcQueue);  // oldest first
  std::unique_ptr<ReadSource> _readSource GUARDED_BY(*_networkProcQueue);     // in reliable mode
  std::unique_ptr<RepeatingTimer> _timer GUARDED_BY(*_networkProcQueue);
  CleanupState _cleanupState GUARDED_BY(*_networkProcQueue) = CleanupState::Running;
  Places::Place _lingering GUARDED_BY(*_networkProcQueue);  // after a cleanup that has to wait
};

}  // namespace telvane
