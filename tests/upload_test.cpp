// The file upload backend against a real server: what it sends, what it refuses, what it removes.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <future>

#include "backends/UploadBackend.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/queue/TimedQueuePool.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TempDirectory.h"
#include "util/URLQuery.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;

constexpr char kNotRegular[] = "UploadBackend(uploadFileAtPath): Only upload a regular file.";
constexpr char kEmpty[] = "UploadBackend(uploadFileAtPath): Input file is empty";

FileDescriptor opened(const std::string& path, int flags = O_RDONLY) {
  return FileDescriptor(::open(path.c_str(), flags | O_CLOEXEC | O_NONBLOCK));
}

std::string token(FileDescriptor descriptor, uid_t user = ::getuid()) {
  return ExtensionTokens::shared().add({1, user}, std::move(descriptor));
}

class UploadTest : public testing::Test {
 protected:
  std::shared_ptr<VeskReportingBackend> make(const std::string& url) {
    auto made = VeskReportingBackend::newBackendWithName(
        "uploadServer", Dictionary{{"post_url", url}, {"display_url", "https://show"}}, std::nullopt, 5,
        services);
    made->setUdid("udid");
    made->setSessionID(4'000'000'000);
    return made;
  }
  bool upload(const std::string& path) { return backend->uploadFileAtPath(path, token(opened(path))); }
  std::string file(const std::string& name = "a.log", const std::string& contents = "contents") {
    return directory.write(name, contents).string();
  }

  TempDirectory directory;
  CapturedLog log;
  Counters counters;
  std::function<HTTPAnswer()> answer = [] { return HTTPAnswer::text(200, "success"); };
  RecordingServer server{[this](const HTTPReceived&, std::size_t) { return answer(); }};
  HTTPClient http;
  TimedQueuePool queues{1};
  BackendServices services{http, WallClock::system(), counters, queues, {}, {}, {}};
  std::shared_ptr<VeskReportingBackend> backend = make(server.url("/upload"));
};

TEST_F(UploadTest, SendsTheWholeFileUnderItsNameAndRemovesIt) {
  const std::string contents(300'000, 'x');
  auto path = file("x y.log", contents);
  FileDescriptor descriptor = opened(path);
  ::lseek(descriptor.get(), 100, SEEK_SET);
  EXPECT_TRUE(backend->uploadFileAtPath(path, token(std::move(descriptor))));
  ASSERT_EQ(server.count(), 1u);
  const HTTPReceived request = server.requests().at(0);
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.target,
            "/upload?uuid=udid&sequence=4000000000&description=Tellvue%20MQRC%20log%20(Uploaded%20by%20ZKS)"
            "&filename=x%20y.log.gz&raw=true");
  EXPECT_EQ(request.header("Content-Type"), "application/octet-stream");
  EXPECT_EQ(request.header("Content-Encoding"), "gzip");
  EXPECT_LT(request.body.size(), 2000u);
  EXPECT_EQ(request.decodedBody().body, contents);
  EXPECT_FALSE(fs::exists(path));
  EXPECT_EQ(log.count(7, "UploadBackend(uploadFileAtPath): Uploading file " + path), 1);
  EXPECT_EQ(log.countContaining(7, "/upload|, Json output: success"), 1);
  EXPECT_EQ(backend->displayURL(), "https://show");
}

TEST_F(UploadTest, RemovesTheFileOnlyWhenTheAnswerSaysSuccess) {
  struct Case {
    unsigned status;
    const char* answer;
    bool removed;
  };
  for (const auto& test :
       {Case{200, "unsuccessful", true}, Case{500, "{\"success\":0}", true}, Case{200, "success \xff", false},
        Case{200, "Success", false}, Case{200, "", false}, Case{503, "busy", false}}) {
    auto path = file();
    answer = [&] {
      auto made = faulty(HTTPAnswer::Fault::None, test.answer);
      made.status = test.status;
      return made;
    };
    EXPECT_TRUE(upload(path));
    EXPECT_EQ(fs::exists(path), !test.removed) << test.answer;
  }
}

TEST_F(UploadTest, RefusesWhatIsNoWholeReadableFile) {
  const std::string plain = file();
  const std::string used = token(opened(plain));
  ExtensionTokens::shared().consume(used);
  const std::string fifo = directory.path() / "fifo";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  const std::string link = directory.path() / "link";
  fs::create_symlink(plain, link);
  const std::string large = file("large");
  fs::resize_file(large, UploadBackend::kMaximumFile + 1);
  const std::string empty = file("empty", "");
  struct Case {
    const char* what;
    std::string path;
    std::string token;
    std::string line;
  };
  const Case cases[] = {
      {"a directory", directory.path(), token(opened(directory.path())), kNotRegular},
      {"a FIFO", fifo, token(opened(fifo)), kNotRegular},
      {"a device", "/dev/zero", token(opened("/dev/zero")), kNotRegular},
      {"a regular file under the path of another kind", link, token(opened(link)), kNotRegular},
      {"a URL that names no path", "", token(opened(plain)), kNotRegular},
      {"no token", plain, "", kNotRegular},
      {"a token of nobody", plain, std::string(32, 'a'), kNotRegular},
      {"a token used before", plain, used, kNotRegular},
      {"an empty file", empty, token(opened(empty)), kEmpty},
      {"a file that the client can't read", plain, token(opened(plain, O_WRONLY)), kEmpty},
      {"a file that the client can only name", plain, token(opened(plain, O_PATH)), kEmpty},
      {"a file that is too large", large, token(opened(large)),
       "UploadBackend(uploadFileAtPath): Input file has 268435457 bytes, more than the 268435456 that can be "
       "uploaded"},
  };
  for (const auto& test : cases) {
    log.clear();
    EXPECT_FALSE(backend->uploadFileAtPath(test.path, test.token)) << test.what;
    EXPECT_EQ(log.count(3, test.line), 1) << test.what;
  }
  EXPECT_EQ(server.count(), 0u);
  EXPECT_TRUE(fs::exists(plain) && fs::exists(empty) && fs::exists(large));
}

TEST_F(UploadTest, LeavesWhatIsNotTheFileThatWasSent) {
  const std::string path = directory.path() / "a.log";
  const std::string other = file("other", "of somebody else");
  struct Case {
    const char* what;
    std::function<void()> meanwhile;
  };
  const Case cases[] = {
      {"written to", [&] { std::ofstream(path, std::ios::app) << "more"; }},
      {"replaced by another file", [&] { fs::rename(file("new"), path); }},
      {"replaced by a symbolic link",
       [&] {
         fs::remove(path);
         fs::create_symlink(other, path);
       }},
  };
  for (const auto& test : cases) {
    fs::remove(path);
    file();
    answer = [&] {
      test.meanwhile();
      return HTTPAnswer::text(200, "success");
    };
    EXPECT_TRUE(upload(path));
    EXPECT_TRUE(fs::is_symlink(path) || fs::exists(path)) << test.what;
    EXPECT_TRUE(fs::exists(other)) << test.what;
  }
  answer = [] { return HTTPAnswer::text(200, "success"); };
  fs::remove(path);
  file();
  EXPECT_TRUE(backend->uploadFileAtPath(path, token(opened(path), ::getuid() + 1)));
  EXPECT_TRUE(fs::exists(path)) << "the client does not own it";
  EXPECT_TRUE(backend->uploadFileAtPath(other, token(opened(path))));
  EXPECT_TRUE(fs::exists(other)) << "the client opened another file";
}

TEST_F(UploadTest, AServerThatCanNotBeReachedCostsNothing) {
  auto path = file();
  server.stop();
  EXPECT_TRUE(upload(path));
  EXPECT_TRUE(fs::exists(path));
  EXPECT_EQ(log.countContaining(3, "UploadBackend(uploadFileAtPath): post "), 1);
  EXPECT_EQ(counters.snapshot().at(0).reason, DropReason::TransportError);
  for (const char* url : {"ftp://host/x", "https://", "http://ho st/", "nowhere"}) {
    log.clear();
    EXPECT_FALSE(make(url)->uploadFileAtPath(path, token(opened(path)))) << url;
    EXPECT_EQ(log.count(3, "UploadBackend(uploadFileAtPath): Unable to create URL request"), 1) << url;
  }
  EXPECT_FALSE(
      VeskReportingBackend::newBackendWithName("uploadServer", Dictionary(), Text("Phone"), 5, services));
  EXPECT_EQ(log.count(3, "UploadBackend(initWithName): can't resolve upload post URL."), 1);
}

TEST_F(UploadTest, AServerThatHangsHoldsUpNobodyElse) {
  std::promise<void> arrived;
  answer = [&] {
    arrived.set_value();
    return faulty(HTTPAnswer::Fault::Stall);
  };
  auto path = file();
  auto uploaded = std::async(std::launch::async, [&] { return upload(path); });
  arrived.get_future().wait();
  backend->updateState();  // these wait for the backend's own mutex
  backend->setUserInfoDict(std::nullopt);
  EXPECT_EQ(backend->state(), BackendStateEnabled);
  services.http.stopAllButPosts();
  services.uploads->close();
  EXPECT_TRUE(uploaded.get()) << "it was sent";
  EXPECT_FALSE(upload(path)) << "nothing more is let in";
  EXPECT_EQ(log.count(3, "UploadBackend(uploadFileAtPath): Too many uploads are under way"), 1);
}

TEST(UploadGateTest, LetsInWhatThereIsRoomForAndLeavesSomeToOthers) {
  UploadGate gate({.uploads = 3,
                   .bytes = 100,
                   .uploadsOfUser = 2,
                   .bytesOfUser = 90,
                   .patience = std::chrono::milliseconds(0)});
  auto first = gate.enter(1, 80);
  ASSERT_TRUE(first);
  EXPECT_FALSE(gate.enter(1, 11)) << "bytes of one user";
  EXPECT_FALSE(gate.enter(2, 21)) << "bytes";
  first->shrinkTo(40);
  first->shrinkTo(90);
  auto second = gate.enter(1, 50);
  EXPECT_TRUE(second);
  EXPECT_FALSE(gate.enter(1, 0)) << "uploads of one user";
  auto third = gate.enter(2, 10);
  EXPECT_TRUE(third);
  EXPECT_FALSE(gate.enter(3, 0)) << "uploads";
  second.reset();
  EXPECT_TRUE(gate.enter(1, 50));
}

TEST(LentFileTest, IsReadOnlyAsLongAsItsReaderWants) {
  TempDirectory directory;
  const std::string path = directory.write("file", std::string(3 << 20, 'x')).string();
  const LentFile lent(FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC)));
  std::string bytes;
  int pieces = 0;
  EXPECT_EQ(lent.read(bytes, [&] { return ++pieces < 3; }), LentFile::Reading::GivenUp);
  EXPECT_EQ(lent.read(bytes, [] { return true; }), LentFile::Reading::Whole);
  EXPECT_EQ(bytes, std::string(3 << 20, 'x'));
}

TEST(URLQueryTest, EncodesWhatAQueryMayNotHold) {
  EXPECT_EQ(encodedForURLQuery("az09-._~!$&'()*+,;=:@/?"), "az09-._~!$&'()*+,;=:@/?");
  EXPECT_EQ(encodedForURLQuery(" #%[]\"\\\n\xc3\xa9"), "%20%23%25%5B%5D%22%5C%0A%C3%A9");
}

}  // namespace
}  // namespace vesk::test
