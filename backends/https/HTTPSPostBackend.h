// The main backend: events as JSON, posted singly or in batches over HTTPS.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "backends/https/EventBatch.h"
#include "backends/https/EventFilters.h"
#include "backends/https/PostBody.h"
#include "backends/https/PostPolicy.h"

namespace vesk {

/// Turns each message into an event record, filters it, and posts it at once or holds it for a batch, as the
/// client entry of its profile specifies.
class HTTPSPostBackend final : public VeskReportingBackend {
 public:
  /// Returns null if the profile or the product family is missing, or if the profile has no `clients`.
  static std::shared_ptr<HTTPSPostBackend> create(const std::string& name,
                                                  const std::optional<Dictionary>& profile,
                                                  const BackendIdentity& identity,
                                                  const BackendServices& services);
  ~HTTPSPostBackend() override;

  std::optional<std::string> postURL() const;
  void setPostURL(const std::optional<std::string>& url);
  std::optional<std::string> stateReason() const override;

 protected:
  std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                               const timeval& timestamp, std::uint16_t method,
                                               std::uint16_t respCode, std::uint16_t eventID,
                                               std::int32_t flag) override VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
  std::optional<std::string> flushMessagesInTurn() override VESK_REQUIRES(_sendMutex) VESK_EXCLUDES(_mutex);
  void updateStateLocked() override VESK_REQUIRES(_mutex) { setState(updateBackendState()); }
  void setCorrelatedSessionIDLocked(const std::optional<Text>& sessionID) override VESK_REQUIRES(_mutex);

 private:
  /// Events taken for a post, with everything that the post needs: unaffected by later changes of the
  /// backend.
  struct Post {
    std::unique_ptr<EventBatch> events;
    std::optional<Dictionary> lateUserInfo;  ///< filtered, not empty; for events held before it was known
    std::optional<std::string> url;
    std::string clientID;
    PostHeaders headers;
    Dictionary messages;           ///< which ones it carries, for operators who look
    bool isPrintable = false;      ///< the text may go to the local message log
    bool respectsConsent = false;  ///< it was allowed by the user's consent
  };
  using PostToBuild = std::unique_ptr<Post>;

  HTTPSPostBackend(const std::string& name, const Dictionary& profile, const BackendIdentity& identity,
                   const BackendServices& services);

  std::int32_t updateBackendState() VESK_REQUIRES(_mutex);

  // Events.
  MutableDictionary eventFor(const std::optional<Dictionary>& payload, const timeval& timestamp,
                             std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID) const
      VESK_REQUIRES(_mutex);
  bool mustHold(std::int32_t flag) const VESK_REQUIRES(_mutex);
  bool holdsEvents() const VESK_REQUIRES(_mutex);
  PostToBuild batchEvent(MutableDictionary event) VESK_REQUIRES(_sendMutex, _mutex);
  void boundHeldEvents() VESK_REQUIRES(_sendMutex) VESK_EXCLUDES(_mutex);
  void countDropped(std::size_t events) const;

  // Taking events out for a post. Null if there are none or they may not be sent yet.
  PostToBuild takeBatch() VESK_REQUIRES(_mutex);
  PostToBuild takeBatchBeforeSingleEvent() VESK_REQUIRES(_mutex);
  PostToBuild makePost(std::unique_ptr<EventBatch> events, std::int32_t flag,
                       std::optional<std::uint16_t> method, std::optional<std::uint16_t> responseCode) const
      VESK_REQUIRES(_mutex);

  // Building and posting run without _mutex, since a body may be large.
  std::optional<std::string> buildAndPost(PostToBuild post) VESK_REQUIRES(_sendMutex) VESK_EXCLUDES(_mutex);
  void postJSONMessage(Post post, std::string json, std::size_t eventCount);
  /// A post as it is shown to operators.
  struct Shown {
    Dictionary facts;
    std::string body;
  };
  void postCompleted(const HTTPResult& result, std::size_t eventCount, const Shown* shown);
  void showPost(const char* outcome, const HTTPResult& result, const Shown* shown) const;
  void countPost(DropReason reason, std::size_t events, const HTTPResult& result, const Shown* shown) const;

  // Constant after construction.
  const bool _dnuEnabled;  // the user's consent
  // The client's identifiers: one respects the consent, the other is used if the storebag overrides it.
  const std::string _uuidRespectDnu;
  const std::string _uuidOverrideDnu;

  // Guarded by _mutex.
  PostPolicy::Settings _settings VESK_GUARDED_BY(_mutex);
  std::optional<std::string> _stateReason VESK_GUARDED_BY(_mutex);  ///< unless it is enabled
  std::unique_ptr<EventBatch> _batchedEvents VESK_GUARDED_BY(_mutex);
  std::uint16_t _lastHeldEventID VESK_GUARDED_BY(_mutex) = 0;
  EventFilters _filters VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
