#pragma once

#include <cstdint>

namespace telvane::testing {

// A small generator whose sequence is the same on every machine, library and compiler (SplitMix64), which the
// distributions of the standard library do not promise. A value.
class SeededGenerator {
 public:
  explicit SeededGenerator(uint64_t seed) noexcept : _state(seed) {}

  uint64_t next() noexcept {
    _state += 0x9e3779b97f4a7c15u;
    uint64_t mixed = _state;
    mixed = (mixed ^ (mixed >> 30)) * 0xbf58476d1ce4e5b9u;
    mixed = (mixed ^ (mixed >> 27)) * 0x94d049bb133111ebu;
    return mixed ^ (mixed >> 31);
  }
  // A number below the bound; 0 when the bound is 0. The bias of the remainder does not matter here.
  uint64_t below(uint64_t bound) noexcept { return bound < 2 ? 0 : next() % bound; }

 private:
  uint64_t _state;
};

}  // namespace telvane::testing
