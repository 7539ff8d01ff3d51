// Files that real clients hand over to a real daemon, and what becomes of them.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <future>
#include <random>

#include "interfaces/ClientSessionInterface.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Compression.h"
#include "platform/PropertyList.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/system/FileDescriptor.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/endtoend/Instance.h"
#include "tests/endtoend/Latch.h"
#include "tests/endtoend/WireFixture.h"
#include "tests/support/RecordingLog.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

constexpr char kOnlyRegular[] = "UploadBackend(uploadFileAtPath): Only upload a regular file.";
// Where the daemon keeps the compressed copies.
constexpr char kCopies[] = "home/Library/Caches/telvaned/uploads";
// What a daemon may take to end, and something for a machine that is busy.
constexpr auto kLongestEnd = std::chrono::seconds(25 + 15);
constexpr char kIsEmpty[] = "UploadBackend(uploadFileAtPath): Input file is empty";
constexpr uid_t kNobody = 65534;
constexpr uid_t kDaemonUser = 54322;

// The most memory that a process ever had, in KiB.
int64_t peakMemory(pid_t process) {
  std::ifstream status("/proc/" + std::to_string(process) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmHWM:")) return std::stoll(line.substr(6));
  }
  return -1;
}

size_t linesInTheLog(const std::string& log, const char* text) {
  size_t lines = 0;
  for (size_t at = log.find(text); at != std::string::npos; at = log.find(text, at + 1)) ++lines;
  return lines;
}

// Bytes that do not compress.
std::string noiseOf(size_t size) {
  std::string noise(size, '\0');
  std::minstd_rand random(1);
  for (char& c : noise) c = static_cast<char>(random() >> 8);
  return noise;
}

// Uploads with telvanectl to the collector.
class UploadTest : public ::testing::Test {
 protected:
  UploadTest() {
    instance.grant("telvanectl");
    instance.startCollector({"--discard", "--uploads", instance.path("uploads")});
    Dictionary bag = openBag(instance.collectorURL("/events"));
    Dictionary section = *bag[kEnvironmentRelease].dictionary();
    section.set("upload_server", Dictionary{{kProfilePostURL, instance.collectorURL("/upload")}});
    bag.set(kEnvironmentRelease, section);
    instance.givenStorebag("conferencing", bag);
  }
  // The daemon writes its log behind what it does.
  bool isLogged(const std::string& text) {
    return eventually([this, &text] { return instance.daemonLogHas(text); });
  }
  size_t refusalsInTheLog() const { return linesInTheLog(instance.daemonLog(), kOnlyRegular); }
  static std::vector<std::string> arguments(const std::string& file) {
    return {"upload", "--client-type", "7", "--client-name", "sender", file};
  }
  // Returns the exit status.
  int upload(const std::string& file) { return instance.startProgram("telvanectl", arguments(file), "ctl")->wait(); }
  int uploadAs(uid_t user, const std::string& file) {
    return instance.startProgramAs(user, "telvanectl", arguments(file), "ctl")->wait();
  }
  std::string said() const { return instance.read("ctl.out"); }
  std::string complained() const { return instance.read("ctl.err"); }
  std::string write(const std::string& name, std::string_view content) {
    instance.givenFile(name, content);
    return instance.path(name);
  }
  // What the collector has under this name, uncompressed.
  std::string arrived(const std::string& name) const {
    const Result<Data> content = compression::inflate(instance.read("uploads/" + name), 1u << 30);
    return content.has_value() ? std::string(content->view()) : "(none)";
  }
  size_t arrivedFiles() const {
    if (!fs::exists(instance.path("uploads"))) return 0;
    return static_cast<size_t>(std::distance(fs::directory_iterator(instance.path("uploads")), {}));
  }
  // Gives a file, or a folder with what is in it, to a user.
  void give(const std::string& name, uid_t user, mode_t mode) {
    ASSERT_EQ(::chown(instance.path(name).c_str(), user, user), 0);
    ASSERT_EQ(::chmod(instance.path(name).c_str(), mode), 0);
  }
  Instance instance;
};

