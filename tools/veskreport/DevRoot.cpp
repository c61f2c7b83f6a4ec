#include "tools/veskreport/DevRoot.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <utility>

#include "protocol/StorebagName.h"
#include "tools/files/WholeFile.h"
#include "tools/json/JSONReader.h"
#include "tools/veskreport/DiagnosticsClient.h"

namespace fs = std::filesystem;

namespace vesk {

namespace {

constexpr mode_t kMode = 0644;  // the directory itself is private
constexpr char kProfile[] = "share/veskreporting/sandbox/com.corvane.veskreportingd.toml";
constexpr std::int32_t kHighestClientType = 255;

/// The profile that is installed with the daemon.
std::string sandboxProfile() {
  const auto prefix = fs::read_symlink("/proc/self/exe").parent_path().parent_path();
  for (const auto& file : {prefix / kProfile, fs::path("/usr") / kProfile}) {
    if (fs::exists(file)) return readWholeFile(file);
  }
  throw std::runtime_error("there is no /usr/" + std::string(kProfile) +
                           ": install the package veskreportingd");
}

/// An entry without client and service is for every client.
std::string storebag(const std::string& eventsURL, const std::string& uploadsURL) {
  return "# Reports every message and file of every client.\n"
         "version = \"dev\"\n"
         "refresh_cycle = 1   # sessions that start later than that take up a change\n\n"
         "[[release.httpPost.clients]]\n"
         "locale_whitelist = [\"US\"]\n"
         "sampling_threshold = 1.0\n"
         "expedite = 1        # each event at once\n"
         "filters = []\n"
         "post_url = \"" +
         eventsURL + "\"\n\n[release.uploadServer]\npost_url = \"" + uploadsURL + "\"\n";
}

void writeUnlessThere(const fs::path& file, const std::string& text) {
  fs::create_directories(file.parent_path());
  if (!fs::exists(file)) writeWholeFile(file, text, kMode);
}

}  // namespace

DevRoot::DevRoot(const std::string& kept) : _isKept(!kept.empty()) {
  if (_isKept) {
    _path = fs::absolute(kept).lexically_normal();
    if (fs::exists(_path) && !fs::is_empty(_path) && !fs::exists(collector()))
      throw std::runtime_error(_path.string() + " is neither empty nor the directory of an earlier run");
    if (fs::create_directories(_path)) fs::permissions(_path, fs::perms::owner_all);
  } else {
    std::string path = (fs::temp_directory_path() / "veskreport-dev.XXXXXX").string();
    if (::mkdtemp(path.data()) == nullptr)
      throw std::runtime_error("can't make the directory " + path + ": " + std::strerror(errno));
    _path = path;
  }
  fs::create_directory(collector());
}

DevRoot::~DevRoot() {
  std::error_code ignored;
  if (!_isKept) fs::remove_all(_path, ignored);
}

Dictionary DevRoot::facts() const {
  if (!fs::exists(readyFile())) return {};
  const auto parsed = parseJSON(readWholeFile(readyFile()));
  return parsed && parsed->dictionary() ? *parsed->dictionary() : Dictionary();
}

std::vector<std::string> DevRoot::portOptions() const {
  const auto earlier = facts();
  std::vector<std::string> options;
  for (const auto& [option, key] :
       {std::pair("--https-port", "httpsPort"), {"--http-port", "httpPort"}, {"--udp-port", "udpPort"}}) {
    const auto port = textIn(earlier, key);
    options.insert(options.end(), {option, port.empty() ? "0" : port});
  }
  return options;
}

void DevRoot::prepare() const {
  const auto now = facts();
  const auto share = _path / "usr/share/veskreporting", settings = _path / "etc/veskreporting";
  for (const auto& directory : {share / "sandbox", _path / "run", _path / "var/spool/veskreporting"})
    fs::create_directories(directory);
  writeWholeFile(_path / "usr" / kProfile, sandboxProfile(), kMode);
  writeWholeFile(share / "publicKey.der", readWholeFile(textIn(now, "publicKeyFile")), kMode);
  writeUnlessThere(settings / "preferences/com.corvane.veskreporting.toml",
                   "environmentType = 4\ndiagnosticsSubmission = true\nveskreporting_storebag_url = \"" +
                       textIn(now, "storebagURL") + "\"\n");
  writeUnlessThere(settings / "device.toml", "DeviceName = \"Development\"\nRegionCode = \"US\"\n");
  for (std::int32_t type = 0; type <= kHighestClientType; ++type) {
    if (const auto name = storebagNameForClientType(type))
      writeUnlessThere(fs::path(textIn(now, "storebags")) / (std::string(*name) + ".toml"),
                       storebag(textIn(now, "eventsURL"), textIn(now, "uploadsURL")));
  }
}

}  // namespace vesk
