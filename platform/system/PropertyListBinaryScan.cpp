#include <algorithm>
#include <cstdint>
#include <vector>

#include "platform/system/PropertyListScan.h"

namespace telvane::propertylist {
namespace {

constexpr std::string_view kMagic = "bplist00";
constexpr size_t kTrailerSize = 32;
constexpr uint64_t kExpansion = 4;

struct Trailer {
  uint64_t offsetSize;
  uint64_t referenceSize;
  uint64_t objectCount;
  uint64_t root;
  uint64_t offsetTable;
};

// The content of one object: count bytes, characters or references that begin at start.
struct Object {
  uint8_t kind;  // the high half of its first byte
  uint64_t start;
  uint64_t count;
};

// What an object comes to once everything it refers to is written out.
struct Size {
  enum class State : uint8_t { Unseen, Open, Done };
  State state = State::Unseen;
  uint32_t depth = 0;
  uint64_t nodes = 0;
  uint64_t bytes = 0;
};

// Walks the objects with a stack of its own. Objects are measured once, so the work is bounded by the references.
class BinaryScan {
 public:
  BinaryScan(std::string_view bytes, const Limits& limits) : _bytes(bytes), _limits(limits) {}

  Result<void> run() {
    if (const Result<void> read = readTrailer(); !read) return read;
    _sizes.resize(_trailer.objectCount);
    if (const Result<void> begun = open(_trailer.root); !begun) return begun;
    while (!_open.empty()) {
      if (const Result<void> step = advance(); !step) return step;
    }
    return {};
  }

 private:
  struct OpenObject {
    uint64_t index;
    Object object;
    uint64_t next;  // the next reference to follow
  };

  // REQUIRES: size is at most 8 and the bytes are there.
  uint64_t number(uint64_t position, uint64_t size) const {
    uint64_t result = 0;
    for (uint64_t i = 0; i < size; ++i) result = result << 8 | static_cast<uint8_t>(_bytes[position + i]);
    return result;
  }

  Result<void> readTrailer() {
    if (_bytes.size() < kMagic.size() + kTrailerSize + 2) return malformed("it is cut short");
    if (!_bytes.starts_with(kMagic)) return malformed("its version is unknown");
    const uint64_t trailer = _bytes.size() - kTrailerSize;
    _trailer = {number(trailer + 6, 1), number(trailer + 7, 1), number(trailer + 8, 8), number(trailer + 16, 8),
                number(trailer + 24, 8)};
    const auto isSize = [](uint64_t size) { return size >= 1 && size <= 8; };
    if (!isSize(_trailer.offsetSize) || !isSize(_trailer.referenceSize)) return malformed("its trailer is wrong");
    if (_trailer.offsetTable <= kMagic.size() || _trailer.offsetTable >= trailer) {
      return malformed("its trailer is wrong");
    }
    const uint64_t tableSize = trailer - _trailer.offsetTable;
    const bool fillsTable =
        tableSize / _trailer.offsetSize == _trailer.objectCount && tableSize % _trailer.offsetSize == 0;
    if (!fillsTable || _trailer.root >= _trailer.objectCount) return malformed("its trailer is wrong");
    if (_trailer.objectCount > _limits.maximumNodes) return tooLarge();
    return {};
  }

  // Reads an object's head and checks that its content lies before the offset table.
  Result<Object> readObject(uint64_t index) const {
    uint64_t position = number(_trailer.offsetTable + index * _trailer.offsetSize, _trailer.offsetSize);
    if (position < kMagic.size() || position >= _trailer.offsetTable) return malformed("an object lies outside");
    const auto marker = static_cast<uint8_t>(_bytes[position++]);
    Object object{static_cast<uint8_t>(marker >> 4), position, static_cast<uint64_t>(marker & 15)};
    const bool hasLongCount = object.kind >= 4 && object.count == 15;
    if (hasLongCount && !readLongCount(object)) return malformed("an object's size is wrong");
    const uint64_t unit = unitOf(object);
    if (unit == 0) return malformed("an object's type is unknown");
    if (object.count > (_trailer.offsetTable - object.start) / unit) return malformed("an object is cut short");
    return object;
  }

  bool readLongCount(Object& object) const {
    if (object.start >= _trailer.offsetTable) return false;
    const auto marker = static_cast<uint8_t>(_bytes[object.start]);
    const uint64_t size = uint64_t{1} << (marker & 15);
    if (marker >> 4 != 1 || size > 8 || size > _trailer.offsetTable - object.start - 1) return false;
    object.count = number(object.start + 1, size);
    object.start += 1 + size;
    return true;
  }

