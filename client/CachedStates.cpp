#include "client/CachedStates.h"

#include <algorithm>
#include <limits>

namespace telvane {

bool CachedStates::Categories::contains(uint16_t category) const noexcept {
  return std::binary_search(numbers.begin(), numbers.end(), category);
}

CachedStates::Categories CachedStates::categoriesOf(const Value& list) {
  Categories categories;
  if (list.array() == nullptr) return categories;
  categories.isEmpty = list.array()->empty();
  categories.numbers.reserve(list.array()->size());
  for (const Value& element : *list.array()) {
    const int64_t number = element.integerValue();
    if (number < 0 || number > std::numeric_limits<uint16_t>::max()) continue;
    categories.numbers.push_back(static_cast<uint16_t>(number));
  }
  std::sort(categories.numbers.begin(), categories.numbers.end());
  return categories;
}

void CachedStates::store(Value enabledBackendNames, const Value& whitelistedEvents, const Value& blacklistedEvents) {
  Categories whitelisted = categoriesOf(whitelistedEvents);
  Categories blacklisted = categoriesOf(blacklistedEvents);
  if (!enabledBackendNames.isArray()) enabledBackendNames = {};
  MutexLock lock(_mutex);
  std::swap(_enabledBackendNames, enabledBackendNames);
  std::swap(_whitelistedEvents, whitelisted);
  std::swap(_blacklistedEvents, blacklisted);
  _hasLists.store(!_whitelistedEvents.isEmpty || !_blacklistedEvents.isEmpty, std::memory_order_release);
}

bool CachedStates::isWhitelistedEvent(uint16_t category) const {
  if (!_hasLists.load(std::memory_order_acquire)) return true;
  MutexLock lock(_mutex);
  return isWhitelistedLocked(category);
}

bool CachedStates::isBlacklistedEvent(uint16_t category) const {
  if (!_hasLists.load(std::memory_order_acquire)) return false;
  MutexLock lock(_mutex);
  return _blacklistedEvents.contains(category);
}

bool CachedStates::mayBeSent(uint16_t category) const {
  if (!_hasLists.load(std::memory_order_acquire)) return true;
  MutexLock lock(_mutex);
  return isWhitelistedLocked(category) && !_blacklistedEvents.contains(category);
}

Value CachedStates::enabledBackendNames() const {
  MutexLock lock(_mutex);
  return _enabledBackendNames;
}

bool CachedStates::isWhitelistedLocked(uint16_t category) const {
  return _whitelistedEvents.isEmpty || _whitelistedEvents.contains(category);
}

}  // namespace telvane
