#include "client/Recorder.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/files/FileURL.h"
#include "platform/log/SystemLog.h"
#include "protocol/ClientSessionStub.h"
#include "protocol/WireNames.h"

namespace vesk {

namespace {

struct Sockets {
  Mutex mutex;
  std::vector<std::string> paths VESK_GUARDED_BY(mutex);  // the newest is the last
};

/// Never destroyed, because sessions may outlive `main`.
Sockets& sockets() {
  static auto& sockets = *new Sockets;
  return sockets;
}

std::string socketIn(const PrivateDirectory& directory) { return directory.path() + "/run/socket"; }

/// The session of one connection. Its calls arrive on the connection's thread.
class RecordingSession final : public ClientSessionInterface {
 public:
  explicit RecordingSession(Recorder& recorder) : _recorder(recorder) {}

  void setSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo, const List&,
                      bool) override {
    _sessionInfo = sessionInfo;
    _userInfo = userInfo;
    add({VESK_RECORDED_CONFIGURE});
  }
  void startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) override {
    add({VESK_RECORDED_START});
    reply(_recorder.backends());
  }
  void fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                               Reply<std::optional<BackendNames>> reply) override {
    _userInfo = userInfo;
    add({VESK_RECORDED_STATES});
    reply(_recorder.backends());
  }
  void fetchDisplayURL(Reply<std::string> reply) override {
    add({VESK_RECORDED_DISPLAY_URL});
    reply("URL not available");
  }
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                               const std::optional<Dictionary>& payload,
                               Reply<std::optional<std::string>> reply) override {
    add({VESK_RECORDED_MESSAGE, category, type, 0, payload});
    reply(std::nullopt);
  }
  void sendMessageWithDictionary(const Dictionary& parameters,
                                 Reply<std::optional<std::string>> reply) override {
    const auto number = [&](const char* key) { return integerForKey(parameters, key).value_or(0); };
    add({VESK_RECORDED_MESSAGE, static_cast<std::uint16_t>(number(kVeskReportingMessageParametersCategory)),
         static_cast<std::uint16_t>(number(kVeskReportingMessageParametersType)),
         static_cast<std::int32_t>(number(kVeskReportingMessageParametersFlag)),
         parameters.dictionary(kVeskReportingMessageParametersPayload)});
    reply(std::nullopt);
  }
  void flushMessagesWithReply(Reply<std::optional<std::string>> reply) override {
    add({VESK_RECORDED_FLUSH});
    reply(std::nullopt);
  }
  void uploadFileAtPath(const std::string& fileURL, const std::string&, Reply<bool> reply) override {
    Recorder::Call call{VESK_RECORDED_FILE};
    call.path = pathFromFileURL(fileURL);
    add(std::move(call));
    reply(true);
  }
  void uploadLogData(const List& logData, Reply<bool, std::optional<std::string>> reply) override {
    Recorder::Call call{VESK_RECORDED_LOG_DATA};
    call.logData = logData;
    add(std::move(call));
    reply(true, std::nullopt);
  }
  void sendMessageWithSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  const std::optional<Dictionary>& payload,
                                  Reply<std::string> reply) override {
    _recorder.add({VESK_RECORDED_MESSAGE, category, type, 0, payload, sessionInfo, userInfo});
    reply("finished");
  }

 private:
  void add(Recorder::Call call) {
    call.sessionInfo = _sessionInfo;
    call.userInfo = _userInfo;
    _recorder.add(std::move(call));
  }

  Recorder& _recorder;
  std::optional<Dictionary> _sessionInfo;
  std::optional<Dictionary> _userInfo;
};

}  // namespace

