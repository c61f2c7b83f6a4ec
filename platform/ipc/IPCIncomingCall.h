// One method call from the other end, while it is being served.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/BusCodec.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/OneWayDecoder.h"
#include "platform/ipc/Reply.h"

namespace vesk {

class BusReplies;

/// Given to IPCExportedObject::handle and gone when that returns; used on the connection's thread. A call
/// ends in one of four ways: `answer`, `takeReply`, a failed `read` (which has told the caller) or `refuse`;
/// a call that expects an answer and is left in none of them gets an error.
class IPCIncomingCall {
 public:
  /// `owner`: whose the descriptors are that `grant` keeps.
  IPCIncomingCall(sd_bus_message* message, const std::shared_ptr<BusReplies>& replies,
                  const ExtensionOwner& owner, const CodecLimits& limits);

  /// A one-way call that was read already. Its arguments are moved out by `read`.
  IPCIncomingCall(OneWayCall& call, const std::shared_ptr<BusReplies>& replies, const CodecLimits& limits);

  std::string_view member() const noexcept { return _member; }
  /// False for a one-way call: nothing that is answered goes anywhere.
  bool expectsReply() const noexcept { return _expectsReply; }

  /// Reads all arguments, which must be exactly of `signature`. When they are not, tells the caller what is
  /// wrong (or the log, for a one-way call) and returns false: the handler is done with the call. A
  /// FileDescriptor receives a duplicate of the one descriptor of an `ah`, or none.
  template <class... Arguments>
  [[nodiscard]] bool read(const char* signature, Arguments&... arguments) {
    if (!checkSignature(signature)) return false;
    if (_oneWay) {
      [[maybe_unused]] std::size_t next = 0;
      return (takeOne(_oneWay->arguments[next++], arguments) && ...) ||
             refuseArguments(CodecResult::WrongType);
    }
    BusDecoder decoder(_message, _limits);
    return (readOne(decoder, arguments) && ...) || refuseArguments(decoder.result());
  }

  /// Keeps a descriptor that came with the call until its token is consumed or the connection ends.
  std::string grant(FileDescriptor descriptor);

  void answer(std::vector<IPCArgument> arguments = {});
  /// Both texts are constants.
  void refuse(const char* errorName, const char* text);

  /// The answer as a closure, which may outlive the call and the connection and be used on any thread. Empty
  /// for a one-way call. Abandoned, it sends an error.
  template <class... Arguments>
  [[nodiscard]] Reply<Arguments...> takeReply() {
    std::uint64_t ticket = 0;
    if (!keep(ticket)) return {};
    auto send = [replies = _replies, ticket](const Arguments&... values) {
      std::vector<IPCArgument> arguments;
      arguments.reserve(sizeof...(values));
      (arguments.emplace_back(std::in_place_type<Arguments>, values), ...);
      sendKept(*replies, ticket, std::move(arguments));
    };
    return Reply<Arguments...>(std::move(send),
                               [replies = _replies, ticket] { abandonKept(*replies, ticket); });
  }

  /// Whether it has ended in one of the four ways.
  bool isSettled() const noexcept { return _settled; }
  /// What was wrong with a one-way call that was refused, for the connection's log line; else null.
  const char* complaint() const noexcept { return _complaint; }

 private:
  template <class T>
  static bool readOne(BusDecoder& decoder, T& out) {
    return decoder.read(out);
  }
  static bool readOne(BusDecoder& decoder, FileDescriptor& out);
  template <class T>
  static bool takeOne(IPCArgument& argument, T& out) {
    if constexpr (!std::is_same_v<T, FileDescriptor>) {
      if (T* value = std::get_if<T>(&argument)) {
        out = std::move(*value);
        return true;
      }
    }
    return false;  // one-way calls are read without those
  }

  bool checkSignature(const char* signature);
  bool refuseArguments(CodecResult result);
  bool keep(std::uint64_t& ticket);
  static void sendKept(BusReplies& replies, std::uint64_t ticket,
                       std::vector<IPCArgument> arguments) noexcept;
  static void abandonKept(BusReplies& replies, std::uint64_t ticket) noexcept;

  sd_bus_message* const _message;  // null for a one-way call that was read already
  OneWayCall* const _oneWay = nullptr;
  const std::shared_ptr<BusReplies>& _replies;
  const ExtensionOwner _owner;
  const CodecLimits& _limits;
  const std::string_view _member;
  const bool _expectsReply;
  bool _settled = false;
  const char* _complaint = nullptr;
};

}  // namespace vesk
