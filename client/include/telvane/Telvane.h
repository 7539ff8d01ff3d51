#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "foundation/Error.h"
#include "foundation/Export.h"
#include "foundation/UniqueFunction.h"
#include "foundation/Value.h"

// The client library of Telvane: how a process reports telemetry through the daemon telvaned.
//
//   auto session = telvane::Telvane::initWithSessionInfo(
//       telvane::Dictionary{{telvane::Key("ComponentType"), 7}, {telvane::Key("SessionID"), 1}});
//   if (session == nullptr) return;  // disabled, or not allowed to report
//   session->startConfigurationWithCompletionHandler({});
//   session->sendMessageWithCategory(12, 1, telvane::Dictionary{{telvane::Key("frames"), 30}});
//
// The keys of the dictionaries stand as constants in <telvane/TelvaneConstants.h>.
//
// What holds for everything here:
// - No call waits for the daemon. What the daemon answers comes through completions, which run on threads of the
//   library. A process needs no event loop for that.
// - A completion is called at most once. One that the daemon can no longer answer is let go uncalled, except where the
//   method says that it then gets an absent value or an error.
// - What a block of the caller throws is caught and written to the log.
// - A value that "may be absent" is given as telvane::Value(), or by leaving the argument out.
// - A child made by fork starts anew: it may make sessions of its own, while those made before the fork belong to the
//   parent. In the child they refuse everything, and letting them go there does not end them.
// - When the process ends, what was sent is still handed to the daemon, for which the end is held up by two seconds at
//   most; what the daemon has not taken by then is lost. Blocks of the caller are not called any more from then on.
// - The library's own lines go to the journal under "libtelvane", error lines unless the user default "clientLogLevel"
//   asks for more, and nowhere on a machine without a journal.
namespace telvane {

class ClientSession;
class Telvane;

// Hears of every message of a session that is well formed, also of those that are then filtered out. Owned by the
// caller; a session holds it weakly, and strongly only while it is being told. Told one message at a time, in order,
// on a thread of the library.
class TELVANE_EXPORT TelvaneMessageSentDelegate {
 public:
  virtual ~TelvaneMessageSentDelegate();
  // event: the message dictionary.
  virtual void didSendMessageForReportingClient(const std::shared_ptr<Telvane>& client, const Dictionary& event) = 0;
};

// One reporting session: a private line to the daemon, over which every message, flush, change of shared data and
// upload of this client travels.
//
// Made by initWithSessionInfo and owned by whoever holds the pointer. When the last pointer is let go, and everything
// sent before has been answered, the daemon is told to finish the session and the line is closed; letting go neither
// waits nor loses what waits by then. Safe from any thread.
//
// What may wait in this process for the daemon is bounded, so that a daemon that does not take events cannot eat the
// host: 8 MiB of a session's messages, log data and shared data in its own queue and 24 MiB of its calls in its
// connection, by estimate. Beyond that the newest is dropped, although the call that handed it over has returned true;
// no completion and no delegate is told of the loss, only an error line, one for each burst, with the number of what
// was dropped. So a message of more than 24 MiB never goes; one of more than 8 MiB goes only when nothing waits before
// it and the session has no delegate.
//
// Until startConfigurationWithCompletionHandler or fetchReportingStatesWithUserInfo has answered, every category may
// be sent; from then on the categories that the daemon's configuration filters out do not leave this process. When the
// daemon goes away, the next call starts it again; it then knows nothing of this session any more.
class TELVANE_EXPORT Telvane : public std::enable_shared_from_this<Telvane> {
 public:
  // Takes the names of the enabled backends, an array of texts, absent when the daemon cannot tell.
  using EnabledBackendsBlock = UniqueFunction<void(const Value& enabledBackendNames)>;
  // Takes nothing on success.
  using ErrorBlock = UniqueFunction<void(const std::optional<Error>& error)>;
  // Takes whether a backend of the session took what was handed over. That it then arrives at the server is not known
  // yet: the daemon's log tells. error: absent, also when isSuccess is false; the daemon's log has the reason. Not
  // called when the daemon cannot be reached, nor for what finds no room (see above).
  using UploadBlock = UniqueFunction<void(bool isSuccess, const std::optional<Error>& error)>;
  // Takes one text that the daemon answered.
  using LoggingBlock = std::function<void(const String& text)>;
  // Takes messages of the sessions below this one in its hierarchy. client: the session info of the sender; timestamp:
  // seconds since 1970; payload: the message's fields with the sender's user info added, may be absent. A call with
  // timestamp 0, category 0, type 0 and nothing else says that a session below has ended.
  using AggregationBlock = std::function<void(const Value& client, double timestamp, uint16_t category, uint16_t type,
                                              const Value& payload)>;
  // Asks a module of this process for its metrics, on a thread of the library: with an empty dictionary that it fills
  // before it returns, or with null when it is only to update its state. See registerPeriodicTaskForModule.
  using PeriodicTaskBlock = std::function<void(Dictionary* metrics)>;

