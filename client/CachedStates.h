#pragma once

#include <atomic>
#include <cstdint>
#include <vector>

#include "foundation/Value.h"
#include "platform/Mutex.h"

namespace telvane {

// What the daemon answered last about a session: the enabled backends and the event categories that may and that must
// not be sent. Empty until the first answer. Safe from any thread; it is asked for every event, so while there are no
// lists (the usual case) an answer costs one atomic read.
class CachedStates {
 public:
  // Replaces all three. What is no array counts as absent.
  void store(Value enabledBackendNames, const Value& whitelistedEvents, const Value& blacklistedEvents);

  // Whether the category may be sent: it is in the list, or the list is empty or absent.
  bool isWhitelistedEvent(uint16_t category) const;
  // Whether the category must not be sent: it is in the list.
  bool isBlacklistedEvent(uint16_t category) const;
  // Whitelisted and not blacklisted, by one and the same answer of the daemon.
  bool mayBeSent(uint16_t category) const;
  // An array of texts, or absent.
  Value enabledBackendNames() const;

 private:
  // The categories of a list in ascending order. isEmpty is of the list as it came: one whose elements name no category
  // at all is a list all the same.
  struct Categories {
    bool isEmpty = true;
    std::vector<uint16_t> numbers;
    bool contains(uint16_t category) const noexcept;
  };
  static Categories categoriesOf(const Value& list);
  bool isWhitelistedLocked(uint16_t category) const REQUIRES(_mutex);

  mutable Mutex _mutex;
  Value _enabledBackendNames GUARDED_BY(_mutex);
  Categories _whitelistedEvents GUARDED_BY(_mutex);
  Categories _blacklistedEvents GUARDED_BY(_mutex);
  // Whether either list is not empty. The release when it is stored and the acquire when it is read pair up, so that
  // who sees no lists need not look.
  std::atomic<bool> _hasLists = false;
};

}  // namespace telvane
