// Listeners and connections, as a test writes them: it connects, ends connections, and asks
// what was exported. What is asked of them goes into the transcript.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/xpc/NSXPCListener.h"
#include "tests/support/Transcript.h"

namespace skein {

class ScriptedConnection final : public NSXPCConnection {
 public:
  ScriptedConnection(std::string name, Transcript& transcript)
      : _name(std::move(name)), _transcript(transcript) {}

  void setExportedInterface(NSXPCInterface interface) override {
    _transcript.add(_name + " exports " + interface.protocolName);
  }
  void setExportedObject(std::shared_ptr<NSXPCExportedObject> exported) override {
    object = std::move(exported);
  }
  void setInvalidationHandler(std::function<void()> handler) override {
    _invalidated = std::move(handler);
  }
  void setInterruptionHandler(std::function<void()> handler) override {
    _interrupted = std::move(handler);
  }
  void resume() override { _transcript.add(_name + " resume"); }
  void invalidate() override {
    _transcript.add(_name + " invalidate");
    close();
  }

  // The client closes it.
  void close() {
    object = nullptr;
    _interrupted = nullptr;
    if (const auto handler = std::exchange(_invalidated, nullptr)) handler();
  }
  // The client is gone.
  void interrupt() {
    if (const auto handler = std::exchange(_interrupted, nullptr)) handler();
  }

  std::shared_ptr<NSXPCExportedObject> object;

 private:
  const std::string _name;
  Transcript& _transcript;
  std::function<void()> _invalidated;
  std::function<void()> _interrupted;
};

class ScriptedListener final : public NSXPCListener,
                               public std::enable_shared_from_this<ScriptedListener> {
 public:
  ScriptedListener(std::string name, Transcript& transcript)
      : _name(std::move(name)), _transcript(transcript) {}

  void setDelegate(std::weak_ptr<NSXPCListenerDelegate> delegate) override {
    _transcript.add(_name + " delegate");
    _delegate = std::move(delegate);
  }
  std::shared_ptr<NSXPCListenerEndpoint> endpoint() override {
    _transcript.add(_name + " endpoint");
    return _endpoint;
  }
  void resume() override { _transcript.add(_name + " resume"); }
  void invalidate() override { _transcript.add(_name + " invalidate"); }

  // A client connects; null when it was refused.
  std::shared_ptr<ScriptedConnection> connect() {
    auto connection = std::make_shared<ScriptedConnection>(
        _name + " connection " + std::to_string(++_connections), _transcript);
    const auto delegate = _delegate.lock();
    const bool accepted =
        delegate && delegate->listener_shouldAcceptNewConnection(shared_from_this(), connection);
    return accepted ? connection : nullptr;
  }

 private:
  struct Endpoint final : NSXPCListenerEndpoint {};

  const std::string _name;
  Transcript& _transcript;
  const std::shared_ptr<Endpoint> _endpoint = std::make_shared<Endpoint>();
  std::weak_ptr<NSXPCListenerDelegate> _delegate;
  int _connections = 0;
};

class ScriptedListeners final : public NSXPCListeners {
 public:
  explicit ScriptedListeners(Transcript& transcript) : _transcript(transcript) {}
  std::shared_ptr<NSXPCListener> anonymousListener() override {
    auto listener = std::make_shared<ScriptedListener>(
        "listener " + std::to_string(made.size() + 1), _transcript);
    made.push_back(listener);
    return listener;
  }

  std::vector<std::weak_ptr<ScriptedListener>> made;

 private:
  Transcript& _transcript;
};

}  // namespace skein