  // Opens a session. sessionInfo: a dictionary with the client type under "ComponentType" (5 to 30) and more as the
  // key constants name; 0 under "EnableFlag" switches the session off. userInfo: a dictionary with "_clientName" or
  // "_serviceName", may be absent. frameworksToCheck: an array of names, may be absent. aggregationBlock: may be empty;
  // one that throws is not called again.
  // Returns null when the session info is absent or its client type is not valid, the session is switched off, this
  // process may not reach the daemon, or there are no resources for a connection. That the daemon does not run is no
  // reason.
  static std::shared_ptr<Telvane> initWithSessionInfo(const Value& sessionInfo, const Value& userInfo = {},
                                                      const Value& frameworksToCheck = {},
                                                      AggregationBlock aggregationBlock = {});
  ~Telvane();
  Telvane(const Telvane&) = delete;
  Telvane& operator=(const Telvane&) = delete;

  // Asks the daemon for the session's configuration and keeps its answer. completionHandler: may be empty; is not
  // called when the daemon cannot be reached. The logging block gets the session's display URL.
  void startConfigurationWithCompletionHandler(EnabledBackendsBlock completionHandler);
  // Gives the daemon new user info (may be absent), asks for the states that follow from it and keeps them.
  // fetchComplete: may be empty; gets an absent value when the daemon cannot be reached.
  void fetchReportingStatesWithUserInfo(const Value& userInfo, EnabledBackendsBlock fetchComplete);

  // Sends one event. payload: a dictionary, may be absent. Of its entries, those that are arrays or dictionaries are
  // posted for client type 28 only (on internal builds for 7, too); for the others the daemon leaves each of them out,
  // with an error line in its log. error: where to put the error, or nothing on success; may be null. Returns false for
  // category 0 (code 4 of "TelvaneErrorDomain"), else true, also for a category that is filtered out and for an event
  // that finds no room (see above).
  bool sendMessageWithCategory(uint16_t category, uint16_t type, const Value& payload = {},
                               std::optional<Error>* error = nullptr);
  // Sends one message dictionary: "ParametersCategory" and "ParametersType" (of both, the low 16 bits count), perhaps
  // "ParametersPayload" (as for sendMessageWithCategory) and "ParametersFlag". Returns true when it was handed on, also
  // for one that finds no room. Returns false with an error when one
  // of the two is missing (code 7, the text as the domain) or the category is 0 (code 4), and false without one when
  // the category is filtered out.
  bool sendMessageWithDictionary(const Dictionary& message, std::optional<Error>* error = nullptr);
  // Whether the cached white list names the category, or there is no such list.
  bool isWhitelistedEvent(uint16_t category) const;
  // Whether the cached black list names the category.
  bool isBlacklistedEvent(uint16_t category) const;
  // Has the daemon send the events it holds back for batches. Returns true.
  bool flushMessages();
  // The same. completion: may be empty; gets the error with which the flush or the way to the daemon failed.
  void flushMessagesWithCompletion(ErrorBlock completion);
  // Tells the daemon that the session ends in good order. Overtakes what waits in this process. Letting the session go
  // does this by itself.
  void finishSession();

  // Adds the entries to the data that all sessions of the hierarchy share and that accompanies every event; arrays and
  // dictionaries among them go by the rule for a payload's. A hierarchy has room for 1 MiB of it, by estimate: an
  // update that would be more is refused as a whole, and what stood there stays. The caller does not hear of that, the
  // daemon writes an error line, one for each burst.
  void updateSharedDataWithDictionary(const Dictionary& sharedData);
  // Sets one entry, within the same bound; an absent value removes the key.
  void updateSharedDataForKey(const String& key, const Value& value);
  // Gives the daemon the key of the digest that a header of its requests carries: an HMAC of the uncompressed body, by
  // which a collector that has the key, too, tells them from forged ones. digestKey: Data; a value of any other kind (a
  // text, say) is taken, and there is no digest. algorithm: 0 for SHA-1; with any other there is no digest either.
  // Returns false for an absent key, else true.
  bool setDigestKey(const Value& digestKey, int32_t algorithm);

  // Whether the upload backend is among the cached enabled backends; false until the daemon has answered.
  bool serverSupportsFileUpload() const;
  // Uploads a file. fileURL: a "file:" URL or an absolute path. The daemon reads it through a descriptor opened here,
  // with this process's rights. completionHandler: may be empty. Returns false when the URL is empty or the file cannot
  // be opened.
  bool uploadFileWithURL(const String& fileURL, UploadBlock completionHandler = {});
  // Uploads log data, an array of dictionaries ("LogData", "StartTime", "EndTime"). completionHandler: may be empty.
  // Returns false for an empty array.
  bool uploadDataArray(const Array& logData, UploadBlock completionHandler = {});

