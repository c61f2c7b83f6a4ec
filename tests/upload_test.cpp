// The file upload backend against a real server: what it sends, refuses and removes.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <thread>

#include "backends/BackendFactory.h"
#include "backends/upload/UploadBackend.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/queue/QueueThread.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;
using Line = std::pair<int, std::string>;

const std::string kUnit = "UploadBackend(uploadFileAtPath): ";

FileDescriptor opened(const std::string& path, int flags = O_RDONLY) {
  return FileDescriptor(::open(path.c_str(), flags | O_CLOEXEC | O_NONBLOCK));
}

std::string token(FileDescriptor descriptor, uid_t user = ::getuid()) {
  static std::uint64_t connection = 0;  // the number of tokens per connection is limited
  return ExtensionTokens::shared().add({++connection, user}, std::move(descriptor));
}

HTTPAnswer says(const char* text, unsigned status = 200) {
  auto answer = faulty(HTTPAnswer::Fault::None, text);
  answer.status = status;
  return answer;
}

/// How many of this process's descriptors refer to that file, whatever its name.
int openCount(const struct stat& file) {
  int count = 0;
  struct stat status {};
  for (int i = 0; i < 1024; ++i)
    count += ::fstat(i, &status) == 0 && status.st_dev == file.st_dev && status.st_ino == file.st_ino;
  return count;
}

class UploadTest : public testing::Test {
 protected:
  std::shared_ptr<UploadBackend> make(const std::string& url, std::uint32_t sessionID = 4'000'000'000) {
    return std::dynamic_pointer_cast<UploadBackend>(
        newBackendWithName("uploadServer", Dictionary{{"post_url", url}, {"display_url", "https://show"}},
                           {._sessionID = sessionID, ._udid = "udid"}, services));
  }
  bool upload(const std::string& path) { return backend->uploadFileAtPath(path, token(opened(path))); }
  std::string file(const std::string& name = "a.log", const std::string& contents = "contents") {
    return directory.write(name, contents).string();
  }
  Line started(const std::string& path) const { return {7, kUnit + "Uploading file " + path}; }
  Line answered(const std::string& text) const {
    return {7, kUnit + "sending to |" + *backend->uploadURL() + "|, Json output: " + text};
  }

  TempDirectory directory;
  CapturedLog log;
  Counters counters;
  std::function<HTTPAnswer()> answer = [] { return says("success"); };
  RecordingServer server{[this](const HTTPReceived&, std::size_t) { return answer(); }};
  HTTPClient http;
  QueueThread queues;
  BackendServices services{
      .http = http, .clock = WallClock::system(), .counters = counters, .networkQueues = queues};
  std::shared_ptr<UploadBackend> backend = make(server.url("/upload"));
};

