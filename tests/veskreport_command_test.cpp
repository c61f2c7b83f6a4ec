// Runs the veskreport program with a recording daemon, and without one.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <sstream>

#include "platform/ipc/UnixSocket.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/RecordingDaemon.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

struct Outcome {
  int status = -1;
  std::string output;
  std::string errors;
};

std::vector<std::string> words(const std::string& line) {
  std::istringstream in(line);
  return {std::istream_iterator<std::string>(in), {}};
}

class VeskreportCommand : public testing::Test {
 protected:
  Outcome run(std::vector<std::string> arguments, std::string input = {}) const {
    arguments.insert(arguments.begin(), VESK_BIN_DIRECTORY "/veskreport");
    ChildProcess process(ChildProcess::Options{.command = std::move(arguments), .input = std::move(input)});
    return {process.wait().value_or(-1), process.output(), process.errors()};
  }
  /// Runs it with the options of a client of the recording daemon.
  Outcome runClient(std::vector<std::string> arguments, std::string input = {}) const {
    for (const char* more :
         {"--root", root.c_str(), "--client-type", "5", "--session-id", "7", "--service-name", "Demo"})
      arguments.emplace_back(more);
    return run(std::move(arguments), std::move(input));
  }

  TempDirectory directory;
  std::string root = directory.path().string();
  Record record;
  std::optional<RecordingDaemon> daemon{std::in_place,
                                        root + "/run/veskreportingd/com.corvane.veskreportingd", record};
};

TEST_F(VeskreportCommand, EachCommandPrintsItsAnswer) {
  auto file = directory.write("log.txt", "contents").string();
  struct Case {
    std::vector<std::string> arguments;
    std::string output;
    std::string call;
  };
  for (const Case& c : {
           Case{{"states", "--start"}, "httpPost\nwren", R"(fetchStates {"serviceName": "Demo"})"},
           Case{{"states", "--start", "--json"},
                R"({"status":"done","backends":["httpPost","wren"]})",
                R"(fetchStates {"serviceName": "Demo"})"},
           Case{{"display-url"}, "https://display.example/", "fetchDisplayURL"},
           Case{{"flush"}, "posted all", "flush"},
           Case{{"send", "-c", "1", "-t", "2", "k=v", "n:=3"},
                "accepted",
                R"(parameters {"category": 1, "type": 2, "payload": {"k": "v", "n": 3}, "flag": 0})"},
           Case{{"send", "-c", "1", "-t", "2", "--realtime", "--override-sampling", "--json"},
                R"({"status":"done","answer":null,"backends":{}})",
                R"(parameters {"category": 1, "type": 2, "flag": 3})"},
           Case{{"send", "-c", "4", "-t", "2", "--no-wait"},
                "accepted",
                R"(parameters {"category": 4, "type": 2, "flag": 0})"},
           Case{{"send-once", "-c", "1", "-t", "2", "k=v"}, "finished", "messageOnce "},
           Case{{"upload-file", file}, "uploaded " + file, "uploadFile file://" + file + " contents"},
           Case{{"send", "-c", "5", "-t", "2", "[a=1,b]"},
                "accepted",
                R"(parameters {"category": 5, "type": 2, "payload": {"[a": "1,b]"}, "flag": 0})"},
           Case{{"upload-log", "[a, b]", "two"},
                "uploaded log data of 2 entries",
                R"(uploadLogData ["[a, b]", "two"])"},
       }) {
    SCOPED_TRACE(c.arguments.front());
    auto outcome = runClient(c.arguments);
    EXPECT_EQ(outcome.status, 0);
    EXPECT_EQ(outcome.output, c.output + "\n");
    EXPECT_EQ(outcome.errors, "");
    EXPECT_TRUE(record.waitFor(c.call));
  }
}

