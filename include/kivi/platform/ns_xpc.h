// Connections between a listener and its clients inside one process: a
// listener hands out an endpoint, a client connects to the endpoint, the
// listener's delegate accepts (exporting an object) or refuses, and the
// client then reaches the exported object through its connection.
//
//   auto listener = kivi::NSXPCListener::anonymousListener();
//   listener->setDelegate(delegate);  // held weakly; accepts or refuses
//   listener->resume();
//
//   auto connection = kivi::NSXPCConnection::create(listener->endpoint());
//   connection->setRemoteObjectInterface(kivi::NSXPCInterface::interfaceWithProtocol("Agent"));
//   connection->setInvalidationHandler([] { reconnectLater(); });
//   connection->resume();
//   auto agent = std::dynamic_pointer_cast<Agent>(connection->remoteObjectProxy());
//
// What happens, in order:
//   - A connection does nothing until resume(). Resuming hands it to the
//     endpoint's listener; a listener that is not resumed yet keeps it
//     until it is. A listener that is gone or invalidated, or a null
//     endpoint, invalidates the connection at once.
//   - The listener makes the connection's other end and asks its delegate
//     listener(listener, newConnection). The delegate accepts by answering
//     true, normally after setting the new connection's exported interface
//     and object and resuming it; it refuses by answering false. No
//     delegate (or one that is gone) refuses.
//   - Accepted: remoteObjectProxy() of the client answers the exported
//     object of the listener's end (read at each call), and the listener's
//     end's remoteObjectProxy() answers the client's exported object.
//     Refused: both ends are invalidated.
//   - invalidate() on either end invalidates both. Each end's invalidation
//     handler is called at most once, when that end is invalidated; a
//     handler set after that is never called. Releasing the client's last
//     reference invalidates the listener's end.
// remoteObjectProxy() answers null before acceptance, after refusal and
// after invalidation. The proxy is the exported object itself, not a copy:
// calls on it run directly, on the caller's thread. Interfaces are carried
// as descriptions only; nothing checks an object against its interface.
//
// Thread contract: every member may be called from any thread. The
// delegate and the invalidation handlers are called synchronously on the
// thread whose call caused them (resume() or invalidate() of either side, or
// the release of a client), never under a lock of this library.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class NSXPCConnection;
class NSXPCListener;

// A named protocol description: what a connection's exported or remote
// object implements.
class KIVI_EXPORT NSXPCInterface : public Object {
 public:
  // An interface of the protocol named `protocolName`.
  explicit NSXPCInterface(std::string protocolName) : protocolName_(std::move(protocolName)) {}
  static std::shared_ptr<NSXPCInterface> interfaceWithProtocol(std::string protocolName) {
    return std::make_shared<NSXPCInterface>(std::move(protocolName));
  }
  // The name given when it was made.
  const std::string& protocolName() const noexcept { return protocolName_; }

  std::string className() const override { return "NSXPCInterface"; }

 private:
  const std::string protocolName_;
};

// What a client connects to: names one listener (weakly).
class KIVI_EXPORT NSXPCListenerEndpoint : public Object {
 public:
  std::string className() const override { return "NSXPCListenerEndpoint"; }

 private:
  friend class NSXPCListener;
  friend class NSXPCConnection;
  struct Token {
    explicit Token() = default;
  };

 public:
  // Made by NSXPCListener::endpoint() only (the Token is private).
  NSXPCListenerEndpoint(Token, std::weak_ptr<NSXPCListener> listener)
      : listener_(std::move(listener)) {}

 private:
  const std::weak_ptr<NSXPCListener> listener_;
};

// Decides about each new connection of a listener.
class KIVI_EXPORT NSXPCListenerDelegate {
 public:
  virtual ~NSXPCListenerDelegate() = default;
  // True accepts `newConnection` (set up its exported interface and object
  // and resume it first); false refuses it.
  virtual bool listener(const std::shared_ptr<NSXPCListener>& listener,
                        const std::shared_ptr<NSXPCConnection>& newConnection) = 0;
};

// Receives the connections made to its endpoint and lets its delegate accept
// or refuse each.
class KIVI_EXPORT NSXPCListener : public Object {
  struct Token {
    explicit Token() = default;
  };

 public:
  // A new listener that only clients given its endpoint can reach.
  static std::shared_ptr<NSXPCListener> anonymousListener();
  // Made by anonymousListener() only (the Token is private).
  explicit NSXPCListener(Token);
  // Invalidates the clients still waiting for this listener's resume().
  ~NSXPCListener() override;

  // Held weakly.
  std::shared_ptr<NSXPCListenerDelegate> delegate() const;
  void setDelegate(const std::shared_ptr<NSXPCListenerDelegate>& delegate);
  // The same endpoint on every call.
  std::shared_ptr<NSXPCListenerEndpoint> endpoint();
  // Starts delivering connections, the held ones first. Again: nothing.
  void resume();
  // Refuses every connection from now on, the held ones too. Connections
  // already accepted stay.
  void invalidate();

  std::string className() const override { return "NSXPCListener"; }

 private:
  friend class NSXPCConnection;
  struct State;
  void connect(const std::shared_ptr<NSXPCConnection>& client);
  void deliver(const std::shared_ptr<NSXPCConnection>& client);
  const std::unique_ptr<State> state_;
};

// One end of a connection: a client's, made for an endpoint, or the
// listener's, handed to its delegate.
class KIVI_EXPORT NSXPCConnection : public Object {
  struct Token {
    explicit Token() = default;
  };

 public:
  // A client connection to the listener `endpoint` names (it may be null:
  // the connection is then invalidated when resumed).
  explicit NSXPCConnection(std::shared_ptr<NSXPCListenerEndpoint> endpoint);
  static std::shared_ptr<NSXPCConnection> create(std::shared_ptr<NSXPCListenerEndpoint> endpoint) {
    return std::make_shared<NSXPCConnection>(std::move(endpoint));
  }
  // The listener's end, made by NSXPCListener only (the Token is private).
  NSXPCConnection(Token);
  // Destroying a client's end invalidates the listener's end.
  ~NSXPCConnection() override;

  // The interface of the object this end exports; a description only.
  std::shared_ptr<NSXPCInterface> exportedInterface() const;
  void setExportedInterface(std::shared_ptr<NSXPCInterface> interface);
  // What the other end's remoteObjectProxy() answers; null for nothing.
  ObjectPtr exportedObject() const;
  void setExportedObject(ObjectPtr object);
  // The interface expected of the other end's object; a description only.
  std::shared_ptr<NSXPCInterface> remoteObjectInterface() const;
  void setRemoteObjectInterface(std::shared_ptr<NSXPCInterface> interface);
  // The other end's exported object once accepted; null otherwise.
  ObjectPtr remoteObjectProxy() const;
  // Called at most once, when this end is invalidated; null for none. A
  // handler set after the invalidation is dropped.
  std::function<void()> invalidationHandler() const;
  void setInvalidationHandler(std::function<void()> handler);

  // Hands a client's end to its endpoint's listener. Again, or on the
  // listener's end (resumed already): nothing.
  void resume();
  // Ends the connection, both ends of it. Again: nothing.
  void invalidate();

  std::string className() const override { return "NSXPCConnection"; }

 private:
  friend class NSXPCListener;
  struct State;
  const std::unique_ptr<State> state_;
};

}  // namespace kivi
