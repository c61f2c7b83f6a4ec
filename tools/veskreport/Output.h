// How a command tells its outcome: words for people, or JSON lines for scripts (--json).
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

inline constexpr int kExitDone = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitUsage = 2;

/// Results go to standard output, everything else to standard error. With JSON, each result and each failure
/// is one object on a line of standard output, with "status" and what else there is to say. For any thread.
class Output {
 public:
  explicit Output(bool json) noexcept : _json(json) {}

  bool isJSON() const noexcept { return _json; }

  /// A result: `line` for people, {"status":"done", and `fields`} for scripts. Returns kExitDone,
  /// or kExitFailed when it can't be written, which the first such call tells as `failed` does.
  int done(std::string_view line, const Dictionary& fields) const;
  /// A result of several lines for people.
  int done(const std::vector<std::string>& lines, const Dictionary& fields) const;
  /// "veskreport: …" on standard error, and {"status":"failed","error":…, and `fields`} for scripts. Returns
  /// kExitFailed.
  int failed(std::string_view cause, const Dictionary& fields = {}) const;
  /// A remark for people.
  void note(std::string_view words) const;
  /// Bytes as they are, to standard output. Returns kExitDone, or kExitFailed when they can't be written.
  int raw(std::string_view bytes) const;

 private:
  bool object(const char* status, std::string_view cause, const Dictionary& fields) const;

  const bool _json;
};

}  // namespace vesk
