#include <filesystem>
#include <regex>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"
#include "protocol/WireNames.h"
#include "tools/files/WholeFile.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DiagnosticsClient.h"

namespace vesk {

namespace {

constexpr char kPreferences[] = "/etc/veskreporting/preferences/com.corvane.veskreporting.toml";
constexpr char kKey[] = "diagnosticsSubmission";
constexpr mode_t kReadableByAll = 0644;

std::string contentsOf(const std::string& path) {
  return std::filesystem::exists(path) ? readWholeFile(path) : std::string();
}

/// Sets the key of the document's root and leaves everything else as it is.
std::string withConsent(const std::string& text, bool consent) {
  const std::string line = std::string(kKey) + " = " + (consent ? "true" : "false");
  static const std::regex setting("(^|\\n)[ \\t]*diagnosticsSubmission[ \\t]*=[^\\n]*");
  if (std::regex_search(text, setting)) return std::regex_replace(text, setting, "$1" + line);
  return line + "\n" + text;  // before the first table
}

int show(const std::string& path, const Output& output) {
  const auto preferences = parseToml(contentsOf(path));
  if (!preferences) return output.failed(path + ": " + preferences.error().text);
  const auto consent = booleanForKey(*preferences, kKey);
  return output.done(std::string(consent.value_or(false) ? "granted" : "not granted") + " (" + kKey + " in " +
                         path + (consent ? ")" : " is not set)"),
                     {{"consent", consent.value_or(false)}, {"file", path}});
}

}  // namespace

int runConsent(const Invocation& invocation, const Output& output) {
  const std::string path = pathUnderRoot(kPreferences);
  if (invocation.action == "show") return show(path, output);
  const bool consent = invocation.action == "grant";
  const std::string text = withConsent(contentsOf(path), consent);
  const auto changed = parseToml(text);
  if (!changed || booleanForKey(*changed, kKey) != consent)
    return output.failed(path + ": it can not be changed; set " + kKey + " by hand");
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  writeWholeFile(path, text, kReadableByAll);

  const auto done = DiagnosticsClient(invocation, output).ask(wire::kApplyConsent);
  const auto sessions = textIn(done, "sessions"), deleted = textIn(done, "deleted");
  if (booleanForKey(done, "consent") != consent)
    return output.failed("the daemon still finds the consent " +
                         std::string(consent ? "withdrawn" : "granted") +
                         ": its own preferences file says so");
  return output.done(consent
                         ? "granted; " + sessions + " sessions start anew"
                         : "withdrawn; " + deleted + " events were deleted, the identifiers are new, and " +
                               sessions + " sessions start anew",
                     done);
}

}  // namespace vesk
