#include <VeskReporting/VeskReportingKeys.h>

#include <array>

#include "tools/storebag/StorebagKeys.h"

namespace vesk {

namespace {

using std::string_view;

constexpr string_view kReportsNothing = "sessions that require user info report nothing here";

constexpr string_view kNoPort = "no server has this port, only its lowest 16 bits are used";

constexpr std::array<string_view, 4> kEnvironments{"development", "corvane_internal", "seed", "release"};
constexpr std::array<string_view, 2> kActions{"remove", "sha256"};

constexpr std::array kFilter{
    StorebagKey{.key = "method",
                .type = KeyType::Integer,
                .effect = "The filter acts only on messages of this category; a negative number means any.",
                .example = "3",
                .absent = "-1",
                .most = 65535,
                .above = "no message has this number, the filter never applies",
                .mustBeWithin = true},
    StorebagKey{.key = "status",
                .type = KeyType::Integer,
                .effect = "The filter acts only on messages of this type; a negative number means any.",
                .example = "2",
                .absent = "-1",
                .most = 65535,
                .above = "no message has this number, the filter never applies",
                .mustBeWithin = true},
    StorebagKey{.key = "key",
                .type = KeyType::Text,
                .effect =
                    "The field that the filter acts on, ignoring case: of the payload, the user info or the "
                    "event itself. The first filter that applies to a field decides about it.",
                .example = "\"user\"",
                .absent = "the filter acts on nothing",
                .withoutIt = "the filter acts on nothing"},
    StorebagKey{
        .key = "action",
        .type = KeyType::Text,
        .effect =
            "\"remove\" removes the field. \"sha256\" replaces a text, number or date by 64 hexadecimal "
            "digits and removes any other value. Anything else leaves the field as it is, also for "
            "later filters.",
        .example = "\"sha256\"",
        .absent = "the field stays as it is",
        .withoutIt = "the filter changes nothing",
        .words = kActions},
};

constexpr std::array kClientEntry{
    StorebagKey{.key = "client",
                .type = KeyType::Text,
                .effect =
                    "Client names, separated by commas without blanks. The entry is for sessions with one of "
                    "these client names, ignoring case.",
                .example = "\"Camera,Gallery\"",
                .absent = "every client name, or none"},
    StorebagKey{.key = "service",
                .type = KeyType::Text,
                .effect =
                    "Parts of service names, separated by commas without blanks. The entry is for sessions "
                    "whose service name contains one of them, ignoring case.",
                .example = "\"sync\"",
                .absent = "every service name, or none"},
    StorebagKey{.key = "expedite",
                .type = KeyType::Flag,
                .effect = "1 posts each event at once, 0 collects events into batches.",
                .example = "0",
                .absent = "as the session asks"},
    StorebagKey{
        .key = "hierarchy",
        .type = KeyType::Integer,
        .effect =
            "The session's level among those with the same client and service name; 0 is the top. From 1 "
            "on, its backends report while those of the session one level above do, and under the "
            "session IDs of both. Only the entry in httpPost counts.",
        .example = "1",
        .absent = "0"},
    StorebagKey{
        .key = "override_dnu",
        .type = KeyType::Flag,
        .effect = "1 reports even if the user did not agree to the submission of diagnostics, under another "
                  "client identifier.",
        .example = "1",
        .absent = "0"},
    StorebagKey{.key = "locale_whitelist",
                .type = KeyType::Texts,
                .effect =
                    "Devices report if their region code contains one of these, ignoring case, and devices "
                    "without a region code. An empty list lets no device report.",
                .example = "[\"DE\", \"US\"]",
                .absent = "no session reports",
                .withoutIt = kReportsNothing},
    StorebagKey{
        .key = "device_whitelist",
        .type = KeyType::Texts,
        .effect = "Devices report if their product family (DeviceName) contains one of these, ignoring case. "
                  "An empty list lets every device report.",
        .example = "[\"Pine\"]",
        .absent = "every device reports"},
    StorebagKey{
        .key = "filters",
        .type = KeyType::Tables,
        .effect = "What is removed or digested before an event leaves the device, see below. May be empty.",
        .example = "[{key = \"user\", action = \"sha256\"}]",
        .absent = "no session reports",
        .withoutIt = kReportsNothing,
        .contents = kFilter},
    StorebagKey{
        .key = "sampling_threshold",
        .type = KeyType::Number,
        .effect =
            "Sessions report whose draw, from 0 to 1 and new for each session, is at most this. A negative "
            "number lets none report.",
        .example = "0.25",
        .absent = "no session reports",
        .unit = "share of the sessions",
        .withoutIt = kReportsNothing,
        .most = 1,
        .above = "it is a share from 0 to 1, every session reports"},
    StorebagKey{
        .key = "override_sampling",
        .type = KeyType::Number,
        .effect =
            "Sessions that are sampled out hold their messages back until one overrides sampling, if their "
            "draw is at most this. Other sessions drop them.",
        .example = "0.5",
        .absent = "every session that is sampled out",
        .unit = "share of the sessions",
        .most = 1,
        .above = "it is a share from 0 to 1, every session that is sampled out holds back"},
    StorebagKey{.key = "event_threshold",
                .type = KeyType::Integer,
                .effect =
                    "A batch with more events than this of one category is posted before another of that "
                    "category is added.",
                .example = "20",
                .absent = "49",
                .unit = "events",
                .least = 0,
                .below = "every event is posted by itself"},
    StorebagKey{
        .key = "extras_on_internal",
        .type = KeyType::Flag,
        .effect =
            "1 adds the device's identifier, and for client type 7 the number of the session, on internal "
            "builds.",
        .example = "1",
        .absent = "0"},
    StorebagKey{.key = "post_url",
                .type = KeyType::URL,
                .effect = "Where events are posted to. The preference httpsPostURL takes precedence.",
                .example = "\"https://collect.example/events\"",
                .absent = "events are dropped"},
    StorebagKey{
        .key = "realtime_post_url",
        .type = KeyType::URL,
        .effect =
            "Where events that are marked realtime are posted to. The preference httpsRealtimePostURL takes "
            "precedence.",
        .example = "\"https://collect.example/now\"",
        .absent = "the post_url"},
};

constexpr StorebagKey kDisplayURL{
    .key = "display_url",
    .type = KeyType::URL,
    .effect = "Where clients are told that their messages can be viewed. The daemon does not use it itself.",
    .example = "\"https://collect.example/view\"",
    .absent = "none"};

constexpr std::array kPostProfile{
    StorebagKey{
        .key = "clients",
        .type = KeyType::Tables,
        .effect = "Client entries, see below. The first that is for a session decides about it. For sessions "
                  "that do not require user info, only URLs, extras_on_internal and expedite count.",
        .absent = kNotBuilt,
        .withoutIt = kNotBuilt,
        .contents = kClientEntry},
    kDisplayURL,
};

constexpr std::array kDashboardProfile{
    StorebagKey{.key = "ip",
                .type = KeyType::Address,
                .effect = "The server that datagrams are sent to: four decimal numbers, not a name.",
                .example = "\"192.0.2.7\"",
                .absent = kNotBuilt,
                .withoutIt = kNotBuilt},
    StorebagKey{.key = "port",
                .type = KeyType::IntegerOrText,
                .effect = "The server's UDP port.",
                .example = "9053",
                .absent = kNotBuilt,
                .withoutIt = kNotBuilt,
                .least = 1,
                .most = 65535,
                .below = kNoPort,
                .above = kNoPort,
                .mustBeWithin = true},
    StorebagKey{
        .key = "reliable",
        .type = KeyType::IntegerOrText,
        .effect =
            "Datagrams are sent again until the server acknowledges them, in ticks of this length. Less "
            "than 1 counts as 500.",
        .example = "500",
        .absent = "datagrams are sent once",
        .unit = "ms"},
    StorebagKey{.key = "post_url",
                .type = KeyType::URL,
                .effect = "Where log data is uploaded to.",
                .example = "\"https://collect.example/logdata\"",
                .absent = "log data is not uploaded"},
    kDisplayURL,
};

constexpr std::array kUploadProfile{
    StorebagKey{.key = "post_url",
                .type = KeyType::URL,
                .effect = "Where files are uploaded to; the daemon appends a query.",
                .example = "\"https://collect.example/upload\"",
                .absent = kNotBuilt,
                .withoutIt = kNotBuilt},
    kDisplayURL,
};

constexpr std::array kActiveProfile{
    StorebagKey{.key = "active",
                .type = KeyType::Boolean,
                .effect = "Without effect: the backend reports wherever a section lists it.",
                .example = "true",
                .absent = "no difference"},
};

constexpr std::array kBackends{
    StorebagKey{.key = kVeskReportingBackendHTTPPost,
                .type = KeyType::Table,
                .effect = "Posts messages as JSON events over HTTPS.",
                .absent = "no such backend",
                .contents = kPostProfile},
    StorebagKey{.key = kVeskReportingBackendHTTPPost2,
                .type = KeyType::Table,
                .effect = "A second one of the same kind, with entries, sampling and batches of its own.",
                .absent = "no such backend",
                .contents = kPostProfile},
    StorebagKey{.key = kVeskReportingBackendDashboard,
                .type = KeyType::Table,
                .effect =
                    "Sends each message as a UDP datagram and uploads log data. Neither consent nor filters "
                    "apply.",
                .absent = "no such backend",
                .contents = kDashboardProfile},
    StorebagKey{.key = kVeskReportingBackendUploadServer,
                .type = KeyType::Table,
                .effect = "Uploads files that clients hand over.",
                .absent = "no such backend",
                .contents = kUploadProfile},
    StorebagKey{.key = kVeskReportingBackendWren,
                .type = KeyType::Table,
                .effect =
                    "Hands messages to the device's adaptor, for client types 7 and 11. There is none on a "
                    "\"Bramble\" (ProductType).",
                .absent = "no such backend",
                .contents = kActiveProfile},
    StorebagKey{
        .key = kVeskReportingBackendKilnar,
        .type = KeyType::Table,
        .effect = "Records messages with a category other than 0 and a payload in the device's power log.",
        .absent = "no such backend",
        .contents = kActiveProfile},
};

constexpr std::array kTop{
    StorebagKey{.key = "version",
                .type = KeyType::Text,
                .effect = "Shown to operators and clients.",
                .example = "\"2026-11-1\"",
                .absent = "no version is shown",
                .withoutIt = "the storebag has no version"},
    StorebagKey{
        .key = "refresh_cycle",
        .type = KeyType::Integer,
        .effect = "How long a daemon uses the storebag before it asks the server again, a day at most. Takes "
                  "precedence over the server's Cache-Control.",
        .example = "3600",
        .absent = "the server's max-age, else 86400",
        .unit = "s",
        .least = 1,
        .most = 86400,
        .below = "every session's start fetches it again",
        .above = "86400 is used"},
    StorebagKey{.key = "name",
                .type = KeyType::Text,
                .effect = "The only storebag name under which daemons accept it.",
                .example = "\"zelko\"",
                .absent = "any name"},
    StorebagKey{.key = "serial",
                .type = KeyType::Serial,
                .effect = "Daemons that accepted a higher one refuse the storebag.",
                .example = "7",
                .absent = "0",
                .least = 0},
    StorebagKey{.key = "expires",
                .type = KeyType::Date,
                .effect = "From then on, daemons whose clock is synchronised start no session with it.",
                .example = "2027-01-31T00:00:00Z",
                .absent = "never"},
};

}  // namespace

std::span<const StorebagKey> topLevelKeys() { return kTop; }
std::span<const StorebagKey> backendKeys() { return kBackends; }
std::span<const string_view> environmentNames() { return kEnvironments; }

}  // namespace vesk