TEST_F(UploadTest, aFileReachesTheCollectorAndIsGone) {
  instance.startDaemon();
  const std::string file = write("a call.log", "one line\n");
  EXPECT_EQ(upload(file), 0) << complained() << instance.daemonLog();
  EXPECT_THAT(said(), HasSubstr("uploaded: " + file));
  EXPECT_EQ(arrived("a_call.log.gz"), "one line\n");
  EXPECT_FALSE(fs::exists(file));
  EXPECT_THAT(instance.read("collector.out"), HasSubstr("upload a_call.log.gz "));
}

TEST_F(UploadTest, takesARelativePathAndOneThroughALinkedFolder) {
  instance.startDaemon();
  const std::string file = write("folder/log", "1");
  EXPECT_EQ(upload(fs::relative(file).string()), 0) << complained();
  EXPECT_FALSE(fs::exists(file));
  write("folder/log", "2");
  fs::create_directory_symlink(instance.path("folder"), instance.path("way"));
  EXPECT_EQ(upload(instance.path("way/log")), 0) << complained() << instance.daemonLog();
  EXPECT_FALSE(fs::exists(file));
  EXPECT_EQ(arrived("log.gz"), "1");
  EXPECT_EQ(arrived("2-log.gz"), "2");
}

TEST_F(UploadTest, refusesALinkAFolderAPipeAndAnEmptyFile) {
  instance.startDaemon();
  const std::string target = write("target", "text");
  fs::create_symlink(target, instance.path("link"));
  fs::create_directory(instance.path("folder"));
  ASSERT_EQ(::mkfifo(instance.path("pipe").c_str(), 0600), 0);
  size_t refusals = 0;
  for (const char* name : {"link", "folder", "pipe"}) {
    EXPECT_EQ(upload(instance.path(name)), 1) << name;
    EXPECT_THAT(complained(), HasSubstr("the daemon refused " + instance.path(name)));
    ++refusals;
    EXPECT_TRUE(eventually([this, refusals] { return refusalsInTheLog() == refusals; })) << name;
  }
  EXPECT_EQ(upload(write("empty", "")), 1);
  EXPECT_TRUE(isLogged(kIsEmpty));
  EXPECT_TRUE(fs::exists(target));
  EXPECT_TRUE(fs::exists(instance.path("empty")));
  EXPECT_EQ(arrivedFiles(), 0u);
}

TEST_F(UploadTest, saysThatAFileCannotBeRead) {
  instance.startDaemon();
  EXPECT_EQ(upload(instance.path("nothing")), 1);
  EXPECT_THAT(complained(), HasSubstr("cannot read " + instance.path("nothing")));
}

TEST_F(UploadTest, aClientOfAnotherUserHasItsFileUploadedAndDeleted) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be two users";
  instance.startDaemon();
  const std::string file = write("private/log", "mine");
  give("private/log", kNobody, 0600);
  give("private", kNobody, 0700);
  EXPECT_EQ(uploadAs(kNobody, file), 0) << complained() << instance.daemonLog();
  EXPECT_EQ(arrived("log.gz"), "mine");
  EXPECT_FALSE(fs::exists(file));
}

TEST_F(UploadTest, aDaemonThatMayEverythingDeletesNothingThatTheClientCouldNot) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be two users";
  instance.startDaemon();
  const std::string file = write("public/log", "readable for all");
  give("public", 0, 0755);
  EXPECT_EQ(uploadAs(kNobody, file), 0) << complained() << instance.daemonLog();
  EXPECT_EQ(arrived("log.gz"), "readable for all");
  EXPECT_TRUE(fs::exists(file));
  EXPECT_THAT(said(), HasSubstr("posted: " + file + "; it is still there"));
  EXPECT_TRUE(isLogged("The uploaded file " + file + " stays: the client may not delete it"));
}

TEST_F(UploadTest, aFileOfSomebodyElseInAStickyFolderStays) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be two users";
  instance.startDaemon();
  const std::string theirs = write("sticky/theirs", "readable for all");
  const std::string own = write("sticky/own", "mine");
  give("sticky", 0, 01777);
  give("sticky/own", kNobody, 0600);
  EXPECT_EQ(::chmod(theirs.c_str(), 0644), 0);
  EXPECT_EQ(uploadAs(kNobody, theirs), 0) << complained() << instance.daemonLog();
  EXPECT_EQ(uploadAs(kNobody, own), 0) << complained() << instance.daemonLog();
  EXPECT_EQ(arrivedFiles(), 2u);
  EXPECT_TRUE(fs::exists(theirs));
  EXPECT_FALSE(fs::exists(own));
}

