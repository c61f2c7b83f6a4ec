#include <array>

#include "tools/storebag/StorebagKeys.h"

namespace vesk {

namespace {

using std::string_view;

constexpr std::array<string_view, 3> kOutboxModes{"outage", "always", "off"};

constexpr std::array kDeviceFacts{
    StorebagKey{
        .key = "DeviceName",
        .type = KeyType::Text,
        .effect =
            "The product family. device_whitelist looks at it, and events carry it. Without any, the device "
            "has no HTTPS backends.",
        .example = "\"Pine\"",
        .absent = "DMI or device tree, else NAME of /etc/os-release"},
    StorebagKey{
        .key = "RegionCode",
        .type = KeyType::Text,
        .effect = "The device's country, two letters. locale_whitelist looks at it.",
        .example = "\"DE\"",
        .absent = "the locale's country; without one, every list that is not empty lets the device pass"},
    StorebagKey{.key = "ProductType",
                .type = KeyType::Text,
                .effect = "The model. Events carry it; a \"Bramble\" has no backend wren.",
                .example = "\"Pine3,1\"",
                .absent = "DMI or device tree"},
    StorebagKey{.key = "ProductVersion",
                .type = KeyType::Text,
                .effect = "The operating system's version. Events carry it.",
                .example = "\"12.8\"",
                .absent = "VERSION_ID of /etc/os-release"},
    StorebagKey{.key = "BuildVersion",
                .type = KeyType::Text,
                .effect = "The operating system's build. Events carry it.",
                .example = "\"12H208\"",
                .absent = "BUILD_ID or VERSION of /etc/os-release"},
    StorebagKey{.key = "ReleaseType",
                .type = KeyType::Text,
                .effect = "\"Internal\" makes the build an internal one: another default storebag server, "
                          "extras_on_internal, a description of the device in start messages.",
                .example = "\"Internal\"",
                .absent = "not internal"},
    StorebagKey{.key = "UniqueDeviceID",
                .type = KeyType::Text,
                .effect = "The device's identifier, of at most 40 characters.",
                .example = "\"00c0ffee00c0ffee\"",
                .absent = "derived one-way from /etc/machine-id"},
    StorebagKey{.key = "SerialNumber",
                .type = KeyType::Text,
                .effect = "In the start messages of internal builds.",
                .example = "\"C02X1234\"",
                .absent = "DMI or device tree"},
    StorebagKey{.key = "HWModelStr",
                .type = KeyType::Text,
                .effect = "In the start messages of internal builds.",
                .example = "\"P31AP\"",
                .absent = "DMI or device tree"},
};

constexpr std::array kPreferences{
    StorebagKey{
        .key = "environmentType",
        .type = KeyType::Integer,
        .effect =
            "1 is development, 2 corvane_internal, 3 seed, 4 release. 0 names no section, so nothing is "
            "reported. Any other number counts as 2.",
        .example = "4",
        .absent = "3",
        .least = 0,
        .most = 4,
        .below = "it counts as 2",
        .above = "it counts as 2"},
    StorebagKey{
        .key = "diagnosticsSubmission",
        .type = KeyType::Boolean,
        .effect = "Whether the user agreed to the submission of diagnostics. override_dnu can override it.",
        .example = "true",
        .absent = "false"},
    StorebagKey{
        .key = "veskreporting_storebag_url",
        .type = KeyType::URL,
        .effect = "The storebag server, without a slash at the end; the daemon appends / and the name.",
        .example = "\"https://storebags.example/bags\"",
        .absent = "the server that the daemon was built for"},
    StorebagKey{.key = "httpsPostURL",
                .type = KeyType::URL,
                .effect = "Takes precedence over every post_url of a client entry.",
                .example = "\"https://localhost:8443/events\"",
                .absent = "the storebag's"},
    StorebagKey{.key = "httpsRealtimePostURL",
                .type = KeyType::URL,
                .effect = "Takes precedence over every realtime_post_url.",
                .example = "\"https://localhost:8443/now\"",
                .absent = "the storebag's"},
    StorebagKey{.key = "keepStorebags",
                .type = KeyType::Boolean,
                .effect = "Keeps the last good storebag of each name on disk, for a start without a network.",
                .example = "true",
                .absent = "false"},
    StorebagKey{
        .key = "outbox",
        .type = KeyType::Text,
        .effect =
            "Whether posts that can't be delivered are put aside on disk: \"outage\" (after five seconds), "
            "\"always\" (also before they are sent), \"off\".",
        .example = "\"always\"",
        .absent = "\"outage\"",
        .words = kOutboxModes},
    StorebagKey{.key = "outboxMiB",
                .type = KeyType::Integer,
                .effect = "How much may wait on disk.",
                .example = "16",
                .absent = "64",
                .unit = "MiB",
                .least = 1,
                .below = "it counts as absent"},
    StorebagKey{.key = "outboxDays",
                .type = KeyType::Integer,
                .effect = "How long posts wait on disk.",
                .example = "3",
                .absent = "7",
                .unit = "days",
                .least = 1,
                .most = 3650,
                .below = "it counts as absent",
                .above = "3650 is used"},
    StorebagKey{.key = "maxHeldMiBPerUser",
                .type = KeyType::Integer,
                .effect = "How much may be held in memory for the sessions of one user.",
                .example = "16",
                .absent = "64",
                .unit = "MiB",
                .least = 1,
                .below = "it counts as absent"},
    StorebagKey{.key = "maxHeldMiB",
                .type = KeyType::Integer,
                .effect = "How much may be held in memory for all sessions.",
                .example = "64",
                .absent = "256",
                .unit = "MiB",
                .least = 1,
                .below = "it counts as absent"},
    StorebagKey{.key = "maxConnections",
                .type = KeyType::Integer,
                .effect = "How many clients may be connected, as far as the limit of descriptors allows.",
                .example = "512",
                .absent = "4096",
                .least = 1,
                .below = "it counts as absent"},
    StorebagKey{.key = "maxConnectionsPerUser",
                .type = KeyType::Integer,
                .effect = "How many of them may belong to one user.",
                .example = "128",
                .absent = "1024",
                .least = 1,
                .below = "it counts as absent"},
    StorebagKey{
        .key = "logRateLimit",
        .type = KeyType::Integer,
        .effect = "How many lines one place in the code may log for one user in ten seconds; 0 is no limit.",
        .example = "50",
        .absent = "200",
        .unit = "lines",
        .least = 0,
        .below = "it counts as absent"},
};

}  // namespace

std::span<const StorebagKey> deviceFactKeys() { return kDeviceFacts; }
std::span<const StorebagKey> preferenceKeys() { return kPreferences; }

}  // namespace vesk
