#pragma once

#include <gtest/gtest.h>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/FlowGate.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/url/CurlURLSessionProvider.h"
#include "platform/url/HTTPServer.h"
#include "tests/platform/url/RecordingURLSessionDelegate.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"
#include "tests/support/TestCertificates.h"

namespace telvane::testing {

// A session that trusts the test's authority, and a server to talk to. What a test changes of the options takes effect
// when it first asks for the session or the server.
class URLSessionFixture : public ::testing::Test {
 protected:
  using Server = HTTPServer;

  URLSessionFixture();
  ~URLSessionFixture() override;

  // The server and the session, made when first asked for.
  Server& server();
  URLSession& session();
  RecordingURLSessionDelegate& delegate() { return *_delegate; }
  // Ends the server and all that it held.
  void endServer() { _server.reset(); }
  void dropSession();
  void dropProvider();
  // https://localhost:PORT/path, or http:// when the server has no certificate.
  std::string url(const std::string& path = "/");

  std::shared_ptr<URLSessionTask> start(URLRequest request);
  TaskOutcome run(URLRequest request);
  TaskOutcome get(const std::string& path = "/") { return run({.url = url(path)}); }
  // Waits until the server has this many requests in hand; the answers are then the test's.
  std::vector<std::shared_ptr<Server::Responder>> waitForRequests(size_t count);
  static URLRequest post(std::string url, std::string body);

  ThreadedDispatch _dispatch;
  RecordingLog _log;
  FlowGate _gate;
  ScratchFolder _folder;
  TestCertificates _certificates;
  Server::Options _serverOptions;
  // Empty: the request is kept for the test, which answers it.
  Server::Handler _handler;
  Server::SinkMaker _sinkMaker;
  CurlURLSessionOptions _options;
  URLSessionConfiguration _configuration;
  Dispatch* _sessionDispatch = &_dispatch;

 private:
  const std::shared_ptr<SerialQueue> _queue;
  const std::shared_ptr<RecordingURLSessionDelegate> _delegate;
  std::unique_ptr<Server> _server;
  std::unique_ptr<CurlURLSessionProvider> _provider;
  std::unique_ptr<URLSession> _session;
  // Held to the end, because outcomes are found by a task's address.
  std::vector<std::shared_ptr<URLSessionTask>> _tasks;

  std::mutex _mutex;
  std::condition_variable _requestCame;
  std::vector<std::shared_ptr<Server::Responder>> _responders;
};

// Checks that the outcome is one completion with this error.
void expectError(const TaskOutcome& outcome, URLErrorCode code);

}  // namespace telvane::testing
