// The C API and the recorder, as the tests of a program use them.
#include <VeskReporting/testing/Recorder.h>
#include <VeskReporting/veskreporting.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <semaphore>

#include "tests/support/TempDirectory.h"

namespace vesk::test {

namespace {

using vesk::testing::Recorder;

struct Freed {
  void operator()(vesk_session* session) const { vesk_session_free(session); }
  void operator()(vesk_dictionary* dictionary) const { vesk_dictionary_free(dictionary); }
  void operator()(vesk_result* result) const { vesk_result_free(result); }
};
using Session = std::unique_ptr<vesk_session, Freed>;
using Built = std::unique_ptr<vesk_dictionary, Freed>;

Session identified() {
  Session session(vesk_session_new(nullptr));
  const vesk_identity identity{sizeof identity, 5, "Camera", "", 7, 2, 1, 0};
  EXPECT_EQ(vesk_session_identify(session.get(), &identity), VESK_QUEUED);
  return session;
}

VeskValueView textValue(const char* text, std::size_t length) {
  VeskValueView value{};
  value.kind = VeskValueText;
  value.as.text = {text, length};
  return value;
}

}  // namespace

TEST(Recorder, SeesAtOnceWhatSessionsCall) {
  const TempDirectory directory;
  const std::string file = directory / "crash.log";
  std::ofstream(file) << "log";
  const Dictionary payload{{"text", "é"},
                           {"none", Value()},
                           {"list", List{1, -2.5, true, Bytes("\0b"), List{"x"}, Dictionary{}}},
                           {"nested", Dictionary{{"big", std::uint64_t{1} << 63}, {"date", Date{1.5}}}}};
  const Dictionary once{{"sessionID", 9}, {"clientType", 6}};
  Recorder recorder;
  {
    VeskReporting session;
    EXPECT_EQ(session.setSessionInfo(ReportingSession{.clientType = 5, .clientName = "Camera"}),
              ReportingStatus::Queued);
    EXPECT_EQ(session.startConfig(nullptr), ReportingStatus::Queued);
    EXPECT_EQ(session.sendMessage(3, 1, payload), ReportingStatus::Queued);
    EXPECT_EQ(session.sendMessage({{"category", 9}, {"type", 8}, {"flag", 1}}), ReportingStatus::Queued);
    EXPECT_EQ(session.fetchStates(Dictionary{{"clientName", "Gallery"}}).answer, BackendNames{"httpPost"});
    EXPECT_EQ(session.sendMessageOnce(once, std::nullopt, 1, 2), ReportingStatus::Queued);
    EXPECT_EQ(session.sendMessageAndWait(4, 1).status, ReportingStatus::Done);
    EXPECT_EQ(session.flushMessages(), ReportingStatus::Queued);
    EXPECT_EQ(session.fetchDisplayURL().answer, "URL not available");
    EXPECT_TRUE(session.uploadFile(file).answer);
    EXPECT_TRUE(session.uploadLogData({"line", 2}).answer);

    const auto messages = recorder.messages();
    ASSERT_EQ(messages.size(), 4U);
    EXPECT_EQ(messages[0].payload, payload);
    EXPECT_EQ(messages[0].sessionInfo->find("requireUserInfo")->asBoolean(), true);
    EXPECT_EQ(messages[0].userInfo, (Dictionary{{"clientName", "Camera"}}));
    EXPECT_EQ(messages[1].category * 10 + messages[1].type, 98);
    EXPECT_EQ(messages[1].flag, 1);
    EXPECT_EQ(messages[2].sessionInfo, once);
    EXPECT_EQ(messages[3].userInfo, (Dictionary{{"clientName", "Gallery"}}));
    EXPECT_EQ(recorder.files(), std::vector<std::string>{file});
    EXPECT_EQ(recorder.logData(), (std::vector<List>{{"line", 2}}));
    EXPECT_EQ(recorder.count(VESK_RECORDED_FLUSH), 1U);
    EXPECT_EQ(recorder.count(0), 11U);
  }
  recorder.clear();
  recorder.setBackends(std::nullopt);
  VeskReporting session;
  EXPECT_EQ(session.startConfig().answer, std::nullopt);
  EXPECT_EQ(recorder.count(0), 1U);
}

TEST(Recorder, TakesSessionsThatNameNoSocketWhileItExists) {
  ReportingOptions elsewhere;
  elsewhere.socketPath = "/nonexistent/socket";
  auto recorder = std::make_unique<Recorder>();
  VeskReporting named(elsewhere);
  EXPECT_EQ(named.connect(std::chrono::milliseconds(0)).status, ReportingStatus::NotConnected);
  {
    const Recorder newer;
    VeskReporting session;
    EXPECT_EQ(session.flushMessages(), ReportingStatus::Queued);
    EXPECT_EQ(newer.count(0), 1U);
  }
  EXPECT_EQ(recorder->count(0), 0U);
  VeskReporting session;
  EXPECT_TRUE(session.connect());
  recorder.reset();
  // Its session has lost the connection, and there is no other recorder.
  EXPECT_EQ(session.connect(std::chrono::milliseconds(0)).status, ReportingStatus::NotConnected);
}

TEST(Recorder, BelongsToTheProcessThatMadeIt) {
  vesk_recorder* recorder = vesk_recorder_new();
  VeskReporting session;
  const pid_t child = ::fork();
  if (child == 0) {
    vesk_recorder_free(recorder);
    ::_exit(0);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(session.flushMessages(), ReportingStatus::Queued);
  EXPECT_EQ(vesk_recorder_count(recorder, VESK_RECORDED_FLUSH), 1U);
  vesk_recorder_free(recorder);
  vesk_recorder_free(nullptr);
}

TEST(CApi, BuildsDictionariesAndDeliversAnswers) {
  const Recorder recorder;
  const auto session = identified();
  const Built inner(vesk_dictionary_new()), payload(vesk_dictionary_new());
  EXPECT_EQ(vesk_dictionary_set_double(inner.get(), "ratio", 0.5), VESK_DONE);
  EXPECT_EQ(vesk_dictionary_set_text(payload.get(), "text", "first"), VESK_DONE);
  EXPECT_EQ(vesk_dictionary_set_integer(payload.get(), "number", INT64_MIN), VESK_DONE);
  EXPECT_EQ(vesk_dictionary_view(payload.get())->count, 2U);
  EXPECT_EQ(vesk_dictionary_set_boolean(payload.get(), "flag", 7), VESK_DONE);
  EXPECT_EQ(vesk_dictionary_set_dictionary(payload.get(), "inner", inner.get()), VESK_DONE);
  const auto second = textValue("second!", 6);
  EXPECT_EQ(vesk_dictionary_set(payload.get(), "text", &second), VESK_DONE);

  std::binary_semaphore isAnswered{0};
  const vesk_completion completion{[](void* context, const vesk_result* result) {
                                     EXPECT_EQ(vesk_result_status(result), VESK_DONE);
                                     EXPECT_EQ(vesk_result_text(result), nullptr);
                                     static_cast<std::binary_semaphore*>(context)->release();
                                   },
                                   &isAnswered, VESK_DEFAULT_TIMEOUT_MS};
  ASSERT_EQ(vesk_session_send(session.get(), 3, 1, vesk_dictionary_view(payload.get()), &completion),
            VESK_QUEUED);
  isAnswered.acquire();
  EXPECT_EQ(
      recorder.messages().at(0).payload,
      (Dictionary{
          {"text", "second"}, {"number", INT64_MIN}, {"flag", true}, {"inner", Dictionary{{"ratio", 0.5}}}}));

  vesk_result* made = nullptr;
  ASSERT_EQ(vesk_session_start_wait(session.get(), VESK_DEFAULT_TIMEOUT_MS, &made), VESK_DONE);
  const std::unique_ptr<vesk_result, Freed> result(made);
  EXPECT_EQ(vesk_result_accepted(made), 1);
  EXPECT_STREQ(vesk_result_backend(made, 0), "httpPost");
  EXPECT_EQ(vesk_result_backend(made, 1), nullptr);
}

TEST(CApi, RefusesBadArgumentsAndReleasesWhatItWasGiven) {
  const Recorder recorder;
  const auto session = identified();
  VeskEntryView deep[70];
  for (std::size_t i = 0; i < std::size(deep); ++i) {
    deep[i] = {{"d", 1}, {}};
    deep[i].value.kind = VeskValueDictionary;
    if (i + 1 < std::size(deep)) deep[i].value.as.dictionary = {&deep[i + 1], 1};
  }
  const VeskEntryView unknown{{"k", 1}, {99, {}}};
  const VeskEntryView broken{{"k", 1}, textValue("\xff", 1)};
  for (const VeskDictionaryView view : {VeskDictionaryView{deep, 1}, {&unknown, 1}, {&broken, 1}}) {
    EXPECT_EQ(vesk_session_send(session.get(), 1, 1, &view, nullptr), VESK_INVALID_ARGUMENT);
    EXPECT_EQ(vesk_session_configure(session.get(), &view, nullptr, nullptr, 0, nullptr),
              VESK_INVALID_ARGUMENT);
  }
  EXPECT_EQ(vesk_session_drops(session.get(), VESK_DROPPED_INVALID), 6U);

  EXPECT_EQ(vesk_session_send(nullptr, 1, 1, nullptr, nullptr), VESK_OUT_OF_RESOURCES);
  EXPECT_EQ(vesk_session_send_parameters(session.get(), nullptr, nullptr), VESK_INVALID_ARGUMENT);
  EXPECT_EQ(vesk_session_upload_log_data(session.get(), nullptr, nullptr), VESK_INVALID_ARGUMENT);
  EXPECT_EQ(vesk_session_upload_file(session.get(), "/", nullptr), VESK_FILE_UNAVAILABLE);
  EXPECT_EQ(vesk_session_identify(session.get(), nullptr), VESK_INVALID_ARGUMENT);
  EXPECT_EQ(vesk_dictionary_set_text(nullptr, "k", ""), VESK_INVALID_ARGUMENT);
  EXPECT_STREQ(vesk_status_text(99), "unknown");

  int released = 0;
  const vesk_aggregation aggregation{[](void*, const vesk_aggregated*) {},
                                     [](void* context) { ++*static_cast<int*>(context); }, &released};
  EXPECT_EQ(vesk_session_configure(session.get(), nullptr, nullptr, nullptr, 0, &aggregation),
            VESK_INVALID_ARGUMENT);
  EXPECT_EQ(released, 1);
  const VeskDictionaryView empty{};
  EXPECT_EQ(vesk_session_configure(session.get(), &empty, nullptr, nullptr, 0, &aggregation), VESK_QUEUED);
  EXPECT_EQ(vesk_session_configure(session.get(), &empty, nullptr, nullptr, 0, nullptr), VESK_QUEUED);
  EXPECT_EQ(released, 2);
}

}  // namespace vesk::test
