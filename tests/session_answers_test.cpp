// Messages, flushes and uploads of a session: what is accepted and what is answered.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/ipc/ExtensionTokens.h"
#include "platform/unicode/UTF8.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/SessionHarness.h"

namespace vesk::test {
namespace {

std::string displayURL(DrivenSession& session) {
  std::string url;
  session->fetchDisplayURL({[&](const std::string& reply) { url = reply; }, nullptr});
  return url;
}

TEST_F(Session, ParametersAreCheckedAndCut) {
  auto session = started(storebag("httpPost"));
  EXPECT_EQ(session.send(Dictionary{{"payload", Dictionary()}}), std::nullopt);
  EXPECT_EQ(session.send(Dictionary{{"category", 1}}), std::nullopt);
  EXPECT_EQ(session.send(message("one", 2)), std::nullopt) << "a text is no category";
  EXPECT_EQ(session.send(message(1, nullptr)), std::nullopt);
  EXPECT_EQ(harness.dropped(DropReason::InvalidMessage), 4u);
  constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
  const std::pair<Value, int> numbers[] = {{65537, 1}, {-1, 65535}, {2.9, 2}, {true, 1}, {kNaN, 0}};
  for (const auto& [number, expected] : numbers) {
    session.send(message(number, 8));
    EXPECT_EQ(lastEvent().at("_method"), expected);
    EXPECT_EQ(lastEvent().at("_status"), 8);
    session.send(message(8, number));
    EXPECT_EQ(lastEvent().at("_status"), expected);
  }
  EXPECT_EQ(harness.posts().size(), 1u + 10u);
  session->sendMessageWithCategory(6, 7, Dictionary{{"a", "b"}}, {});
  EXPECT_EQ(lastEvent().at("_method"), 6);
  EXPECT_EQ(lastEvent().at("_status"), 7);
  EXPECT_EQ(lastEvent().at("a"), "b");

  auto holding = started(storebag("httpPost~"));
  const std::pair<Value, bool> flags[] = {{0, false},   {1, true},        {2, false},           {3, true},
                                          {"1", false}, {nullptr, false}, {4'294'967'297, true}};
  for (const auto& [flag, isRealtime] : flags) {
    EXPECT_EQ(holding.send(merged(message(3, 2), Dictionary{{"flag", flag}})).has_value(), isRealtime)
        << describe(flag);
  }
  EXPECT_EQ(holding.send(message(3, 2)), std::nullopt);
}

TEST_F(Session, TheAnswerIsTheHTTPPostBackendsOrTheDashboards) {
  // sent: whose answer: P of httpPost, D of the dashboard
  // loggedBySend: whose answer is in the message log; 2: httpPost2
  // flushed, loggedByFlush: the same for a flush
  const std::tuple<const char*, std::string, std::string, std::string, std::string> rows[] = {
      {"httpPost dashboard", "P", "PD", "", ""},
      {"dashboard httpPost", "P", "PD", "", ""},
      {"httpPost~ dashboard", "D", "D", "P", "P"},
      {"dashboard httpPost~", "D", "D", "P", "P"},
      {"httpPost2", "", "2", "", ""},
      {"httpPost2 dashboard", "D", "2D", "", ""},
      {"dashboard httpPost2~", "D", "D", "", "2"},
      {"httpPost~ httpPost2", "", "2", "P", "P"},
      {"", "", "", "", ""}};
  auto whose = [](const std::optional<std::string>& answer) {
    return !answer ? "" : answer->starts_with("{") ? "P" : "D";
  };
  for (const auto& [backends, sent, loggedBySend, flushed, loggedByFlush] : rows) {
    SCOPED_TRACE(backends);
    auto session = started(storebag(backends));
    auto check = [&](const std::string& operation, const std::string& expected, const std::string& log,
                     auto act) {
      std::optional<std::string> answer;
      const std::string lines = logged([&] { answer = act(); });
      EXPECT_EQ(whose(answer), expected) << operation;
      std::string from;
      for (const char* name : {"Post", "Post2", "dashboard"})
        if (contains(lines, name + (" -> " + operation + "] ")))
          from += name == std::string("dashboard") ? 'D' : name == std::string("Post") ? 'P' : '2';
      EXPECT_EQ(from, log) << lines;
    };
    check("sendMessageWithDictionary", sent, loggedBySend, [&] { return session.send(message(3, 2)); });
    check("flushMessages", flushed, loggedByFlush, [&] { return session.flush(); });
  }
}

TEST_F(Session, AnAnswerIsCutToWhatFitsIntoAMessage) {
  auto session = started(storebag("httpPost~"));
  session.flush();
  auto answerTo = [&](const std::string& text) {
    session.send(message(3, 2, Dictionary{{"a", text}}));
    return session.flush().value();
  };
  const std::size_t rest = answerTo("").size();
  EXPECT_EQ(answerTo(std::string(kMaxAnswerBytes - rest, 'x')).size(), std::size_t{1} << 20);
  for (std::size_t shift = 0; shift < 4; ++shift) {
    std::string text(shift, 'x');
    while (text.size() <= kMaxAnswerBytes) text += "\xF0\x9F\x90\x8B";
    std::string answer;
    const std::string lines = logged([&] { answer = answerTo(text); });
    EXPECT_LE(answer.size(), kMaxAnswerBytes);
    EXPECT_GT(answer.size(), kMaxAnswerBytes - 4);
    EXPECT_TRUE(isValidUTF8(answer)) << shift;
    const std::string last = "\n[cut: this answer has " + std::to_string(rest + text.size()) + " bytes]";
    ASSERT_TRUE(answer.ends_with(last)) << answer.substr(answer.size() - 60);
    EXPECT_TRUE(contains(lines, answer.substr(0, answer.size() - last.size())));
    EXPECT_TRUE(contains(lines, text)) << "the message log has all of it";
  }
}

TEST_F(Session, DisplayURLComesFromTheFirstBackendThatHasOne) {
  const std::pair<const char*, const char*> cases[] = {
      {"httpPost", "URL not available"},
      {"uploadServer+", "URL not available"},
      {"dashboard+ httpPost2+ httpPost+", "http://httpPost?sequences=77&override=yes"},
      {"dashboard+ httpPost2+ httpPost", "http://httpPost2?sequences=77&override=yes"},
      {"httpPost httpPost2 dashboard+", "http://dashboard?sequences=77&override=yes"},
      {"dashboard", "URL not available"},
      {"", "URL not available"}};
  for (const auto& [backends, expected] : cases) {
    auto session = started(storebag(backends));
    EXPECT_EQ(displayURL(session), expected) << backends;
  }
  auto session = started(storebag("httpPost+"), identified(5, 3'000'000'000));
  EXPECT_EQ(displayURL(session), "http://httpPost?sequences=-1294967296&override=yes");
}

TEST_F(Session, UploadsAreOfferedToEveryBackend) {
  RecordingServer server([](const HTTPReceived&, std::size_t) { return HTTPAnswer::text(200, "success"); });
  CapturedLog log;
  std::optional<bool> uploaded;
  auto twice = [&](const char* name, bool first, bool second) {
    MutableDictionary section;
    for (const bool takes : {first, second}) {
      Dictionary profile{{"ip", "127.0.0.1"}, {"port", 9}};
      section.append(Text(name), takes ? merged(profile, Dictionary{{"post_url", server.url()}}) : profile);
    }
    return section.share();
  };
  {
    // The first backend takes the descriptor, so none is left for the second.
    auto session = started(twice("uploadServer", true, true));
    const std::string path = testRoot().write("a.log", "text").string();
    FileDescriptor file(::open(path.c_str(), O_RDONLY));
    const std::string token = ExtensionTokens::shared().add({1, ::getuid()}, std::move(file));
    const std::string lines = logged([&] {
      session->uploadFileAtPath("file://" + path, token,
                                {[&](const bool& reply) { uploaded = reply; }, nullptr});
    });
    EXPECT_EQ(uploaded, true);
    EXPECT_TRUE(contains(lines, ") [uploadFileWithURL] Upload succeeded for file file://" + path + "\n"));
    EXPECT_EQ(log.count(7, "UploadBackend(uploadFileAtPath): Uploading file " + path), 2);
    EXPECT_EQ(log.count(7, "uploadFileWithURL: File upload successful for " + path), 1);
  }
  for (const auto& [first, second] : {std::pair{true, true}, {true, false}, {false, true}, {false, false}}) {
    const std::size_t before = server.count();
    auto session = started(twice("dashboard", first, second));
    session->uploadLogData(
        {1}, {[&](const bool& reply, const auto& error) { uploaded = !error && reply; }, nullptr});
    EXPECT_EQ(uploaded, first || second);
    EXPECT_EQ(server.count() - before, std::size_t{first} + std::size_t{second}) << "each is asked";
  }
  EXPECT_EQ(log.count(7, "uploadLogData: Log data array upload successful"), 3);
  EXPECT_EQ(harness.dropped(DropReason::UploadFailed), 1u);
}

}  // namespace
}  // namespace vesk::test
