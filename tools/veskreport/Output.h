// Reports a command's outcome as readable text, or as JSON lines for scripts (--json).
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

inline constexpr int kExitDone = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitUsage = 2;

/// Thrown after a failure was reported: the tool exits with this status.
struct Exit {
  int status = kExitFailed;
};

/// Results go to standard output, everything else to standard error. With JSON, each result and each failure
/// is one object on a line of standard output, with "status" and further fields. Thread-safe.
class Output {
 public:
  explicit Output(bool json) noexcept : _json(json) {}

  bool isJSON() const noexcept { return _json; }

  /// A result: `line` as text, or {"status":"done", and `fields`} as JSON. Returns kExitDone, or kExitFailed
  /// if it can't be written; the first such failure is reported like `failed` does.
  int done(std::string_view line, const Dictionary& fields) const;
  /// A result that takes several lines as text.
  int done(const std::vector<std::string>& lines, const Dictionary& fields) const;
  /// The daemon's answer, or `otherwise` as text and null as JSON if it has none.
  int answered(const std::optional<std::string>& answer, std::string_view otherwise) const {
    return done(answer ? std::string_view(*answer) : otherwise,
                {{"answer", answer ? Value(*answer) : Value()}});
  }
  /// "veskreport: …" on standard error, or {"status":"failed","error":…, and `fields`} as JSON. Returns
  /// kExitFailed.
  int failed(std::string_view cause, const Dictionary& fields = {}) const;
  /// Like `failed`, and ends the command.
  [[noreturn]] void fail(std::string_view cause, int status = kExitFailed) const {
    failed(cause);
    throw Exit{status};
  }
  /// A remark; not part of the JSON output.
  void note(std::string_view words) const;
  /// Writes bytes unchanged to standard output. Returns kExitDone, or kExitFailed if they can't be written.
  int raw(std::string_view bytes) const;

 private:
  bool object(const char* status, std::string_view cause, const Dictionary& fields) const;

  const bool _json;
};

}  // namespace vesk