Recorder::Kept::Kept(Call received) : call(std::move(received)) {
  const auto viewOf = [](std::optional<ValueViews>& views, const std::optional<Dictionary>& dictionary) {
    if (!dictionary) return static_cast<const VeskDictionaryView*>(nullptr);
    return &views.emplace(*dictionary).dictionary();
  };
  view.size = sizeof view;
  view.call = call.kind;
  view.category = call.category;
  view.type = call.type;
  view.flag = call.flag;
  view.payload = viewOf(payload, call.payload);
  view.session_info = viewOf(sessionInfo, call.sessionInfo);
  view.user_info = viewOf(userInfo, call.userInfo);
  if (call.logData) view.log_data = &logData.emplace(*call.logData).list();
  if (!call.path.empty()) view.path = call.path.c_str();
}

PrivateDirectory::PrivateDirectory() {
  std::error_code code;
  _path = (std::filesystem::temp_directory_path(code) / "vesk-recorder.XXXXXX").string();
  if (!::mkdtemp(_path.data())) throw std::system_error(errno, std::generic_category(), _path);
}

PrivateDirectory::~PrivateDirectory() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

Recorder::Recorder()
    : _listener([&] {
        IPCListener::Options options;
        options.socketPath = socketIn(_directory);
        options.objectPath = wire::kObjectPath;
        return options;
      }()) {
  _listener.setDelegate(this);
  _listener.resume();
  MutexLock lock(sockets().mutex);
  sockets().paths.push_back(socketIn(_directory));
}

Recorder::~Recorder() {
  {
    MutexLock lock(sockets().mutex);
    std::erase(sockets().paths, socketIn(_directory));
  }
  _listener.stop();
}

std::string Recorder::currentSocket() {
  MutexLock lock(sockets().mutex);
  return sockets().paths.empty() ? std::string() : sockets().paths.back();
}

bool Recorder::shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) {
  connection->resume({std::make_shared<ClientSessionStub>(std::make_shared<RecordingSession>(*this))});
  return true;
}

void Recorder::add(Call call) {
  MutexLock lock(_mutex);
  _calls.emplace_back(std::move(call));
}

std::size_t Recorder::count(std::int32_t kind) const {
  MutexLock lock(_mutex);
  return static_cast<std::size_t>(std::count_if(
      _calls.begin(), _calls.end(), [&](const Kept& kept) { return kind == 0 || kept.call.kind == kind; }));
}

const vesk_recorded* Recorder::at(std::int32_t kind, std::size_t index) const {
  MutexLock lock(_mutex);
  for (const Kept& kept : _calls) {
    if ((kind == 0 || kept.call.kind == kind) && index-- == 0) return &kept.view;
  }
  return nullptr;
}

void Recorder::clear() {
  MutexLock lock(_mutex);
  _calls.clear();
}

void Recorder::setBackends(std::optional<std::vector<std::string>> backends) {
  MutexLock lock(_mutex);
  _backends = std::move(backends);
}

std::optional<std::vector<std::string>> Recorder::backends() const {
  MutexLock lock(_mutex);
  return _backends;
}

}  // namespace vesk

struct vesk_recorder : vesk::Recorder {};

vesk_recorder* vesk_recorder_new() {
  try {
    return new vesk_recorder;
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("VeskReporting: no recorder could be made: %s", error.what());
    return nullptr;
  }
}

void vesk_recorder_free(vesk_recorder* recorder) {
  if (recorder && recorder->isOurs()) delete recorder;
}

size_t vesk_recorder_count(const vesk_recorder* recorder, int32_t call) {
  return recorder ? recorder->count(call) : 0;
}

const vesk_recorded* vesk_recorder_at(const vesk_recorder* recorder, int32_t call, size_t index) {
  return recorder ? recorder->at(call, index) : nullptr;
}

void vesk_recorder_clear(vesk_recorder* recorder) {
  if (recorder) recorder->clear();
}

void vesk_recorder_set_backends(vesk_recorder* recorder, const char* const* backends, size_t count) {
  if (!recorder) return;
  try {
    if (!backends) return recorder->setBackends(std::nullopt);
    recorder->setBackends(std::vector<std::string>(backends, backends + count));
  } catch (const std::exception&) {
    // Out of memory: they stay as they were.
  }
}
