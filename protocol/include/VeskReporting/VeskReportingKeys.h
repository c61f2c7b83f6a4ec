// The names that clients, the daemon and storebags have in common.
#pragma once

namespace vesk {

// Session info: what a client says about itself when it configures its session.
inline constexpr char kVeskReportingSessionInfoSessionID[] = "sessionID";    ///< number, 32 bits, unsigned
inline constexpr char kVeskReportingSessionInfoClientType[] = "clientType";  ///< number; selects the storebag
/// number, 16 bits, unsigned
inline constexpr char kVeskReportingSessionInfoClientVersion[] = "clientVersion";
inline constexpr char kVeskReportingSessionInfoRequireUserInfo[] = "requireUserInfo";  ///< boolean
inline constexpr char kVeskReportingSessionInfoBatchEvent[] = "batchEvent";            ///< boolean

// User info: on whose behalf a session reports. Further entries of any name go into every event.
inline constexpr char kVeskReportingUserInfoClientName[] = "clientName";    ///< text
inline constexpr char kVeskReportingUserInfoServiceName[] = "serviceName";  ///< text

// Message parameters.
/// number, 16 bits, unsigned; mandatory
inline constexpr char kVeskReportingMessageParametersCategory[] = "category";
/// number, 16 bits, unsigned; mandatory
inline constexpr char kVeskReportingMessageParametersType[] = "type";
inline constexpr char kVeskReportingMessageParametersPayload[] = "payload";  ///< dictionary
/// number: 1 realtime, 2 override sampling, 3 both
inline constexpr char kVeskReportingMessageParametersFlag[] = "flag";

// Backends: the keys of a storebag's section, and the names that sessions answer with.
inline constexpr char kVeskReportingBackendHTTPPost[] = "httpPost";
inline constexpr char kVeskReportingBackendHTTPPost2[] = "httpPost2";
inline constexpr char kVeskReportingBackendDashboard[] = "dashboard";
inline constexpr char kVeskReportingBackendUploadServer[] = "uploadServer";
inline constexpr char kVeskReportingBackendWren[] = "wren";
inline constexpr char kVeskReportingBackendKilnar[] = "kilnar";

}  // namespace vesk
