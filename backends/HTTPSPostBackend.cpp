#include "backends/HTTPSPostBackend.h"

#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/identifiers/PersistentIdentifiers.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

// The defaults keep what anybody stored there; the collector gets text.
String identifierForDNU(const Platform& platform, bool respectsDNU) {
  const Value identifier =
      getPersistentIdentifierForDNU(platform.userDefaults, platform.random, platform.log,
                                    {kTelvaneDefaultsSuite, defaultsKeyOfIdentifierForDNU(respectsDNU)});
  return identifier.isString() ? *identifier.string() : String(description(identifier));
}

}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::initWithName(const ProcessContext& context, const String& name,
                                                                 const Value& profile,
                                                                 const std::optional<String>& productFamily) {
  const Dictionary* section = profile.dictionary();
  if (section == nullptr || !productFamily.has_value()) return nullptr;
  const Array* clients = (*section)[kProfileClients].array();
  if (clients == nullptr || clients->empty()) {
    context.log().error("HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(context, name, *section, *productFamily));
}

HTTPSPostBackend::HTTPSPostBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily)
    : TelvaneBackend(context, std::move(name), std::move(profile), std::move(productFamily)) {
  const Platform& platform = context.platform();
  takeDefaultPostURLs();
  if (const String* displayURL = _profile[kProfileDisplayURL].string()) _displayURL = *displayURL;
  _dnuEnabled = platform.consent.isSubmissionAllowed();
  _uuidRespectDnu = identifierForDNU(platform, true);
  _uuidOverrideDnu = identifierForDNU(platform, false);
  _forceEventLogging =
      platform.userDefaults.objectForKey(kTelvaneDefaultsSuite, kDefaultsForceEventLogging).booleanValue();
}

HTTPSPostBackend::~HTTPSPostBackend() { tellDroppedEvents(); }

void HTTPSPostBackend::takeDefaultPostURLs() {
  const UserDefaults& userDefaults = _context.platform().userDefaults;
  _postURL = userDefaultsString(userDefaults, kDefaultsHTTPSPostURL);
  _useDefaultPostURL = _postURL.has_value();
  if (_useDefaultPostURL) {
    log().message("HTTPSPostBackend(initWithName): Using user default '{}' for postURL", *_postURL);
  }
  _realtimePostURL = userDefaultsString(userDefaults, kDefaultsHTTPSRealtimePostURL);
  _useDefaultRealtimePostURL = _realtimePostURL.has_value();
  if (_useDefaultRealtimePostURL) {
    log().message("HTTPSPostBackend(initWithName): Using user default '{}' for realtimePostURL", *_realtimePostURL);
  }
}

// A frozen state is not written back: the server may disable the backend between reading and writing.
uint32_t HTTPSPostBackend::updateState() {
  if (_immutable) return state();
  const uint32_t state = updateBackendState();
  setState(state);
  return state;
}

void HTTPSPostBackend::setCorrelatedSessionID(const String& combinedSessionID) {
  _stateQueue->sync([this, &combinedSessionID] {
    _stateQueue->assertOnQueue();
    _combinedSessionIDString = combinedSessionID;
    if (!_batchedEvents.has_value()) return;
    for (Dictionary& event : *_batchedEvents) event.set(kEventSessionID, combinedSessionID);
  });
}

uint64_t HTTPSPostBackend::batchedEventsSize() const {
  uint64_t size = 0;
  _stateQueue->sync([this, &size] {
    _stateQueue->assertOnQueue();
    if (!_batchedEvents.has_value()) return;
    for (const Dictionary& event : *_batchedEvents) size += objectSizeEstimate(event);
  });
  return size;
}

}  // namespace telvane