TEST_F(UploadTest, aClientHasNothingReadThatItMayNotReadItself) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be two users";
  instance.startDaemon();
  const std::string secret = write("secret", "not for nobody");
  give("secret", 0, 0600);
  fs::create_directory(instance.path("own"));
  fs::create_symlink(secret, instance.path("own/link"));
  give("own", kNobody, 0700);
  for (const std::string& file : {secret, instance.path("own/link")}) {
    EXPECT_EQ(uploadAs(kNobody, file), 1);
    EXPECT_THAT(complained(), HasSubstr("cannot read"));
  }
  EXPECT_EQ(arrivedFiles(), 0u);
  EXPECT_TRUE(fs::exists(secret));
}

// The daemon of the package: a user of its own, which may not look into clients' folders.
TEST_F(UploadTest, aDaemonOfAnotherUserReadsThroughTheDescriptorAndDeletesNothing) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be two users";
  const Dictionary grant{{"users", Array{Value("nobody")}}, {"entitlements", Dictionary{{kTelvanedEntitlement, true}}}};
  const auto plist = propertylist::serialize(Value(grant), propertylist::Format::XML).value();
  instance.givenFile("root/etc/telvane/entitlements.d/nobody.plist", plist.view());
  instance.startDaemonAs(kDaemonUser);
  const std::string file = write("private/log", "mine");
  give("private/log", kNobody, 0600);
  give("private", kNobody, 0700);
  EXPECT_EQ(uploadAs(kNobody, file), 0) << complained() << instance.daemonLog();
  EXPECT_EQ(arrived("log.gz"), "mine");
  EXPECT_TRUE(fs::exists(file));
  EXPECT_TRUE(isLogged("The uploaded file " + file + " stays: ")) << instance.daemonLog();
  fs::create_symlink(file, instance.path("private/link"));
  EXPECT_EQ(uploadAs(kNobody, instance.path("private/link")), 1);
  EXPECT_TRUE(isLogged(kOnlyRegular));
}

// As much as a test of a daemon that held the file, or its compressed form, would show by far.
TEST_F(UploadTest, aLargeFileTakesNoMemory) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "a sanitizer's memory says nothing of the daemon's, and takes a minute for it";
#endif
  constexpr int64_t kMostKiB = 12 * 1024;
  instance.startDaemon();
  ASSERT_EQ(upload(write("small", "text")), 0) << complained();
  const int64_t before = peakMemory(instance.daemon().pid());
  ASSERT_GT(before, 0);
  const std::string sparse = write("sparse", "");
  fs::resize_file(sparse, 1u << 30);
  EXPECT_EQ(upload(sparse), 0) << complained();
  EXPECT_FALSE(fs::exists(sparse));
  EXPECT_LT(peakMemory(instance.daemon().pid()) - before, kMostKiB) << "for 1 GiB that compresses well";
  const std::string noise = noiseOf(24u << 20);
  EXPECT_EQ(upload(write("noise", noise)), 0) << complained();
  EXPECT_LT(peakMemory(instance.daemon().pid()) - before, kMostKiB) << "for 24 MiB that do not";
  EXPECT_TRUE(arrived("noise.gz") == noise);
}

