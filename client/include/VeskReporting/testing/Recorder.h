// Replaces the daemon in a program's unit tests.
#pragma once

#include <VeskReporting/VeskReporting.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <optional>
#include <string>
#include <vector>

namespace vesk::testing {

/// A message as the daemon would receive it, including those sent by `sendMessageOnce`.
struct RecordedMessage {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;                  ///< 1 realtime, 2 override sampling, 3 both
  std::optional<Dictionary> payload;      ///< as it was sent, before filters and sampling
  std::optional<Dictionary> sessionInfo;  ///< of the session, as it was then
  std::optional<Dictionary> userInfo;     ///< likewise
};

/// While it exists, new sessions of this process connect to it instead of a daemon, unless they name their
/// own socket. Their one-way calls return after they were recorded, so a test can check them at once. It
/// answers like a daemon whose storebag enables the backends of `setBackends`. Must outlive its sessions.
/// Thread-safe.
class Recorder {
 public:
  /// Throws std::bad_alloc if it can't listen, after a line in the log with the cause.
  Recorder() : _recorder(vesk_recorder_new()) {
    if (!_recorder) throw std::bad_alloc();
  }

  std::vector<RecordedMessage> messages() const {
    std::vector<RecordedMessage> messages;
    const auto copy = [](const VeskDictionaryView* view) { return view ? copyOf(*view) : std::nullopt; };
    for (std::size_t i = 0; const vesk_recorded* call = at(VESK_RECORDED_MESSAGE, i); ++i) {
      messages.push_back({call->category, call->type, call->flag, copy(call->payload),
                          copy(call->session_info), copy(call->user_info)});
    }
    return messages;
  }
  /// The absolute paths of uploaded files.
  std::vector<std::string> files() const {
    std::vector<std::string> files;
    for (std::size_t i = 0; const vesk_recorded* call = at(VESK_RECORDED_FILE, i); ++i) {
      files.emplace_back(call->path);
    }
    return files;
  }
  std::vector<List> logData() const {
    std::vector<List> data;
    for (std::size_t i = 0; const vesk_recorded* call = at(VESK_RECORDED_LOG_DATA, i); ++i) {
      data.push_back(copyOf(*call->log_data).value_or(List()));
    }
    return data;
  }
  /// The number of recorded calls of a kind, such as VESK_RECORDED_START. 0 counts all kinds.
  std::size_t count(std::int32_t call) const noexcept { return vesk_recorder_count(_recorder.get(), call); }
  void clear() noexcept { vesk_recorder_clear(_recorder.get()); }

  /// Sets the enabled backends that the recorder reports for later starts and state queries; nullopt means
  /// that there is no storebag. The default is "httpPost".
  void setBackends(const std::optional<std::vector<std::string>>& backends) {
    if (!backends) return vesk_recorder_set_backends(_recorder.get(), nullptr, 0);
    std::vector<const char*> names(1);  // never a null array
    names.clear();
    for (const auto& name : *backends) names.push_back(name.c_str());
    vesk_recorder_set_backends(_recorder.get(), names.data(), names.size());
  }

 private:
  struct Freed {
    void operator()(vesk_recorder* recorder) const noexcept { vesk_recorder_free(recorder); }
  };

  const vesk_recorded* at(std::int32_t call, std::size_t index) const noexcept {
    return vesk_recorder_at(_recorder.get(), call, index);
  }

  const std::unique_ptr<vesk_recorder, Freed> _recorder;
};

}  // namespace vesk::testing
