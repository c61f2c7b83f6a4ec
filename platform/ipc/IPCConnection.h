// One peer-to-peer connection between the daemon and a client process, as seen from either end.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <VeskReporting/VeskValues.h>
#include <VeskReporting/values/Value.h>

namespace vesk {

class IPCIncomingCall;

/// The other end, as the kernel identified it when the connection was made.
struct IPCPeer {
  uid_t user = static_cast<uid_t>(-1);
  pid_t process = 0;
  std::vector<gid_t> groups{};  ///< its supplementary groups; none if there are more than 256
};

/// The object exported under a connection's object path. Receives each method call on the connection's thread
/// and answers through the call. Must not throw.
class IPCExportedObject {
 public:
  virtual ~IPCExportedObject() = default;
  /// The D-Bus interface whose members `handle` knows.
  virtual const char* interfaceName() const = 0;
  /// The interface's `<interface>` element, for introspection.
  virtual const char* introspection() const { return ""; }
  virtual void handle(IPCIncomingCall& call) = 0;
};

/// A descriptor sent with a call; -1 for none. Borrowed: must stay open until the call was sent.
struct IPCDescriptor {
  int borrowed = -1;
};

/// An argument of a call; its type determines its D-Bus type (docs/wire.md): b, q, d, s, a{sv}, av, aa{sv},
/// as (at most one), as (any number), aas (at most one), ah (at most one). Views are written as the
/// dictionaries that they show, and borrowed until the call was encoded.
using IPCArgument = std::variant<bool, std::uint16_t, double, std::string, Dictionary, List,
                                 std::optional<Dictionary>, std::optional<std::string>,
                                 std::vector<std::string>, std::optional<std::vector<std::string>>,
                                 IPCDescriptor, VeskDictionaryView, std::optional<VeskDictionaryView>>;

/// A call to the remote object.
struct IPCOutgoingCall {
  const char* interfaceName;
  const char* member;
  std::vector<IPCArgument> arguments;
};

/// An encoded call to the remote object, as written by `appendCall`.
struct IPCEncodedCall {
  std::string message;
  IPCDescriptor descriptor{};  ///< sent with the call
};

/// The handlers of a connection; each may be empty. All run on the connection's thread, and each but
/// `beforeSending` at most once.
/// They are destroyed after the invalidation handler has run, which breaks reference cycles with the
/// connection.
struct IPCHandlers {
  std::shared_ptr<IPCExportedObject> object{};  ///< under the listener's object path
  /// Further objects, by path.
  std::map<std::string, std::shared_ptr<IPCExportedObject>, std::less<>> otherObjects{};
  /// Runs before answers and calls are sent, while there are any. May wait for what they confirm.
  std::function<void()> beforeSending{};
  std::function<void()> interruption{};
  std::function<void()> invalidation{};
  /// Called with the number of calls that `callRemoteObject` accepted but that were never sent, if any, after
  /// the others have been destroyed.
  std::function<void(std::size_t calls)> loss{};
};

/// Shared by its owner (a session), its handlers and its own thread.
class IPCConnection {
 public:
  virtual ~IPCConnection() = default;

  virtual std::string description() const = 0;
  /// As reported by the kernel at connection time.
  virtual IPCPeer peer() const = 0;

  /// Starts serving calls, on the connection's own thread.
  virtual void resume(IPCHandlers handlers) = 0;

  /// While paused, no further calls are read from the client, which then has to wait or keep them in a queue.
  /// Answers and calls are still sent, and a hang-up is still noticed. Thread-safe; doesn't block.
  virtual void setPaused(bool isPaused) = 0;

  /// Asks the connection to end. Thread-safe; may be called repeatedly. The invalidation handler runs on the
  /// connection's thread soon after.
  virtual void invalidate() = 0;

  /// Puts a one-way call into the connection's bounded outbox and wakes its thread. Thread-safe; never
  /// blocks; takes no lock except the outbox's own. If the call can't be sent (outbox full, connection gone),
  /// the error handler is called on the calling thread before this returns, and the call is lost.
  virtual void callRemoteObject(IPCOutgoingCall call,
                                const std::function<void(const std::string& error)>& errorHandler) = 0;
};

}  // namespace vesk
