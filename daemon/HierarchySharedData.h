#pragma once

#include <cstdint>

#include "foundation/Value.h"

namespace telvane {

// The data that the sessions of one hierarchy share. Owned by the agent, whose lock guards it. All of it stands in
// every event of the hierarchy, so it is bounded, whatever the clients put into it.
class HierarchySharedData {
 public:
  // Of memory, by estimate.
  static constexpr int64_t kMaximumBytes = 1 << 20;

  // RefusedAgain: nothing was taken since the last refusal.
  enum class Addition { Taken, Refused, RefusedAgain };
  // Adds all entries, replacing those of the same keys, or none of them if there would then be too much. Looks at no
  // more of them than fits.
  Addition addEntriesFrom(const Dictionary& entries);
  void remove(const String& key);
  const Dictionary& entries() const noexcept { return _entries; }

 private:
  // May be negative: what is replaced gives way.
  int64_t growthBy(const Dictionary& entries) const;

  Dictionary _entries;
  int64_t _bytes = 0;
  bool _hasRefused = false;
};

}  // namespace telvane