// A server of the test's own, which sees the bytes and answers what it likes.
class UploadOverTheWireTest : public WireFixture {
 protected:
  ~UploadOverTheWireTest() override { letTheServerAnswer(); }
  void start() {
    Dictionary section = WireFixture::section("splunk", Array{Value(clientEntry())});
    section.set("upload_server", Dictionary{{kProfilePostURL, server().url("/upload")}});
    givenSection(section);
    startDaemon();
  }
  bool isLogged(const std::string& text) {
    return eventually([this, &text] { return instance().daemonLogHas(text); });
  }
  // It answers "success" to each upload as soon as the test lets it.
  void givenAServerThatWaits() {
    givenPostsAnsweredBy([latch = _latch](const WireRequest&) {
      latch->wait();
      return WireServer::answer(200, "success");
    });
  }
  void letTheServerAnswer() { _latch->open(); }
  // Hands the file over with telvanectl, whose output is "ctl.out" and ".err".
  std::unique_ptr<ChildProcess> startUpload(const std::string& file) {
    instance().grant("telvanectl");
    return instance().startProgram("telvanectl", {"upload", "--client-type", "7", "--client-name", "sender", file},
                                   "ctl");
  }
  // Waits until the server has that many uploads; it may be about to answer them.
  bool hasCome(size_t count) {
    return eventually([this, count] { return uploads().size() == count; });
  }
  // What the kernel calls those of the daemon's open files whose names begin like this.
  std::vector<std::string> filesThatTheDaemonHasOpen(const std::string& beginning) {
    std::vector<std::string> found;
    const std::string open = "/proc/" + std::to_string(instance().daemon().pid()) + "/fd";
    for (const auto& entry : fs::directory_iterator(open)) {
      std::error_code gone;  // one that was closed meanwhile
      const std::string path = fs::read_symlink(entry.path(), gone).string();
      if (path.starts_with(beginning)) found.push_back(path);
    }
    return found;
  }
  ClientScript configured() const {
    ClientScript script;
    script.open(sessionInfo(), userInfo()).configure();
    return script;
  }
  std::string write(const std::string& name, std::string_view content) {
    instance().givenFile(name, content);
    return instance().path(name);
  }
  std::vector<WireRequest> uploads() const {
    std::vector<WireRequest> found;
    for (const WireRequest& post : posts()) {
      if (post.target().starts_with("/upload")) found.push_back(post);
    }
    return found;
  }

 private:
  const std::shared_ptr<Latch> _latch = std::make_shared<Latch>();
};

TEST_F(UploadOverTheWireTest, theRequestIsAsThePageSays) {
  givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "success"); });
  start();
  const std::string file = write("a call.log", "one line\n");
  EXPECT_THAT(run(configured().upload(file)), HasSubstr("uploaded: yes"));
  ASSERT_EQ(uploads().size(), 1u) << instance().daemonLog();
  const WireRequest upload = uploads()[0];
  EXPECT_THAT(upload.target(),
              MatchesRegex("/upload\\?uuid=[^&]*&sequence=[0-9]+&description=Vantico%20AFRC%20log%20\\(Uploaded%20by"
                           "%20ZPH\\)&filename=a%20call\\.log\\.gz&raw=true"));
  std::vector<std::string> lines = upload.lines();
  ASSERT_EQ(lines.size(), 5u);
  EXPECT_EQ(lines[1], "Host: " + server().address());
  std::sort(lines.begin() + 2, lines.end());
  EXPECT_EQ(lines[2], "Content-Encoding: gzip");
  EXPECT_EQ(lines[3], "Content-Length: " + std::to_string(upload.body.size()));
  EXPECT_EQ(lines[4], "Content-Type: application/octet-stream");
  EXPECT_EQ(compression::inflate(upload.body, 100)->view(), "one line\n");
  EXPECT_FALSE(fs::exists(file));
}

TEST_F(UploadOverTheWireTest, anAnswerWithoutSuccessOrNoneKeepsTheFile) {
  start();
  const std::string file = write("log", "text");
  std::vector<WireServer::Answer> answers{
      WireServer::answer(200, "{}"), WireServer::answer(503, "later"), {"", WireServer::Then::Close}};
  for (const WireServer::Answer& answer : answers) {
    givenPostsAnsweredBy([answer](const WireRequest&) { return answer; });
    EXPECT_THAT(run(configured().upload(file)), HasSubstr("uploaded: yes"));
    EXPECT_TRUE(fs::exists(file)) << answer.bytes;
  }
}