  // Returns the size of one of the object's count, having turned a size class into a count of bytes; 0 for kinds that
  // cannot be.
  uint64_t unitOf(Object& object) const {
    const uint64_t sizeClass = object.count;
    switch (object.kind) {
      case 0x0:  // false and true
        object.count = 0;
        return sizeClass == 8 || sizeClass == 9 ? 1 : 0;
      case 0x1:  // integers of 1, 2, 4, 8 and 16 bytes
        object.count = uint64_t{1} << sizeClass;
        return sizeClass <= 4 ? 1 : 0;
      case 0x2:  // reals of 4 and 8 bytes
        object.count = uint64_t{1} << sizeClass;
        return sizeClass == 2 || sizeClass == 3 ? 1 : 0;
      case 0x3:  // a date
        object.count = 8;
        return sizeClass == 3 ? 1 : 0;
      case 0x4:  // data
      case 0x5:  // ASCII
        return 1;
      case 0x6:  // UTF-16
        return 2;
      case 0xA:  // an array
        return _trailer.referenceSize;
      case 0xD:  // a dictionary: first all keys, then all values
        return 2 * _trailer.referenceSize;
      default:
        return 0;
    }
  }

  static bool isContainer(const Object& object) { return object.kind == 0xA || object.kind == 0xD; }
  static bool isText(const Object& object) { return object.kind == 0x5 || object.kind == 0x6; }

  Result<void> checkContent(const Object& object) const {
    const std::string_view content = _bytes.substr(object.start, object.count);
    const bool hasNull = object.kind == 0x5 && content.find('\0') != std::string_view::npos;
    if (hasNull || (object.kind == 0x6 && hasNullCharacter(object))) return malformed("text with a null character");
    const bool isHuge = object.kind == 0x1 && object.count == 16 && number(object.start, 8) != 0;
    if (isHuge) return malformed("an integer is out of range");
    return {};
  }

  bool hasNullCharacter(const Object& object) const {
    for (uint64_t i = 0; i < object.count; ++i) {
      if (number(object.start + 2 * i, 2) == 0) return true;
    }
    return false;
  }

  // Measures a scalar at once; puts a container on the stack.
  Result<void> open(uint64_t index) {
    const Result<Object> object = readObject(index);
    if (!object) return object.error();
    _contentBytes += object->count;
    // Objects may overlap, so what is looked through is bounded by this sum, not by the size of the file.
    if (_contentBytes > kExpansion * _limits.maximumBytes) return tooLarge();
    if (const Result<void> checked = checkContent(*object); !checked) return checked;
    Size& size = _sizes[index];
    size = {Size::State::Done, 1, 1, object->count};
    if (!isContainer(*object)) return {};
    if (_open.size() >= _limits.maximumDepth) return tooDeep();
    size.state = Size::State::Open;
    const uint64_t references = object->kind == 0xD ? 2 * object->count : object->count;
    _references += references;
    // Every reference is at least one node, so this also bounds containers that overlap.
    if (_references > _limits.maximumNodes) return tooLarge();
    _open.push_back({index, *object, 0});
    return {};
  }

  // Follows the next reference of the innermost open container, or closes it.
  Result<void> advance() {
    OpenObject& current = _open.back();
    const bool isDictionary = current.object.kind == 0xD;
    const uint64_t references = isDictionary ? 2 * current.object.count : current.object.count;
    if (current.next == references) {
      _sizes[current.index].state = Size::State::Done;
      _open.pop_back();
      return {};
    }
    const uint64_t target =
        number(current.object.start + current.next * _trailer.referenceSize, _trailer.referenceSize);
    if (target >= _trailer.objectCount) return malformed("a reference leads outside");
    switch (_sizes[target].state) {
      case Size::State::Open:
        return malformed("it contains itself");
      case Size::State::Unseen:
        return open(target);  // and is met again once measured
      case Size::State::Done:
        break;
    }
    if (isDictionary && current.next < current.object.count && !isTextAt(target)) return malformed("a key is no text");
    ++current.next;
    return add(_sizes[current.index], _sizes[target]);
  }

  bool isTextAt(uint64_t index) const {
    const Result<Object> object = readObject(index);
    return object && isText(*object);
  }

  Result<void> add(Size& container, const Size& element) const {
    container.nodes += element.nodes;
    container.bytes += element.bytes;
    container.depth = std::max(container.depth, element.depth + 1);
    if (container.nodes > _limits.maximumNodes) return tooLarge();
    if (container.bytes > kExpansion * _limits.maximumBytes) return tooLarge();
    if (container.depth > _limits.maximumDepth) return tooDeep();
    return {};
  }

  const std::string_view _bytes;
  const Limits& _limits;
  Trailer _trailer{};
  std::vector<Size> _sizes;  // by object
  std::vector<OpenObject> _open;
  uint64_t _references = 0;
  uint64_t _contentBytes = 0;
};

}  // namespace

Result<void> scanBinary(std::string_view bytes, const Limits& limits) { return BinaryScan(bytes, limits).run(); }

}  // namespace telvane::propertylist
