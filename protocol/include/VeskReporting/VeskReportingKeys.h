// The names that clients, the daemon and storebags share.
#pragma once

namespace vesk {

// Session info: how a client describes itself when it configures its session.
inline constexpr char kVeskReportingSessionInfoSessionID[] = "sessionID";    ///< number, unsigned 32 bits
inline constexpr char kVeskReportingSessionInfoClientType[] = "clientType";  ///< number; selects the storebag
/// number, unsigned 16 bits
inline constexpr char kVeskReportingSessionInfoClientVersion[] = "clientVersion";
inline constexpr char kVeskReportingSessionInfoRequireUserInfo[] = "requireUserInfo";  ///< boolean
inline constexpr char kVeskReportingSessionInfoBatchEvent[] = "batchEvent";            ///< boolean

// User info: whom the session reports for. Other entries are copied into every event.
inline constexpr char kVeskReportingUserInfoClientName[] = "clientName";    ///< text
inline constexpr char kVeskReportingUserInfoServiceName[] = "serviceName";  ///< text

// Message parameters.
/// number, unsigned 16 bits; mandatory
inline constexpr char kVeskReportingMessageParametersCategory[] = "category";
/// number, unsigned 16 bits; mandatory
inline constexpr char kVeskReportingMessageParametersType[] = "type";
inline constexpr char kVeskReportingMessageParametersPayload[] = "payload";  ///< dictionary
/// number: 1 realtime, 2 override sampling, 3 both
inline constexpr char kVeskReportingMessageParametersFlag[] = "flag";

// Backends: the keys of a storebag's section, and the names in a session's answers.
inline constexpr char kVeskReportingBackendHTTPPost[] = "httpPost";
inline constexpr char kVeskReportingBackendHTTPPost2[] = "httpPost2";
inline constexpr char kVeskReportingBackendDashboard[] = "dashboard";
inline constexpr char kVeskReportingBackendUploadServer[] = "uploadServer";
inline constexpr char kVeskReportingBackendWren[] = "wren";
inline constexpr char kVeskReportingBackendKilnar[] = "kilnar";

}  // namespace vesk