// Its copy is on the disk, and has no name by which it could stay there.
TEST_F(UploadOverTheWireTest, aDaemonThatIsKilledInTheMidstLeavesNoCopyBehind) {
  givenAServerThatWaits();
  start();
  const std::string file = write("log", "text");
  const auto client = startUpload(file);
  ASSERT_TRUE(hasCome(1)) << instance().daemonLog();
  const std::vector<std::string> copies = filesThatTheDaemonHasOpen(instance().path(kCopies) + "/");
  ASSERT_EQ(copies.size(), 1u) << "where the copy is";
  EXPECT_THAT(copies[0], HasSubstr(" (deleted)"));
  EXPECT_TRUE(fs::is_empty(instance().path(kCopies)));
  instance().daemon().signal(SIGKILL);
  EXPECT_EQ(instance().daemon().wait(), -SIGKILL);
  letTheServerAnswer();
  EXPECT_EQ(client->wait(), 1);
  EXPECT_TRUE(fs::is_empty(instance().path(kCopies)));
  EXPECT_EQ(instance().read("log"), "text");
}

TEST_F(UploadOverTheWireTest, aDaemonThatIsToEndGivesTheClientItsAnswerAndKeepsTheFileWhateverTheServerSaysThen) {
  givenAServerThatWaits();
  start();
  const std::string file = write("log", "text");
  const auto client = startUpload(file);
  ASSERT_TRUE(hasCome(1)) << instance().daemonLog();
  instance().daemon().signal(SIGTERM);
  EXPECT_EQ(client->wait(), 0) << instance().read("ctl.err");
  EXPECT_THAT(instance().read("ctl.out"), HasSubstr("posted: " + file + "; it is still there"));
  EXPECT_TRUE(isLogged("<error> UploadBackend(uploadFileAtPath): post (null)"));
  ASSERT_TRUE(instance().daemon().isRunning()) << "what was posted already may still arrive";
  letTheServerAnswer();
  EXPECT_EQ(instance().daemon().wait(), 0) << instance().daemonLog();
  EXPECT_EQ(instance().read("log"), "text");
}

TEST_F(UploadOverTheWireTest, aServerThatDoesNotAnswerHoldsTheDaemonsEndUpForABoundedTime) {
  givenAServerThatWaits();
  start();
  const std::string file = write("log", "text");
  const auto client = startUpload(file);
  ASSERT_TRUE(hasCome(1)) << instance().daemonLog();
  const auto before = std::chrono::steady_clock::now();
  instance().daemon().signal(SIGTERM);
  EXPECT_EQ(instance().daemon().wait(2 * kLongestEnd), 0) << instance().daemonLog();
  EXPECT_LT(std::chrono::steady_clock::now() - before, kLongestEnd);
  EXPECT_EQ(client->wait(), 0) << instance().read("ctl.err");
  EXPECT_EQ(instance().read("log"), "text");
}

// As on a disk that is full, the daemon may write no more into its copy than there is room for.
TEST_F(UploadOverTheWireTest, aFileWhoseCopyHasNoRoomIsRefusedAndTheDaemonGoesOn) {
  constexpr rlim_t kRoom = 4u << 20;
  givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "success"); });
  start();
  const std::string noise = noiseOf(2 * kRoom);
  const std::string large = write("large", noise);
  const rlimit limit{kRoom, kRoom};
  ASSERT_EQ(::prlimit(instance().daemon().pid(), RLIMIT_FSIZE, &limit, nullptr), 0);
  EXPECT_EQ(startUpload(large)->wait(), 1);
  EXPECT_THAT(instance().read("ctl.err"), HasSubstr("the daemon refused " + large));
  EXPECT_THAT(instance().read("ctl.err"), HasSubstr("as far as its disk has room for a compressed copy"));
  EXPECT_TRUE(isLogged("<error> uploadFileWithURL: File upload failed for " + large));
  EXPECT_EQ(uploads().size(), 0u);
  EXPECT_TRUE(instance().read("large") == noise);
  ASSERT_TRUE(instance().daemon().isRunning());
  EXPECT_EQ(filesThatTheDaemonHasOpen(instance().path(kCopies) + "/"), std::vector<std::string>());
  EXPECT_EQ(startUpload(write("small", "text"))->wait(), 0) << instance().read("ctl.err");
  EXPECT_EQ(uploads().size(), 1u);
  stopDaemon();
}