TEST_F(UploadTest, SendsTheWholeFileUnderItsName) {
  using Case = std::tuple<std::string, const char*, std::uint32_t, const char*>;
  std::size_t count = 0;
  for (const auto& [name, sent, sessionID, behind] :
       {Case{"x y.log", "x%20y.log.gz", 4'000'000'000, ""}, Case{"a&b=c?d+e;f", "a&b=c?d+e;f.gz", 7, ""},
        Case{"100%#[\"]\xc3\xa9", "100%25%23%5B%22%5D%C3%A9.gz", 0, ""},
        Case{"slash.log", "slash.log.gz", 1, "//"}}) {
    const std::string contents(300'000, 'x');
    const std::string path = file(name, contents) + behind;
    FileDescriptor descriptor = opened(directory / name);
    ::lseek(descriptor.get(), 100, SEEK_SET);
    backend = make(server.url("/upload"), sessionID);
    log.clear();
    EXPECT_TRUE(backend->uploadFileAtPath(path, token(std::move(descriptor))));
    const HTTPReceived request = server.requests().at(count++);
    EXPECT_EQ(request.method, "POST");
    EXPECT_EQ(request.target,
              "/upload?uuid=udid&sequence=" + std::to_string(sessionID) +
                  "&description=Tellvue%20MQRC%20log%20(Uploaded%20by%20ZKS)&filename=" + sent + "&raw=true");
    EXPECT_EQ(request.header("Content-Type"), "application/octet-stream");
    EXPECT_EQ(request.header("Content-Encoding"), "gzip");
    EXPECT_LT(request.body.size(), 2000u);
    EXPECT_EQ(request.decodedBody().body, contents);
    EXPECT_FALSE(fs::exists(directory / name));
    const std::vector<Line> lines = {started(path),
                                     {7, "compressDataWithZlibOrGzip: Compressed file from 300000 to " +
                                             std::to_string(request.body.size())},
                                     answered("success")};
    EXPECT_EQ(log.lines(), lines);
  }
  EXPECT_EQ(backend->displayURL(), "https://show");
}

TEST_F(UploadTest, RemovesTheFileOnlyWhenTheAnswerSaysSuccess) {
  using Case = std::tuple<unsigned, const char*, bool, const char*>;
  for (const auto& [status, text, removed, shown] :
       {Case{200, "unsuccessful", true, "unsuccessful"}, Case{404, "\"success\"", true, "\"success\""},
        Case{500, "{\"success\":0}", true, "{\"success\":0}"}, Case{200, "success \xff", false, "(null)"},
        Case{200, "Success", false, "Success"}, Case{200, "succes", false, "succes"},
        Case{200, "", false, ""}, Case{503, "busy", false, "busy"}}) {
    auto path = file();
    answer = [code = status, body = text] { return says(body, code); };
    EXPECT_TRUE(upload(path));
    EXPECT_EQ(fs::exists(path), !removed) << text;
    EXPECT_EQ(log.lines().back(), answered(shown));
  }
}

TEST_F(UploadTest, RefusesWhatIsNoWholeReadableFileAndKeepsNothingOfIt) {
  const char* const notRegular = "Only upload a regular file.";
  const char* const isEmpty = "Input file is empty";
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
  const std::string removed = file("removed");
  FileDescriptor nameless = opened(removed);
  fs::remove(removed);
  using Case = std::tuple<const char*, std::string, std::string, std::string>;
  const Case cases[] = {
      {"a directory", directory.path(), token(opened(directory.path())), notRegular},
      {"a directory instead of the file", directory.path(), token(opened(plain)), notRegular},
      {"a FIFO", fifo, token(opened(fifo)), notRegular},
      {"a regular file under the path of another kind", link, token(opened(link)), notRegular},
      {"a URL that names no path", "", token(opened(plain)), notRegular},
      {"nothing but slashes", "//", token(opened(plain)), notRegular},
      {"no token", plain, "", notRegular},
      {"a token of nobody", plain, std::string(32, 'a'), notRegular},
      {"a token used before", plain, used, notRegular},
      {"a file that was removed", removed, token(std::move(nameless)), notRegular},
      {"a name that is not there", directory.path() / "nothing", token(opened(plain)), notRegular},
      {"an empty file", empty, token(opened(empty)), isEmpty},
      {"a file that the client can't read", plain, token(opened(plain, O_WRONLY)), isEmpty},
      {"a file that the client can only name", plain, token(opened(plain, O_PATH)), isEmpty},
      {"a file that is too large", large, token(opened(large)),
       "Input file has 268435457 bytes, more than the 268435456 that can be uploaded"},
  };
  struct stat plainFile {};
  ASSERT_EQ(::stat(plain.c_str(), &plainFile), 0);
  for (const auto& [what, path, lent, line] : cases) {
    log.clear();
    EXPECT_FALSE(backend->uploadFileAtPath(path, lent)) << what;
    EXPECT_EQ(log.lines(), (std::vector<Line>{started(path), {3, kUnit + line}})) << what;
    EXPECT_FALSE(ExtensionTokens::shared().consume(lent)) << what;
  }
  EXPECT_EQ(openCount(plainFile), 0);
  EXPECT_EQ(server.count(), 0u);
  EXPECT_TRUE(fs::exists(plain) && fs::exists(empty) && fs::exists(large));

  backend->setUploadURL(std::nullopt);
  log.clear();
  const std::string unused = token(opened(plain));
  EXPECT_FALSE(backend->uploadFileAtPath(plain, unused));
  EXPECT_EQ(log.lines(), std::vector<Line>{started(plain)});
  EXPECT_TRUE(ExtensionTokens::shared().consume(unused)) << "without a server there is no use for it";
}

TEST_F(UploadTest, BelievesAPathThatItCanNotSee) {
  const std::string path = file("hidden/a.log");
  EXPECT_TRUE(backend->uploadFileAtPath("/nowhere/at/all/b.log", token(opened(path))));
  EXPECT_EQ(*server.requests().at(0).query("filename"), "b.log.gz");
  struct stat hidden {};
  ASSERT_EQ(::stat(path.c_str(), &hidden), 0);
  EXPECT_EQ(openCount(hidden), 0);
  // A thread with its own mounts, like a service with PrivateTmp=.
  std::thread([&] {
    const std::string covered = directory.path() / "hidden";
    const std::string seen = token(opened(path));
    const std::string other = token(opened(path));
    if (::unshare(CLONE_NEWNS) != 0 || ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        ::mount("tmpfs", covered.c_str(), "tmpfs", 0, nullptr) != 0) {
      GTEST_SKIP() << "needs the right to mount";
    }
    EXPECT_TRUE(backend->uploadFileAtPath(covered + "/./a.log", seen));
    EXPECT_FALSE(backend->uploadFileAtPath(covered + "/other.log", other));
  }).join();
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(UploadTest, LeavesWhatIsNotTheFileThatWasSent) {
  const std::string path = directory.path() / "a.log";
  const std::string other = file("other", "of somebody else");
  const std::function<void()> cases[] = {
      [&] { std::ofstream(path, std::ios::app) << "more"; },
      [&] { fs::rename(file("new"), path); },
      [&] { fs::remove(path), fs::create_symlink(other, path); },
  };
  for (const auto& meanwhile : cases) {
    fs::remove(path);
    file();
    answer = [&] {
      meanwhile();
      return says("success");
    };
    EXPECT_TRUE(upload(path));
    EXPECT_TRUE(fs::is_symlink(path) || fs::exists(path));
    EXPECT_TRUE(fs::exists(other));
    EXPECT_EQ(log.lines().back(), Line(7, kUnit + "Left in its place: " + path));
  }
  answer = [] { return says("success"); };
  fs::remove(path);
  file();
  EXPECT_TRUE(backend->uploadFileAtPath(path, token(opened(path), ::getuid() + 1)));
  EXPECT_TRUE(fs::exists(path)) << "the client does not own it";
  EXPECT_TRUE(backend->uploadFileAtPath(other, token(opened(path))));
  EXPECT_TRUE(fs::exists(other)) << "the client opened another file";
}

TEST_F(UploadTest, AServerThatCanNotBeReachedCostsNothing) {
  auto path = file();
  const std::string empty = file("empty", "");
  server.stop();
  HTTPRequest request;
  request.url = server.url("/upload");
  std::string expected = kUnit + "post " + http.perform(std::move(request)).error->description;
  EXPECT_TRUE(upload(path));
  EXPECT_TRUE(fs::exists(path));
  auto [level, line] = log.lines().back();
  // The line contains the duration in milliseconds.
  for (std::string* text : {&expected, &line})
    std::erase_if(*text, [](char c) { return c >= '0' && c <= '9'; });
  EXPECT_EQ(level, 3);
  EXPECT_EQ(line, expected);
  ASSERT_EQ(counters.snapshot().size(), 1u);
  EXPECT_EQ(counters.snapshot()[0].backend, "uploadServer");
  EXPECT_EQ(counters.snapshot()[0].reason, DropReason::TransportError);
  for (const char* url : {"ftp://host/x", "https://", "http://ho st/", "nowhere"}) {
    EXPECT_FALSE(make(url)->uploadFileAtPath(path, token(opened(path)))) << url;
    EXPECT_EQ(log.lines().back(), Line(3, kUnit + "Unable to create URL request")) << url;
    EXPECT_FALSE(make(url)->uploadFileAtPath(empty, token(opened(empty))));
    EXPECT_EQ(log.lines().back(), Line(3, kUnit + "Input file is empty")) << "which is looked at first";
  }
  const std::optional<Dictionary> profiles[] = {std::nullopt, Dictionary{{"display_url", "https://show"}}};
  for (const auto& profile : profiles) {
    log.clear();
    EXPECT_FALSE(newBackendWithName("uploadServer", profile, {}, services));
    EXPECT_EQ(log.lines(),
              (std::vector<Line>{{3, "UploadBackend(initWithName): can't resolve upload post URL."}}));
  }
}

TEST_F(UploadTest, AServerThatHangsHoldsUpNobodyElse) {
  std::promise<void> arrived;
  answer = [&] {
    arrived.set_value();
    return faulty(HTTPAnswer::Fault::Stall);
  };
  auto path = file();
  auto uploaded = std::async(std::launch::async, [&] { return upload(path); });
  ASSERT_EQ(arrived.get_future().wait_for(std::chrono::seconds(30)), std::future_status::ready);
  backend->updateState();  // these wait for the backend's own mutex
  backend->setUserInfoDict(std::nullopt);
  EXPECT_EQ(backend->state(), BackendStateEnabled);
  services.http.stopAllButPosts();
  services.uploads->close();
  EXPECT_TRUE(uploaded.get()) << "it was sent";
  EXPECT_EQ(log.count(3, kUnit + "post the daemon stops"), 1);
  EXPECT_FALSE(upload(path)) << "nothing more is let in";
  EXPECT_EQ(log.count(3, kUnit + "Too many uploads are under way"), 1);
}

TEST_F(UploadTest, TakesItsUsersShareForTheFileAndItsCompressedForm) {
  using std::chrono::milliseconds;
  const std::string contents(100'000, 'x');
  const std::string path = file("a.log", contents);
  const uid_t user = ::getuid();
  bool hasRoomMeanwhile = false;
  answer = [&] {
    // The compressed form takes little memory, but it still counts as one upload of this user.
    hasRoomMeanwhile = services.uploads->enter(user + 1, 190'000) && !services.uploads->enter(user, 0);
    return says("received");
  };
  for (std::size_t bytes : {199'999u, 200'000u}) {
    services.uploads = std::make_shared<UploadGate>(UploadGate::Limits{
        .bytes = bytes, .uploadsOfUser = 1, .bytesOfUser = bytes, .patience = milliseconds(0)});
    backend = make(server.url("/upload"));
    EXPECT_EQ(upload(path), bytes == 200'000);
    EXPECT_EQ(log.count(3, kUnit + "Too many uploads are under way"), 1);
  }
  EXPECT_TRUE(hasRoomMeanwhile);
  EXPECT_TRUE(services.uploads->enter(user, 200'000)) << "all of it is free again";
}

}  // namespace
}  // namespace vesk::test