TEST_F(VeskreportCommand, AggregatePrintsWhatTheDaemonSendsAndEndsWithIt) {
  for (bool json : {false, true}) {
    ChildProcess process({VESK_BIN_DIRECTORY "/veskreport", "aggregate", "--root", root, "--client-type", "5",
                          json ? "--json" : "--batch"});
    ASSERT_TRUE(record.waitFor("startConfig", json ? 2 : 1));
    daemon->sendToClient(Dictionary{{"sessionID", 102}}, 1'700'000'000.25, 3, 2, Dictionary{{"a", 1}});
    daemon->sendToClient(Dictionary{{"sessionID", 103}}, 1'700'000'001, 4, 0, std::nullopt);
    daemon->sendToClient(std::nullopt, 0, 0, 0, std::nullopt);
    EXPECT_EQ(process.wait(), 0);
    EXPECT_EQ(
        process.output(),
        json
            ? R"({"status":"done","sessionInfo":{"sessionID":102},"time":1700000000.25,"category":3,"type":2,)"
              R"("payload":{"a":1}})"
              "\n"
              R"({"status":"done","sessionInfo":{"sessionID":103},"time":1700000001.0,"category":4,"type":0,)"
              R"("payload":null})"
              "\n"
              R"({"status":"done","received":2,"closed":true})"
              "\n"
            : "2023-11-14T22:13:20.250Z category 3 type 2 payload {\"a\":1} session {\"sessionID\":102}\n"
              "2023-11-14T22:13:21.000Z category 4 type 0 payload none session {\"sessionID\":103}\n");
  }
}

TEST_F(VeskreportCommand, AggregateEndsWhenItIsToldTo) {
  const std::vector<std::string> command{
      VESK_BIN_DIRECTORY "/veskreport", "aggregate", "--count", "1", "--root", root, "--client-type", "5"};
  ChildProcess process(command);
  ASSERT_TRUE(process.waitForText("waiting for messages"));
  process.signal(SIGTERM);
  EXPECT_EQ(process.wait(), 0);
  ChildProcess counting(command);
  ASSERT_TRUE(record.waitFor("startConfig", 2));
  daemon->sendToClient(Dictionary{{"sessionID", 102}}, 1, 3, 2, std::nullopt);
  EXPECT_EQ(counting.wait(), 0);
  record.holdsAnswers = true;
  ChildProcess starting(command);
  ASSERT_TRUE(record.waitFor("startConfig", 3));
  starting.signal(SIGTERM);
  EXPECT_EQ(starting.wait(), 128 + SIGTERM);
}

TEST_F(VeskreportCommand, IntroducesItselfAsTheOptionsSay) {
  runClient({"states", "--start", "--client-version", "3", "--client-name", "[Camera]", "--user-info",
             "region=north", "--user-info", "floor:=2", "--batch"});
  EXPECT_EQ(
      record.lines().front(),
      R"(setSessionInfo {"sessionID": 7, "clientType": 5, "clientVersion": 3, "requireUserInfo": true, )"
      R"("batchEvent": true} {"clientName": "[Camera]", "serviceName": "Demo", "region": "north", "floor": 2} [])");
}

TEST_F(VeskreportCommand, SendsEachLineOfStandardInput) {
  auto outcome = runClient({"send", "--stdin"},
                           "{\"category\":1,\"type\":2,\"payload\":{\"n\":1}}\n\n"
                           "nonsense\n{\"category\":1}\n{\"category\":9,\"type\":1,\"flag\":1}");
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.output, "2 messages sent, 2 failed\n");
  EXPECT_NE(outcome.errors.find("veskreport: line 3: no valid JSON"), std::string::npos) << outcome.errors;
  EXPECT_NE(outcome.errors.find("veskreport: line 4: \"type\" is no number from 0 to 65535"),
            std::string::npos);
  EXPECT_EQ(record.count(R"(parameters {"category": 1, "type": 2, "payload": {"n": 1}, "flag": 0})"), 1U);
  EXPECT_EQ(record.count(R"(parameters {"category": 9, "type": 1, "flag": 1})"), 1U);

  outcome =
      runClient({"send", "--stdin", "-c", "4", "-t", "5", "--json"}, "{\"category\":\"a payload's own\"}\n");
  EXPECT_EQ(outcome.output,
            "{\"status\":\"done\",\"line\":1,\"answer\":null}\n{\"status\":\"done\",\"sent\":1,\"failed\":0,"
            "\"dropped\":0}\n");
  EXPECT_EQ(
      record.count(
          R"(parameters {"category": 4, "type": 5, "payload": {"category": "a payload's own"}, "flag": 0})"),
      1U);
}

TEST_F(VeskreportCommand, SaysWhatFailed) {
  record.setBackends(std::nullopt);
  auto outcome = runClient({"send", "-c", "1", "-t", "2", "--json"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.errors, "veskreport: the daemon has no storebag for client type 5 (its log says why)\n");
  EXPECT_EQ(outcome.output,
            "{\"status\":\"failed\",\"error\":"
            "\"the daemon has no storebag for client type 5 (its log says why)\"}\n");

  record.setBackends(BackendNames{});
  outcome = runClient({"states", "--start"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.errors, "veskreport: no backend is enabled\n");
  EXPECT_EQ(runClient({"upload-file", root + "/missing"}).errors,
            "veskreport: the file can't be opened: No such file or directory\n");

  for (const std::string& command : {"flush --client-type 5 --root " + root, "storebag keygen " + root}) {
    ChildProcess full({"/bin/sh", "-c", "exec " VESK_BIN_DIRECTORY "/veskreport " + command + " >/dev/full"});
    EXPECT_EQ(full.wait(), 1) << command;
    EXPECT_EQ(full.errors(), "veskreport: cannot write to standard output\n");
  }

  record.abandonsAnswers = true;
  EXPECT_EQ(runClient({"flush"}).status, 1);
}

TEST_F(VeskreportCommand, SaysThatATextCannotBeSent) {
  auto outcome = runClient({"send", "-c", "1", "-t", "2", "--client-name", "Cam\xe9ra"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.errors, "veskreport: too large, nested too deeply or no valid text\n");
  EXPECT_EQ(outcome.output, "");
}

TEST_F(VeskreportCommand, SaysThatNoDaemonIsThereOrTakesItIn) {
  const std::string socket = root + "/run/veskreportingd/com.corvane.veskreportingd";
  daemon.reset();
  EXPECT_EQ(runClient({"states"}).errors, "veskreport: no daemon at " + socket +
                                              ": is veskreportingd running? (No such file or directory)\n");
  daemon.emplace(socket, record, 1);
  const FileDescriptor first = connectUnixSocket(socket);
  const auto outcome = runClient({"states", "--start"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.errors, "veskreport: too many connections: " + socket + ": the daemon takes no more\n");
}

TEST_F(VeskreportCommand, ObeysTheEnvironmentUnlessItIsSetuid) {
  const std::string copy = directory / "veskreport";
  std::filesystem::copy_file(VESK_BIN_DIRECTORY "/veskreport", copy);
  if (::chown(copy.c_str(), 65534, 65534) != 0) GTEST_SKIP() << "needs the right to give files away";
  for (mode_t mode : {0755, 04755}) {
    ASSERT_EQ(::chmod(copy.c_str(), mode), 0);
    ChildProcess process(ChildProcess::Options{.command = {copy, "flush", "--client-type", "5"},
                                               .environment = {{"VESKREPORTINGD_ROOT", root}}});
    EXPECT_EQ(process.wait(), mode == 0755 ? 0 : 1);
    EXPECT_EQ(process.errors().find(root), std::string::npos);
  }
}

TEST_F(VeskreportCommand, WrongUsageIsStatusTwo) {
  for (const std::string line :
       {"", "states", "send --client-type 5 -c 1", "send --client-type 5 -c 65536 -t 1",
        "send --client-type 5 -c 1 -t 1 pair", "send --client-type 5 -c 1 -t 1 --stdin k=v",
        "send --client-type 5 -c 1 -t 1 --stdin --no-wait", "states --client-type 5 --timeout nan"}) {
    auto outcome = run(words(line));
    EXPECT_EQ(outcome.status, 2) << line;
    EXPECT_NE(outcome.errors, "");
  }
  constexpr char kHelp[] = "\nRun with --help for more information.\n";
  for (auto [line, message] : std::initializer_list<std::pair<const char*, std::string>>{
           {"nonsense --json", "unknown command 'nonsense'"},
           {"uplod-fil", "unknown command 'uplod-fil': did you mean 'upload-file'?"},
           {"storebag sing", "unknown command 'sing': did you mean 'sign'?"},
           {"states --clint-type 5", "unknown option '--clint-type': did you mean '--client-type'?"},
           {"send --client-type 5 -c 1 -t 1",
            "send: --client-name is required, since without user info nothing is reported (or "
            "--no-require-user-info)"},
           {"\x1b[2J", "unknown command '\\x1b[2J'"}}) {
    auto outcome = run(words(line));
    EXPECT_EQ(outcome.status, 2);
    EXPECT_EQ(outcome.errors, message + kHelp);
  }
  for (const std::string shell : {"bash", "zsh", "fish"}) {
    const auto script = run({"completion", shell}).output;
    for (const char* word : {"storebag", "client-name", "withdraw"})
      EXPECT_NE(script.find(word), std::string::npos) << shell;
  }
  ChildProcess bash(
      {"/bin/bash", "-c",
       "eval \"$(" VESK_BIN_DIRECTORY "/veskreport completion bash)\"; "
       "COMP_WORDS=(veskreport outbox --root x exp) COMP_CWORD=4; _veskreport; echo \"${COMPREPLY[@]}\""});
  EXPECT_EQ(bash.wait(), 0);
  EXPECT_EQ(bash.output(), "export\n");
  EXPECT_EQ(run({"--help"}).status, 0);
  EXPECT_EQ(run({"send", "--help"}).status, 0);
  EXPECT_EQ(run({"--version"}).output, "veskreport " VESK_VERSION "\n");
}

TEST_F(VeskreportCommand, MakesAndExaminesStorebags) {
  auto source = directory.write("zelko.toml", "version = \"1.2\"\n[release.wren]\nactive = true\n");
  std::string keys = root + "/keys", bag = root + "/zelko.storebag";
  EXPECT_EQ(run({"storebag", "keygen", keys}).status, 0);
  EXPECT_EQ(run({"storebag", "keygen", keys}).status, 1) << "must not replace a key";
  const auto sign = [&](std::vector<std::string> more) {
    more.insert(more.begin(),
                {"storebag", "sign", source, "--key", keys + "/storebag-signing.key", "-o", bag});
    return run(more).status;
  };
  const auto verified = [&] {
    return run({"storebag", "verify", bag, "--key", keys + "/publicKey.der"}).output;
  };
  EXPECT_EQ(sign({}), 0);
  EXPECT_EQ(verified(), bag + ": valid, version 1.2\n");
  EXPECT_EQ(sign({"--name", "zelko", "--serial", "7", "--expires", "2027-01-31"}), 0);
  EXPECT_EQ(verified(),
            bag + ": valid, version 1.2, expires = 2027-01-31T00:00:00Z, name = 'zelko', serial = 7\n");
  EXPECT_EQ(sign({"--expires", "tomorrow"}), 1);
  EXPECT_EQ(sign({"--serial", "-1"}), 2);
  EXPECT_NE(run({"storebag", "show", bag}).output.find("active = true"), std::string::npos);

  auto other = root + "/other";
  run({"storebag", "keygen", other});
  auto outcome = run({"storebag", "verify", bag, "--key", other + "/publicKey.der"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_NE(outcome.errors.find("the signature does not fit"), std::string::npos);
  EXPECT_EQ(run({"storebag", "show", source.string()}).errors,
            "veskreport: " + source.string() + ": no storebag that can be read\n");
}

}  // namespace
}  // namespace vesk::test
