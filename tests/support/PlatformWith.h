#pragma once

#include <type_traits>

#include "platform/Platform.h"

namespace telvane::testing {

// The usual part, or the given one that can stand for it.
template <class Part, class... Given>
Part& partAmong(Part& usual, Given&... given) {
  Part* part = &usual;
  const auto take = [&part](auto& one) {
    if constexpr (std::is_base_of_v<Part, std::remove_reference_t<decltype(one)>>) part = &one;
  };
  (take(given), ...);
  return *part;
}

template <class Given>
concept PartOfPlatform = std::is_base_of_v<Clock, Given> || std::is_base_of_v<Random, Given> ||
    std::is_base_of_v<Dispatch, Given> || std::is_base_of_v<Log, Given> || std::is_base_of_v<FileSystem, Given> ||
    std::is_base_of_v<SubmittableLogs, Given> || std::is_base_of_v<DatagramSockets, Given>;

// The platform of a test that replaces some parts of another one: each given part takes the place of the part that it
// derives from. All parts outlive what is made with the result.
template <PartOfPlatform... Given>
Platform platformWith(const Platform& usual, Given&... given) {
  return {partAmong(usual.clock, given...),
          partAmong(usual.random, given...),
          partAmong(usual.dispatch, given...),
          partAmong(usual.log, given...),
          partAmong(usual.files, given...),
          usual.userDefaults,
          usual.deviceAnswers,
          usual.locale,
          usual.consent,
          usual.clientBundle,
          usual.urlSessions,
          usual.transactions,
          usual.localService,
          partAmong(usual.submittableLogs, given...),
          usual.processMemory,
          partAmong(usual.datagramSockets, given...),
          usual.sandboxExtensions,
          usual.wirelessDiagnostics,
          usual.powerLog};
}

}  // namespace telvane::testing
