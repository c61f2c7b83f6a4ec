#include <filesystem>
#include <future>

#include "protocol/WireNames.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/DiagnosticsClient.h"
#include "tools/veskreport/PayloadParser.h"
#include "tools/veskreport/Terminal.h"

namespace vesk {

namespace {

constexpr char kNoDisplayURL[] = "URL not available";

/// The log data from the command line or standard input.
List logDataOf(const Invocation& invocation, const Output& output) {
  std::vector<Value> entries(invocation.logData.begin(), invocation.logData.end());
  if (!invocation.fromStandardInput) return List(std::move(entries));
  LineReader lines;
  while (auto line = lines.next()) {
    auto parsed = parsePayloadValue(*line);
    if (!parsed) output.fail("line " + std::to_string(lines.number()) + ": " + parsed.error().text);
    entries.push_back(*std::move(parsed));
  }
  if (!lines.error().empty()) output.fail("standard input: " + lines.error());
  return List(std::move(entries));
}

std::string sizeInWords(const std::string& path) {
  std::error_code unknown;
  auto bytes = std::filesystem::file_size(path, unknown);
  if (unknown) return "the file";
  if (bytes < 10'240) return std::to_string(bytes) + " bytes";
  if (bytes < 10 << 20) return std::to_string(bytes >> 10) + " KiB";
  return std::to_string(bytes >> 20) + " MiB";
}

int showStates(const BackendNames& names, const Output& output) {
  if (names.empty() && !output.isJSON()) output.note("no backend is enabled");
  return output.done(names, {{"backends", List(std::vector<Value>(names.begin(), names.end()))}});
}

/// What a session would get, without one: a session reports its start.
int statesWithoutSession(const Invocation& invocation, const Output& output) {
  const auto explanation =
      DiagnosticsClient(invocation, output).ask(wire::kExplain, {explanationRequest(invocation, output)});
  if (const auto problem = textIn(explanation, "problem"); !problem.empty())
    return output.failed(problem + " (--start starts one)");
  BackendNames names;
  for (const auto& [name, backend] : dictionaryIn(explanation, "backends")) {
    if (backend.dictionary() && textIn(*backend.dictionary(), "state") == "enabled")
      names.push_back(name.string());
  }
  return showStates(names, output);
}

}  // namespace

int runStates(const Invocation& invocation, const Output& output) {
  if (!invocation.start) return statesWithoutSession(invocation, output);
  DaemonSession session(invocation, output);
  session.start();
  auto states = session->fetchStates(session.userInfo(), invocation.timeout);
  return showStates(session.answerOf(states).value_or(BackendNames{}), output);
}

int runDisplayURL(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation, output);
  session.start();
  std::string url = session.answerOf(session->fetchDisplayURL(invocation.timeout));
  if (url == kNoDisplayURL) return output.failed(url);
  return output.done(url, {{"url", url}});
}

int runFlush(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation, output);
  session.start();
  return output.answered(session.answerOf(session->flushMessagesAndWait(invocation.timeout)), "flushed");
}

int runUploadFile(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.upload;
  DaemonSession session(invocation, output);
  session.start();
  auto answer = std::async(std::launch::async, [&] { return session->uploadFile(path, invocation.timeout); });
  Progress progress(-1);
  const std::string what = "uploading " + sizeInWords(path);
  while (answer.wait_for(std::chrono::milliseconds(50)) != std::future_status::ready)
    progress.showWaiting(what);
  progress.clear();
  if (!session.answerOf(answer.get())) return output.failed("no backend took " + path);
  return output.done("uploaded " + path, {{"path", path}});
}

int runUploadLog(const Invocation& invocation, const Output& output) {
  const List logData = logDataOf(invocation, output);
  DaemonSession session(invocation, output);
  session.start();
  if (!session.answerOf(session->uploadLogData(logData, invocation.timeout)))
    return output.failed("no backend took the log data");
  return output.done("uploaded log data of " + std::to_string(logData.size()) + " entries",
                     {{"entries", static_cast<std::uint64_t>(logData.size())}});
}

}  // namespace vesk