// The server has the daemon's ear, and a friend on the device who knows when it answers.
TEST_F(UploadOverTheWireTest, aFolderThatTakesTheFoldersPlaceDuringTheUploadKeepsItsFile) {
  start();
  const std::string file = write("folder/log", "mine");
  write("others/log", "not mine");
  givenPostsAnsweredBy([this](const WireRequest&) {
    fs::rename(instance().path("folder"), instance().path("moved"));
    fs::rename(instance().path("others"), instance().path("folder"));
    return WireServer::answer(200, "success");
  });
  EXPECT_EQ(startUpload(file)->wait(), 0) << instance().read("ctl.err");
  EXPECT_TRUE(isLogged("The uploaded file " + file + " stays: its path names another file now"));
  EXPECT_EQ(instance().read("folder/log"), "not mine");
  EXPECT_EQ(instance().read("moved/log"), "mine");
  EXPECT_EQ(compression::inflate(uploads().at(0).body, 100)->view(), "mine");
}

// A client that does not use the library, and hands over whatever it likes.
class HostileUploadTest : public UploadOverTheWireTest {
 protected:
  HostileUploadTest() {
    _log.allowErrors();  // what such a client is told of its lost calls
    const Dictionary grant{{"executables", Array{Value(fs::canonical("/proc/self/exe").string())}},
                           {"entitlements", Dictionary{{kTelvanedEntitlement, true}}}};
    const auto plist = propertylist::serialize(Value(grant), propertylist::Format::XML).value();
    instance().givenFile("root/etc/telvane/entitlements.d/hostile.plist", plist.view());
    givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "success"); });
  }
  ~HostileUploadTest() override { _connection.reset(); }

  // What a client of its own make sends, which waits for nobody.
  static ipc::Limits eager() {
    ipc::Limits limits;
    limits.maximumBatchCalls = 16;
    limits.maximumBatchDescriptors = 16;
    limits.maximumBatchesUnderWay = 1000;
    return limits;
  }
  // Opens a session.
  void connect(const ipc::Limits& limits = {}) {
    _service = std::make_unique<ipc::SocketService>(_files, _dispatch, _log, _entitlements, nullptr, limits);
    auto made = _service->newConnection(kTelvanedServiceName);
    ASSERT_TRUE(made.has_value());
    _connection = *made;
    _connection->resume();
    call(ClientSessionOperation::SetSessionInfo, {sessionInfo(), userInfo(), Value(), false});
    ASSERT_EQ(ask(ClientSessionOperation::StartConfig), "answered") << instance().daemonLog();
  }
  // Returns "yes" or "no" as the daemon says, or what happened to the call.
  std::string upload(const std::string& path, FileDescriptor descriptor) {
    return ask(ClientSessionOperation::UploadFileAtPath, {Value(path)}, std::move(descriptor));
  }
  // Does not wait for the answer.
  void uploadInPassing(const std::string& path, const FileDescriptor& descriptor) {
    ipc::Invocation made = invocation(ClientSessionOperation::UploadFileAtPath, {Value(path)});
    made.descriptor = ipc::Descriptor(::fcntl(descriptor.get(), F_DUPFD_CLOEXEC, 0));
    _connection->sendWithReply(
        std::move(made), [](const Array&) {}, [](const Error&) {});
  }
  static FileDescriptor opened(const std::string& path, int flags = O_RDONLY | O_NONBLOCK) {
    FileDescriptor descriptor(::open(path.c_str(), flags | O_CLOEXEC, 0600));
    EXPECT_TRUE(descriptor.isOpen()) << path;
    return descriptor;
  }

 private:
  static ipc::Invocation invocation(ClientSessionOperation operation, Array arguments) {
    ipc::Invocation made;
    made.operation = static_cast<uint16_t>(operation);
    made.arguments = std::move(arguments);
    return made;
  }
  void call(ClientSessionOperation operation, Array arguments) {
    _connection->send(invocation(operation, std::move(arguments)), nullptr);
  }
  std::string ask(ClientSessionOperation operation, Array arguments = {}, FileDescriptor descriptor = {}) {
    ipc::Invocation made = invocation(operation, std::move(arguments));
    // Its own one, since the call gives it away.
    if (descriptor.isOpen()) made.descriptor = ipc::Descriptor(::fcntl(descriptor.get(), F_DUPFD_CLOEXEC, 0));
    const auto outcome = std::make_shared<std::promise<std::string>>();
    std::future<std::string> heard = outcome->get_future();
    _connection->sendWithReply(
        std::move(made),
        [outcome](const Array& values) {
          const bool isAnswer = values.size() == 1 && values[0].kind() == Value::Kind::Boolean;
          outcome->set_value(!isAnswer ? "answered" : values[0].booleanValue() ? "yes" : "no");
        },
        [outcome](const Error& error) { outcome->set_value(error.description()); });
    const bool hasCome = heard.wait_for(std::chrono::seconds(40)) == std::future_status::ready;
    return hasCome ? heard.get() : "nothing";
  }

  RecordingLog _log;
  PosixFileSystem _files{Paths{.root = instance().path("root"), .home = instance().path("home")}};
  ThreadedDispatch _dispatch;
  ipc::Entitlements _entitlements{_files, _log};
  std::unique_ptr<ipc::SocketService> _service;
  std::shared_ptr<ipc::Connection> _connection;
};

