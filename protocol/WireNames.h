// The D-Bus names and signatures of the protocol, shared by both ends. docs/wire.md explains them.
#pragma once

namespace vesk::wire {

/// Default path of the daemon's socket.
inline constexpr const char* kSocketPath = "/run/veskreportingd/com.corvane.veskreportingd";
/// Path of the daemon's object and of the client's.
inline constexpr const char* kObjectPath = "/com/corvane/veskreportingd/session";

/// A method with the signatures of its arguments and of its answer.
struct Member {
  const char* name;
  const char* arguments;
  const char* answer;
};

// The daemon's object.
inline constexpr const char* kSessionInterface = "com.corvane.veskreportingd.ClientSessionInterface";
inline constexpr Member kSetSessionInfo{"setSessionInfo", "a{sv}aa{sv}asb", ""};
inline constexpr Member kStartConfig{"startConfigWithCompletionHandler", "", "aas"};
inline constexpr Member kFetchStates{"fetchStatesWithUserInfo", "aa{sv}", "aas"};
inline constexpr Member kFetchDisplayURL{"fetchDisplayURL", "", "s"};
inline constexpr Member kSendMessageWithCategory{"sendMessageWithCategory", "qqaa{sv}", "as"};
inline constexpr Member kSendMessageWithDictionary{"sendMessageWithDictionary", "a{sv}", "as"};
inline constexpr Member kFlushMessages{"flushMessagesWithReply", "", "as"};
inline constexpr Member kUploadFile{"uploadFileAtPath", "sah", "b"};
inline constexpr Member kUploadLogData{"uploadLogData", "av", "bas"};
inline constexpr Member kSendMessageWithSessionInfo{"sendMessageWithSessionInfo", "a{sv}aa{sv}qqaa{sv}", "s"};

// The daemon's second object, for operators.
inline constexpr const char* kDiagnosticsPath = "/com/corvane/veskreportingd/diagnostics";
inline constexpr const char* kDiagnosticsInterface = "com.corvane.veskreportingd.DiagnosticsInterface";
inline constexpr Member kGetStatus{"getStatus", "", "a{sv}"};
inline constexpr Member kExplain{"explain", "a{sv}", "a{sv}"};
inline constexpr Member kOpenTap{"openTap", "a{sv}", "a{sv}"};
inline constexpr Member kReadTap{"readTap", "", "a{sv}"};
inline constexpr Member kReload{"reload", "", "a{sv}"};
inline constexpr Member kHoldOutbox{"holdOutbox", "a{sv}", "a{sv}"};
inline constexpr Member kReadOutbox{"readOutbox", "a{sv}", "a{sv}"};
inline constexpr Member kRemoveFromOutbox{"removeFromOutbox", "a{sv}", "a{sv}"};
inline constexpr Member kApplyConsent{"applyConsent", "", "a{sv}"};
inline constexpr const char* kDiagnosticsIntrospection =
    "  <interface name=\"com.corvane.veskreportingd.DiagnosticsInterface\">\n"
    "    <method name=\"getStatus\"><arg name=\"status\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"explain\"><arg name=\"request\" type=\"a{sv}\" direction=\"in\"/>"
    "<arg name=\"explanation\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"openTap\"><arg name=\"filter\" type=\"a{sv}\" direction=\"in\"/>"
    "<arg name=\"opened\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"readTap\"><arg name=\"records\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"reload\"><arg name=\"done\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"holdOutbox\"><arg name=\"request\" type=\"a{sv}\" direction=\"in\"/>"
    "<arg name=\"done\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"readOutbox\"><arg name=\"request\" type=\"a{sv}\" direction=\"in\"/>"
    "<arg name=\"posts\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"removeFromOutbox\"><arg name=\"request\" type=\"a{sv}\" direction=\"in\"/>"
    "<arg name=\"done\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"applyConsent\"><arg name=\"done\" type=\"a{sv}\" direction=\"out\"/></method>\n"
    "  </interface>\n";

// The client's object. Its method has no answer.
inline constexpr const char* kReplyInterface = "com.corvane.veskreportingd.ClientSessionReplyInterface";
inline constexpr Member kSendMessageToClient{"sendMessageToClient", "aa{sv}dqqaa{sv}", ""};

}  // namespace vesk::wire
