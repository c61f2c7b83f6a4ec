// The daemon's end of one connection. Private to platform/ipc.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/Answers.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/ConnectionLoop.h"
#include "platform/ipc/ConnectionRegistry.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Wakeup.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// An accepted connection. `resume` gives it a thread, which holds it, serves its calls and in the end, in
/// this order: runs the interruption handler when the connection was broken off, runs the invalidation
/// handler, lets go of handlers and exported object (which may destroy a session here, and take seconds),
/// sends what that has left in the outbox, closes the bus. Never resumed, it just closes the socket and runs
/// no handler.
class BusConnection final : public IPCConnection, public std::enable_shared_from_this<BusConnection> {
 public:
  /// Bytes for the client that wait when the connection ends from this side are written for so long.
  static constexpr std::chrono::milliseconds kFlushTime{1'000};

  /// `peer` has been admitted by `registry`, which is told when this ends.
  BusConnection(FileDescriptor socket, const IPCPeer& peer, const ConnectionSettings& settings,
                std::shared_ptr<ConnectionRegistry> registry);
  ~BusConnection() override;

  std::uint64_t serial() const noexcept { return _serial; }
  /// For the listener: as `invalidate`, and when there is no thread lets go of handlers and exported object.
  void end();

  std::string description() const override { return _name; }
  IPCPeer peer() const override { return _peer; }
  void setExportedObject(std::shared_ptr<IPCExportedObject> object) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void setLossHandler(std::function<void(std::size_t calls)> handler) override;
  void resume() override;
  void invalidate() override;
  void callRemoteObject(IPCOutgoingCall call,
                        const std::function<void(const std::string& error)>& errorHandler) override;

 private:
  void run() noexcept;
  void finish(ConnectionLoop::End how, ConnectionLoop* loop) noexcept;
  void callHandler(const std::function<void()>& handler) noexcept;
  void dropHandlers() noexcept;
  void close() noexcept;

  // Constant after construction.
  const std::uint64_t _serial;
  const IPCPeer _peer;
  const ConnectionSettings _settings;
  const std::string _name;
  const std::shared_ptr<ConnectionRegistry> _registry;
  const std::shared_ptr<Wakeup> _wakeup;
  const std::shared_ptr<Answers> _answers;

  // Synchronised by themselves.
  Outbox _outbox;
  std::atomic<bool> _invalidated{false};
  std::atomic<bool> _counted{true};

  // Set before `resume`, then the thread's.
  FileDescriptor _socket;
  CallRouter _router;
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
  std::function<void(std::size_t)> _lossHandler;

  Mutex _mutex;
  bool _started VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
