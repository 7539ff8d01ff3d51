#pragma once

#include <plist/plist.h>

#include <memory>

// Small owning types for the property-list library. Only sources of this folder read this.
namespace telvane::propertylist {

struct NodeFree {
  void operator()(void* node) const noexcept { plist_free(node); }
};
using OwnedNode = std::unique_ptr<void, NodeFree>;

// Makes the calling thread read and write numbers as the formats want them, whatever language the program around this
// library has chosen. REQUIRES: ends on the thread where it began.
class PlainNumbers {
 public:
  PlainNumbers() noexcept;
  PlainNumbers(const PlainNumbers&) = delete;
  PlainNumbers& operator=(const PlainNumbers&) = delete;
  ~PlainNumbers();

 private:
  void* _plain;
  void* _before = nullptr;
};

}  // namespace telvane::propertylist
