// One peer-to-peer connection between the daemon and a client process, as both ends see it.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

class IPCIncomingCall;

/// Who is at the other end, as the kernel vouched for it when the connection was made.
struct IPCPeer {
  uid_t user = static_cast<uid_t>(-1);
  pid_t process = 0;
};

/// What is exported under a connection's object path: receives each method call on the connection's thread
/// and answers through the call. Must not throw.
class IPCExportedObject {
 public:
  virtual ~IPCExportedObject() = default;
  /// The D-Bus interface whose members `handle` knows.
  virtual const char* interfaceName() const = 0;
  /// Its `<interface>` element, for callers that ask what there is.
  virtual const char* introspection() const { return ""; }
  virtual void handle(IPCIncomingCall& call) = 0;
};

/// A descriptor that goes along with a call; -1 for none. Borrowed: it stays open until the call was sent.
struct IPCDescriptor {
  int borrowed = -1;
};

/// An argument of a call; its type decides its D-Bus type (docs/wire.md): b, q, d, s, a{sv}, av, aa{sv}, as
/// (at most one), as (any number), aas (at most one), ah (at most one).
using IPCArgument =
    std::variant<bool, std::uint16_t, double, std::string, Dictionary, List, std::optional<Dictionary>,
                 std::optional<std::string>, std::vector<std::string>,
                 std::optional<std::vector<std::string>>, IPCDescriptor>;

/// A call to the remote object.
struct IPCOutgoingCall {
  const char* interfaceName;
  const char* member;
  std::vector<IPCArgument> arguments;
};

/// A call to the remote object, as `appendCall` writes it.
struct IPCEncodedCall {
  std::string message;
  IPCDescriptor descriptor{};  ///< goes along
};

/// What a connection is given to do. Everything runs on the connection's thread, the handlers at most once,
/// and is dropped after the invalidation handler has run, which breaks the rings that it forms with the
/// connection. Each may be empty.
struct IPCHandlers {
  std::shared_ptr<IPCExportedObject> object{};
  std::function<void()> interruption{};
  std::function<void()> invalidation{};
  /// Told how many calls that `callRemoteObject` took were never sent, if any; runs after the others have
  /// been dropped.
  std::function<void(std::size_t calls)> loss{};
};

/// Shared by its owner (a session), its handlers and its own thread.
class IPCConnection {
 public:
  virtual ~IPCConnection() = default;

  virtual std::string description() const = 0;
  /// As the kernel told when it connected.
  virtual IPCPeer peer() const = 0;

  /// Begins to serve calls, on the connection's own thread.
  virtual void resume(IPCHandlers handlers) = 0;

  /// Asks the connection to end; safe from any thread and more than once. The invalidation handler runs on
  /// the connection's thread soon after.
  virtual void invalidate() = 0;

  /// Puts a one-way call into the connection's bounded outbox and wakes its thread. Safe from any thread,
  /// never blocks, takes no lock but the outbox's own. When the call can't be sent (outbox full, connection
  /// gone) the error handler is called on the calling thread, before this returns; the call is lost.
  virtual void callRemoteObject(IPCOutgoingCall call,
                                const std::function<void(const std::string& error)>& errorHandler) = 0;
};

}  // namespace vesk
