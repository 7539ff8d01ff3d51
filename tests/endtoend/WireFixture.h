#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "foundation/Value.h"
#include "tests/endtoend/ClientScript.h"
#include "tests/endtoend/Instance.h"
#include "tests/endtoend/WireServer.h"

namespace telvane::testing {

// A real daemon whose storebags and events all go over one wire server of the test, so that everything that leaves the
// process is seen. The device is a "Box2,1" in the US with version 12.5. Nothing is started by itself; consent is not
// given.
class WireFixture : public ::testing::Test {
 protected:
  using Respond = WireServer::Respond;
  static constexpr int kClientType = 7;
  static constexpr char kBagName[] = "conferencing";

  WireFixture();
  ~WireFixture() override;

  // A client entry that lets everybody report who consents.
  Dictionary clientEntry() const { return entryPostingTo(server().url("/events")); }
  static Dictionary entryPostingTo(const std::string& url);
  // The same with one key changed; an absent value takes it away.
  Dictionary entryWith(const Key& key, Value value) const;
  // A section of one backend with these entries.
  static Dictionary section(const std::string& backendName, Array entries);

  // Publishes a bag with this section for customers' devices and for internal ones.
  void givenSection(const Dictionary& section, const std::string& bagName = kBagName);
  void givenInternalBuild();
  // What is answered to a post; 200 by default. Called on threads of the server.
  void givenPostsAnsweredBy(Respond respond);
  void startDaemon() { _instance.startDaemon(); }
  // Ends the daemon, which first sends what it holds: behind this call nothing leaves any more.
  void stopDaemon();

  static Dictionary sessionInfo(bool batches = true, int clientType = kClientType);
  static Dictionary userInfo(const char* clientName = "sender");
  // Runs a client process to its end and returns what it said.
  std::string run(const ClientScript& script);
  // Starts one. What it says goes to the file "<name>.out" of the instance.
  std::unique_ptr<ChildProcess> start(const ClientScript& script, const std::string& name = "client");
  // Lets it go on when it waits, and expects that it ends well.
  void expectEnd(ChildProcess& client);

  Instance& instance() { return _instance; }
  const Instance& instance() const { return _instance; }
  WireServer& server() const { return *_server; }
  std::vector<WireRequest> posts() const { return _server->posts(); }
  // A post's body as it was before compression; fails the test when it cannot be inflated.
  static std::string jsonOf(const WireRequest& post);
  // A post's body as a value; an empty dictionary, with a failure, when it is no JSON object.
  static Dictionary bodyOf(const WireRequest& post);
  // The events of posts, and those of one category.
  static std::vector<Dictionary> eventsOf(const std::vector<WireRequest>& posts);
  static std::vector<Dictionary> eventsOf(const std::vector<WireRequest>& posts, int64_t category);
  std::vector<Dictionary> arrived(int64_t category) const { return eventsOf(posts(), category); }

 private:
  static constexpr char kClient[] = "telvane-scripted-client";
  void writeDevice(bool isInternal);
  WireServer::Answer answer(const WireRequest& request);

  Instance _instance;
  std::mutex _mutex;
  std::map<std::string, std::string> _envelopes;  // guarded by _mutex
  Respond _respondToPost;                         // guarded by _mutex
  std::unique_ptr<WireServer> _server;
};

}  // namespace telvane::testing
