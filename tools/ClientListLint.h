#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <tuple>
#include <unordered_map>
#include <vector>

#include "foundation/Value.h"
#include "tools/LintReport.h"

namespace telvane {

// Finds client entries, and names in them, that no session gets to, because earlier entries fit wherever they fit.
class ClientListLint {
 public:
  // report: outlives this.
  explicit ClientListLint(LintReport& report) : _report(report) {}

  // path: of the array. Elements that are no dictionary are passed over, as devices do.
  void lint(const std::string& path, const Array& clients);

 private:
  using Version = std::tuple<uint8_t, uint8_t, uint8_t>;
  // For whom an entry is. Names are in lower case; an empty list means everybody.
  struct Reach {
    size_t index = 0;
    std::vector<std::string> clients;
    std::vector<std::string> services;
    Version enabledSince;
  };
  // Of an entry's client names, those that earlier entries take away.
  struct Taken {
    size_t count = 0;
    std::string_view name;  // one of them
    size_t by = 0;          // the entry that takes that one
    bool isAll = false;
  };
  // Which entries take a session away: those that decide alone must be for its version, too; for expedite, the first
  // that fits the names counts.
  enum class By : uint8_t { NamesAndVersion, Names };

  static Reach reachOf(const Dictionary& entry, size_t index);
  Taken takenFrom(const Reach& later, By by);
  // The earlier entry that takes all sessions of one client name, empty for any, and one service part; null when none.
  const Reach* takerOf(const std::optional<std::string_view>& client, const std::optional<std::string_view>& service,
                       const Reach& later, By by);
  std::optional<size_t> takerOfClient(const std::optional<std::string_view>& client, const Reach& later, By by);
  static bool takesService(const Reach& earlier, const std::optional<std::string_view>& service);
  void lintEntry(const std::string& path, const Dictionary& entry, const Reach& reach);
  void keep(Reach reach);

  LintReport& _report;
  // The entries before, and which of them are for everybody and for one client.
  std::vector<Reach> _earlier;
  std::vector<size_t> _forEverybody;
  std::unordered_map<std::string, std::vector<size_t>> _forClient;
};

}  // namespace telvane
