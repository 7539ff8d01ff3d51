#pragma once

#include <cstddef>
#include <cstdint>

#include "foundation/Value.h"
#include "interfaces/Wire.capnp.h"

// Values to and from the wire. The reader's side is what a hostile peer reaches.
namespace telvane::ipc::wirecoding {

// What a list of values takes on the wire, told before it is written: so a message is allocated once and a value that
// cannot cross is refused where it was made.
struct Measure {
  uint64_t wireBytes = 0;
  uint64_t textBytes = 0;  // of all strings and keys
  bool isTooDeep = false;  // nested deeper than kMaximumNesting; the rest was not measured
};

Measure measure(const Array& values);

// Writes the values. REQUIRES: a measure that is not too deep.
void encode(const Array& values, capnp::List<wire::Value>::Builder list);

// Reads the values of one message, whose strings it places in one buffer.
//
// Throws kj::Exception, with a text for the log, at a value nested too deep, of an unknown kind, or when the message
// holds more values than allowed.
class Decoder {
 public:
  // textBytes: what the peer says of the strings' sum, which is a hint.
  Decoder(uint64_t textBytes, size_t maximumValues);

  Array decode(capnp::List<wire::Value>::Reader list);

 private:
  Array decodeArray(capnp::List<wire::Value>::Reader list, size_t nesting);
  Dictionary decodeDictionary(capnp::List<wire::Value>::Reader list, size_t nesting);
  Value decodeValue(wire::Value::Reader value, size_t nesting);
  String decodeText(capnp::Text::Reader text);
  void count(size_t values, size_t nesting);

  StringBuffer _text;
  size_t _valuesLeft;
};

// Throws a kj::Exception with the text.
[[noreturn]] void refuse(const char* text);

}  // namespace telvane::ipc::wirecoding