TEST_F(HostileUploadTest, whateverDoesNotGrantTheFileIsRefusedLikeWhatIsNoRegularFile) {
  const std::string file = write("log", "mine");
  const std::string other = write("other", "not meant");
  const std::string gone = write("gone", "deleted");
  const std::string pipe = instance().path("pipe");
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  fs::create_symlink(file, instance().path("link"));
  FileDescriptor deleted = opened(gone);
  fs::remove(gone);
  FileDescriptor memory(::memfd_create("log", MFD_CLOEXEC));
  ASSERT_EQ(::write(memory.get(), "x", 1), 1);
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct Attempt {
    const char* what;
    std::string path;
    FileDescriptor descriptor;
  };
  std::vector<Attempt> attempts;
  const auto attempt = [&attempts](const char* what, std::string path, FileDescriptor descriptor) {
    attempts.push_back({what, std::move(path), std::move(descriptor)});
  };
  attempt("a token for another file", file, opened(other));
  attempt("no token", file, {});
  attempt("a descriptor of the path alone", file, opened(file, O_PATH));
  attempt("one for writing", file, opened(file, O_WRONLY));
  attempt("a link", instance().path("link"), opened(file));
  attempt("a pipe", pipe, opened(pipe));
  attempt("a file's path and a pipe", file, opened(pipe));
  attempt("a pipe's path and a file", pipe, opened(file));
  attempt("a folder", instance().path("home"), opened(instance().path("home")));
  attempt("a device", "/dev/zero", opened("/dev/zero"));
  attempt("a deleted file", gone, std::move(deleted));
  attempt("memory", "/memfd:log (deleted)", std::move(memory));
  attempt("a socket", file, std::move(socket));
  attempt("a path through a descriptor", "/proc/self/fd/0", opened(file));
  attempt("no path", "", opened(file));
  attempt("a path with an end in its middle", "file://" + file + "%00", opened(file));
  attempt("a path that is none", "file://%zz", opened(file));
  attempt("half a path", "log", opened(file));
  attempt("a file as a folder", file + "/", opened(file));
  attempt("an endless path", std::string(100'000, '/') + file, opened(file));
  start();
  connect();
  size_t refusals = 0;
  for (Attempt& one : attempts) {
    EXPECT_EQ(upload(one.path, std::move(one.descriptor)), "no") << one.what;
    ++refusals;
    ASSERT_TRUE(eventually([&] { return linesInTheLog(instance().daemonLog(), kOnlyRegular) == refusals; }))
        << one.what;
  }
  EXPECT_EQ(uploads().size(), 0u);
  EXPECT_EQ(instance().read("log"), "mine");
  EXPECT_EQ(instance().read("other"), "not meant");
  EXPECT_EQ(upload(file, opened(file)), "yes") << "the session goes on";
  ASSERT_EQ(uploads().size(), 1u);
  EXPECT_EQ(compression::inflate(uploads()[0].body, 100)->view(), "mine");
  for (const std::string& one : {file, other, gone, pipe, std::string("/dev/zero"), std::string("/memfd:log")}) {
    EXPECT_TRUE(eventually([&] { return filesThatTheDaemonHasOpen(one).empty(); })) << one;
  }
}

// Each call that waits holds a descriptor of the daemon's, and everybody lives on these.
TEST_F(HostileUploadTest, aCrowdOfUploadsBehindOneThatWaitsLeavesTheOthersTheirDescriptors) {
  constexpr rlim_t kFewDescriptors = 512;
  constexpr int kCrowd = 2000;
  givenAServerThatWaits();
  instance().givenConsent(true);
  start();
  const rlimit limit{kFewDescriptors, kFewDescriptors};
  ASSERT_EQ(::prlimit(instance().daemon().pid(), RLIMIT_NOFILE, &limit, nullptr), 0);
  connect(eager());
  const std::string file = write("log", "text");
  uploadInPassing(file, opened(file));
  ASSERT_TRUE(hasCome(1)) << instance().daemonLog();
  for (int i = 0; i < kCrowd; ++i) uploadInPassing(file, opened(file));
  size_t most = 0;
  givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "success"); });
  ClientScript script;
  script.open(sessionInfo(), userInfo("other")).configure().send(21, 1, Dictionary{{"n", 1}}).flush();
  const auto other = WireFixture::start(script, "other");
  while (other->isRunning()) most = std::max(most, filesThatTheDaemonHasOpen(file).size());
  EXPECT_EQ(other->wait(), 0);
  EXPECT_THAT(instance().read("other.out"), HasSubstr("flushed: ok")) << instance().daemonLog();
  EXPECT_GT(most, 0u);
  EXPECT_LT(most, kFewDescriptors / 2) << "held for one client";
  EXPECT_TRUE(isLogged("hands over too many files at once"));
  letTheServerAnswer();
}

