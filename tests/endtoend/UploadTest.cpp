// Files that real clients hand over to a real daemon, and what becomes of them.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <random>

#include "interfaces/ClientSessionInterface.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Compression.h"
#include "platform/PropertyList.h"
#include "tests/endtoend/Instance.h"
#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

constexpr char kOnlyRegular[] = "UploadBackend(uploadFileAtPath): Only upload a regular file.";
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
  size_t refusalsInTheLog() const {
    const std::string log = instance.daemonLog();
    size_t lines = 0;
    for (size_t at = log.find(kOnlyRegular); at != std::string::npos; at = log.find(kOnlyRegular, at + 1)) ++lines;
    return lines;
  }
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
  EXPECT_EQ(fs::exists(instance.path("home/Library/Caches/telvaned/uploads")) &&
                !fs::is_empty(instance.path("home/Library/Caches/telvaned/uploads")),
            false);
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
  EXPECT_TRUE(isLogged("UploadBackend(uploadFileAtPath): Input file is empty"));
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
  std::string noise(24u << 20, '\0');
  std::minstd_rand random(1);
  for (char& c : noise) c = static_cast<char>(random() >> 8);
  EXPECT_EQ(upload(write("noise", noise)), 0) << complained();
  EXPECT_LT(peakMemory(instance.daemon().pid()) - before, kMostKiB) << "for 24 MiB that do not";
  EXPECT_TRUE(arrived("noise.gz") == noise);
}

// A server of the test's own, which sees the bytes and answers what it likes.
class UploadOverTheWireTest : public WireFixture {
 protected:
  void start() {
    Dictionary section = WireFixture::section("splunk", Array{Value(clientEntry())});
    section.set("upload_server", Dictionary{{kProfilePostURL, server().url("/upload")}});
    givenSection(section);
    startDaemon();
  }
  bool isLogged(const std::string& text) {
    return eventually([this, &text] { return instance().daemonLogHas(text); });
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
