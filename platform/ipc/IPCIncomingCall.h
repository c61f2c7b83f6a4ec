// One method call from the other end, while it is being served.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/MessageReader.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Reply.h"

namespace vesk {

/// Passed to IPCExportedObject::handle, valid until that returns, and used only on the connection's thread. A
/// call is settled in one of four ways: `answer`, `takeReply`, a failed `read` (which has informed the
/// caller) or `refuse`. A call that expects an answer and isn't settled gets an error.
class IPCIncomingCall {
 public:
  /// `owner` owns the descriptors kept by `grant`. All arguments outlive the call.
  IPCIncomingCall(Message& message, const std::shared_ptr<Outbox>& outbox, const ExtensionOwner& owner,
                  const CodecLimits& limits) noexcept
      : _message(message), _outbox(outbox), _owner(owner), _limits(limits) {}

  std::string_view member() const noexcept { return _message.header->member; }
  /// False for a one-way call, whose answers are discarded.
  bool expectsReply() const noexcept { return _message.header->expectsReply; }

  /// Reads all arguments, which must exactly match `signature`. Otherwise reports the error to the caller
  /// (or, for a one-way call, the log) and returns false; the handler must then return. A FileDescriptor
  /// receives the one descriptor of an `ah`, or none.
  template <class... Arguments>
  [[nodiscard]] bool read(const char* signature, Arguments&... arguments) {
    if (_message.header->signature != signature) return refuseArguments(CodecResult::WrongType);
    MessageReader reader(_message, _limits);
    return ((readOne(reader, arguments) && ...) && reader.finish()) || refuseArguments(reader.result());
  }

  /// Keeps a descriptor that came with the call until its token is consumed or the connection ends.
  std::string grant(FileDescriptor descriptor);

  void answer(const std::vector<IPCArgument>& arguments = {});
  /// Both texts must be constants.
  void refuse(const char* errorName, const char* text);

  /// Returns the answer as a closure, which may outlive the call and the connection and be used on any
  /// thread. Empty for a one-way call. If abandoned, it sends an error.
  template <class... Arguments>
  [[nodiscard]] Reply<Arguments...> takeReply() {
    if (!owe()) return {};
    auto send = [outbox = _outbox, call = _message.serial](const Arguments&... values) {
      std::vector<IPCArgument> arguments;
      arguments.reserve(sizeof...(values));
      (arguments.emplace_back(std::in_place_type<Arguments>, values), ...);
      outbox->settle(call, arguments);
    };
    return Reply<Arguments...>(std::move(send),
                               [outbox = _outbox, call = _message.serial] { abandon(*outbox, call); });
  }

  /// Whether the call is settled in one of the four ways.
  bool isSettled() const noexcept { return _settled; }
  /// The error of a one-way call that was refused, for the connection's log line; otherwise null.
  const char* complaint() const noexcept { return _complaint; }

 private:
  template <class T>
  bool readOne(MessageReader& reader, T& out) {
    return reader.read(out);
  }
  bool readOne(MessageReader& reader, FileDescriptor& out);

  bool refuseArguments(CodecResult result);
  bool owe();
  static void abandon(Outbox& outbox, std::uint32_t call) noexcept;

  Message& _message;
  const std::shared_ptr<Outbox>& _outbox;
  const ExtensionOwner& _owner;
  const CodecLimits& _limits;
  bool _settled = false;
  const char* _complaint = nullptr;
};

}  // namespace vesk