// Files that the kernel makes up say that they are empty, and are not read: what they would tell may depend on who
// reads.
TEST_F(HostileUploadTest, filesOfTheKernelAreNotRead) {
  start();
  connect();
  for (const std::string& path : {std::string("/proc/version"), "/proc/" + std::to_string(::getpid()) + "/environ"}) {
    EXPECT_EQ(upload(path, opened(path)), "no") << path;
  }
  EXPECT_TRUE(eventually([this] { return linesInTheLog(instance().daemonLog(), kIsEmpty) == 2; }))
      << instance().daemonLog();
  EXPECT_EQ(uploads().size(), 0u);
}

TEST_F(HostileUploadTest, aFileThatIsLargerThanAllUploadsMayBeIsRefusedAtOnce) {
  start();
  connect();
  const std::string file = write("large", "x");
  fs::resize_file(file, (8ull << 30) + 1);
  EXPECT_EQ(upload(file, opened(file)), "no");
  EXPECT_TRUE(isLogged("Too much is being uploaded already"));
  fs::resize_file(file, 1);
  EXPECT_EQ(upload(file, opened(file)), "yes") << "and the room is there again";
}

// The file is swapped while the daemon is held up, so that the call waits in its socket.
TEST_F(UploadOverTheWireTest, aLinkThatTakesTheFilesPlaceAfterTheCallIsRefused) {
  givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "success"); });
  start();
  const std::string file = write("log", "mine");
  const std::string other = write("other", "not mine");
  const auto client = WireFixture::start(configured().wait().upload(file));
  const auto hasSaid = [this](const char* text) {
    return eventually([this, text] { return instance().read("client.out").find(text) != std::string::npos; });
  };
  ASSERT_TRUE(hasSaid("waiting"));
  instance().daemon().stop();
  client->writeLine();
  const bool isHandedOver = hasSaid("handed over: yes");
  fs::remove(file);
  fs::create_symlink(other, file);
  instance().daemon().signal(SIGCONT);
  ASSERT_TRUE(isHandedOver);
  EXPECT_TRUE(hasSaid("uploaded: no"));
  expectEnd(*client);
  EXPECT_TRUE(isLogged(kOnlyRegular));
  EXPECT_EQ(uploads().size(), 0u);
  EXPECT_TRUE(fs::exists(other));
}

}  // namespace
}  // namespace telvane::testing