  // Sets the delegate; an empty pointer takes it away. Takes effect behind what was called before.
  void setMessageSentDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate);
  // Returns the delegate, or null when there is none any more.
  std::shared_ptr<TelvaneMessageSentDelegate> messageSentDelegate() const;
  // Sets the block that gets the daemon's textual answers; an empty one takes it away. Takes effect behind what was
  // called before.
  void setMessageLoggingBlock(LoggingBlock block);
  // Returns the block, empty when there is none.
  LoggingBlock messageLoggingBlock() const;

  // Periodic metrics. Modules of this process are registered with a block each; the log timer calls the blocks at each
  // of its ticks, at most four at a time, to let them update their state or, every so many ticks, to gather what they
  // report into one real-time event. docs/periodic-tasks.md shows how they play together.
  //
  // A tick waits for the blocks that it has called, and what was called of this session meanwhile waits for the tick.
  // So a block should be quick, and must not wait for anything that this session brings (a completion, say); one that
  // never returns holds up its session for ever. The other calls of a session do not wait, and a block may make them.
  //
  // Registers a module, behind what was called before, and instead of an earlier one of that number. needToUpdate: call
  // it at ticks that are no report; needToReport: call it for reports. serviceBlock: must not hold the session but
  // weakly. What a block throws is caught and written to the log, and the report goes without what it has filled in. It
  // is not called twice at once, except for a timer whose interval is 0, which does not wait for its blocks. What it
  // fills in is a payload: arrays and dictionaries are posted for client type 28 only.
  // Returns false for an empty block, else true.
  bool registerPeriodicTaskForModule(uint32_t module, bool needToUpdate, bool needToReport,
                                     PeriodicTaskBlock serviceBlock);
  // Takes a module away, behind what was called before, and waits until that is done, if need be for the end of a tick.
  // Then its block does not run and is not called any more (with an interval of 0, one that was called may still run).
  // Called inside a module's block or a delegate, of whichever session, for which the wait could be one for itself, it
  // returns at once, and the module goes when what was called before is done: when the tick is over.
  // Returns true, whether there was such a module or not.
  bool unregisterPeriodTaskForModule(uint32_t module);
  // Starts the log timer, which ticks at once and then every interval, in seconds (0 is a millisecond, and of no use
  // but in tests). A tick that is late for the next one takes its place. Every reportingMultiplier-th tick is a report,
  // all others are updates: with 1 every one, with 0 none. A report in which a module has filled in something is sent
  // as an event with that category and type, real-time, and is filtered like any other. Equal keys of several modules
  // come together: entries of dictionaries in one dictionary, elements of arrays in one array, and of other values the
  // last one stays. Does nothing while there is a timer.
  void startLogTimerWithInterval(uint32_t interval, uint32_t reportingMultiplier, uint16_t category, uint16_t type);
  // Stops the log timer, behind what was called before; no block is called behind it. A timer is to be stopped before
  // the last pointer to its session is let go. One that is not ends then, too, with the tick that is under way.
  void stopLogTimer();

  // Returns this user's identifier of this device, making and keeping one on first use: the one that respects the
  // user's wish not to be followed (true), or the other. Whatever is stored is returned; what this library stores is a
  // UUID text.
  static Value getPersistentIdentifierForDNU(bool respectsDNU);
  // Replaces that identifier with a new one.
  static void regeneratePersistentIdentifierForDNU(bool respectsDNU);
  // Makes the token (for "HierarchyToken" in a session info) of a new hierarchy, or of a session below the one with the
  // parent token. Returns nothing when the parent is no dictionary or has no "token". A parent's "token" is taken as it
  // is, but one of more than 1024 bytes counts as none: the session that is opened with it belongs to no hierarchy.
  static std::optional<Dictionary> newHierarchyTokenFromParentToken(const Value& parentToken = {});
  // Sends one event without a session. sessionInfo and userInfo as for initWithSessionInfo ("EnableFlag" is not looked
  // at), payload as for sendMessageWithCategory. Returns false with an error when the session info is absent (code 2),
  // its client type is not valid (3), the category is 0 or the payload no dictionary (4); else true. Of all events of
  // this process that are sent so, 32 MiB may wait for the daemon, by estimate: beyond that the newest is dropped, with
  // an error line, and true is returned all the same.
  static bool sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category,
                                            uint16_t type, const Value& payload, std::optional<Error>* error = nullptr);

 private:
  friend struct TelvaneFactory;
  Telvane();
  // The session, when it is this process's own; null in a forked child.
  ClientSession* session() const noexcept;

  std::shared_ptr<ClientSession> _session;
  uint64_t _processGeneration = 0;
};

}  // namespace telvane
