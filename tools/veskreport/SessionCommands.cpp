#include "tools/veskreport/SessionCommands.h"

#include <filesystem>
#include <future>

#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/Lines.h"
#include "tools/veskreport/PayloadParser.h"
#include "tools/veskreport/Progress.h"

namespace vesk {

namespace {

constexpr char kNoDisplayURL[] = "URL not available";

List listOf(const BackendNames& names) { return List(std::vector<Value>(names.begin(), names.end())); }

// The log data from the command line or standard input; nullopt if a line is not JSON.
std::optional<List> logDataOf(const UploadArguments& arguments, const Output& output) {
  if (!arguments.fromStandardInput) {
    return List(std::vector<Value>(arguments.logData.begin(), arguments.logData.end()));
  }
  std::vector<Value> entries;
  LineReader lines(STDIN_FILENO);
  while (auto line = lines.next()) {
    auto parsed = parsePayloadValue(*line);
    if (!parsed) {
      output.failed("line " + std::to_string(lines.number()) + ": " + parsed.error().text);
      return std::nullopt;
    }
    entries.push_back(*std::move(parsed));
  }
  if (!lines.error().empty()) {
    output.failed("standard input: " + lines.error());
    return std::nullopt;
  }
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

}  // namespace

int runStates(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  auto states = session.reporting().fetchStates(session.userInfo(), invocation.identity.timeout);
  if (!states) return session.failed(states);
  BackendNames names = states.answer.value_or(BackendNames{});
  if (names.empty() && !output.isJSON()) output.note("no backend is enabled");
  return output.done(names, {{"backends", listOf(names)}});
}

int runDisplayURL(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  auto url = session.reporting().fetchDisplayURL(invocation.identity.timeout);
  if (!url) return session.failed(url);
  if (url.answer == kNoDisplayURL) return output.failed(url.answer);
  return output.done(url.answer, {{"url", url.answer}});
}

int runFlush(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  auto flushed = session.reporting().flushMessagesAndWait(invocation.identity.timeout);
  if (!flushed) return session.failed(flushed);
  return output.done(flushed.answer.value_or("flushed"),
                     {{"answer", flushed.answer ? Value(*flushed.answer) : Value()}});
}

int runUploadFile(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.upload.path;
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  auto answer = std::async(std::launch::async,
                           [&] { return session.reporting().uploadFile(path, invocation.identity.timeout); });
  Progress progress(-1);
  const std::string what = "uploading " + sizeInWords(path);
  while (answer.wait_for(std::chrono::milliseconds(50)) != std::future_status::ready) {
    progress.showWaiting(what);
  }
  progress.clear();
  auto uploaded = answer.get();
  if (!uploaded) return session.failed(uploaded);
  if (!uploaded.answer) return output.failed("no backend took " + path);
  return output.done("uploaded " + path, {{"path", path}});
}

int runUploadLog(const Invocation& invocation, const Output& output) {
  auto logData = logDataOf(invocation.upload, output);
  if (!logData) return kExitFailed;
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  std::size_t entries = logData->size();
  auto uploaded = session.reporting().uploadLogData(std::move(*logData), invocation.identity.timeout);
  if (!uploaded) return session.failed(uploaded);
  if (!uploaded.answer) return output.failed("no backend took the log data");
  return output.done("uploaded log data of " + std::to_string(entries) + " entries",
                     {{"entries", static_cast<std::uint64_t>(entries)}});
}

}  // namespace vesk
