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

/// Given to IPCExportedObject::handle and gone when that returns; used on the connection's thread. A call
/// ends in one of four ways: `answer`, `takeReply`, a failed `read` (which has told the caller) or `refuse`;
/// a call that expects an answer and is left in none of them gets an error.
class IPCIncomingCall {
 public:
  /// `owner`: whose the descriptors are that `grant` keeps. All outlive the call.
  IPCIncomingCall(Message& message, const std::shared_ptr<Outbox>& outbox, const ExtensionOwner& owner,
                  const CodecLimits& limits) noexcept
      : _message(message), _outbox(outbox), _owner(owner), _limits(limits) {}

  std::string_view member() const noexcept { return _message.header->member; }
  /// False for a one-way call: nothing that is answered goes anywhere.
  bool expectsReply() const noexcept { return _message.header->expectsReply; }

  /// Reads all arguments, which must be exactly of `signature`. When they are not, tells the caller what is
  /// wrong (or the log, for a one-way call) and returns false: the handler is done with the call. A
  /// FileDescriptor receives the one descriptor of an `ah`, or none.
  template <class... Arguments>
  [[nodiscard]] bool read(const char* signature, Arguments&... arguments) {
    if (_message.header->signature != signature) return refuseArguments(CodecResult::WrongType);
    MessageReader reader(_message, _limits);
    return ((readOne(reader, arguments) && ...) && reader.finish()) || refuseArguments(reader.result());
  }

  /// Keeps a descriptor that came with the call until its token is consumed or the connection ends.
  std::string grant(FileDescriptor descriptor);

  void answer(const std::vector<IPCArgument>& arguments = {});
  /// Both texts are constants.
  void refuse(const char* errorName, const char* text);

  /// The answer as a closure, which may outlive the call and the connection and be used on any thread. Empty
  /// for a one-way call. Abandoned, it sends an error.
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

  /// Whether it has ended in one of the four ways.
  bool isSettled() const noexcept { return _settled; }
  /// What was wrong with a one-way call that was refused, for the connection's log line; else null.
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
