#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {

// Clients of one daemon that belong together, each a process of its own. Their events have category 21 and say whom
// they are from and which they are, so that each can be followed to the collector and to whoever aggregates.
class HierarchyFixture : public WireFixture {
 protected:
  static constexpr uint16_t kCategory = 21;
  static constexpr int kOtherClientType = 8;
  static constexpr char kOtherBagName[] = "audio";
  using Numbers = std::vector<int64_t>;

  HierarchyFixture();

  // Session infos: with a hierarchy, and with a token of any shape.
  static Dictionary infoIn(const char* token, int64_t level, int clientType = kClientType);
  static Dictionary infoWithToken(Value token, int clientType = kClientType);

  // Starts a client and returns when it has said that it waits. It ends with the test.
  ChildProcess& startUntilWaiting(const ClientScript& script, const std::string& name);
  ChildProcess& client(const std::string& name) { return *_clients.at(name); }
  // Lets the client end and expects that it ends well.
  void end(const std::string& name);
  void endAll();
  void killClient(const std::string& name);

  std::string output(const std::string& name) const;
  // How often the client has said the line.
  size_t timesSaid(const std::string& name, const std::string& line) const;
  bool says(const std::string& name, const std::string& line, size_t times = 1);
  // The numbers of the events of that sender which the client's aggregation block has heard, in their order.
  Numbers heard(const std::string& name, const std::string& from, int category = kCategory) const;
  bool hears(const std::string& name, const std::string& from, size_t count, int category = kCategory);

  // The events of that sender which have arrived, and their numbers.
  std::vector<Dictionary> eventsFrom(const std::string& from, int category = kCategory) const;
  Numbers numbersFrom(const std::string& from) const;
  // Waits until so many have arrived, then expects that each has arrived once.
  void expectEachOnce(const std::string& from, int count);
  static Numbers upTo(int count);

  // What the daemon tells of itself now; the asking session counts too.
  Dictionary status();
  // Waits until it has so many sessions and hierarchies beside the asking one.
  bool comesToHave(int sessions, int hierarchies);

 private:
  std::map<std::string, std::unique_ptr<ChildProcess>> _clients;
};

}  // namespace telvane::testing
