#include "kivi/platform/ns_xpc.h"

#include <mutex>
#include <utility>
#include <vector>

namespace kivi {

struct NSXPCListener::State {
  mutable std::mutex mutex;
  std::weak_ptr<NSXPCListenerDelegate> delegate;
  std::shared_ptr<NSXPCListenerEndpoint> endpoint;
  bool resumed = false;
  bool invalidated = false;
  // Clients that resumed before the listener did.
  std::vector<std::weak_ptr<NSXPCConnection>> held;
};

struct NSXPCConnection::State {
  mutable std::mutex mutex;
  // Client side only; the listener's end has none.
  std::shared_ptr<NSXPCListenerEndpoint> endpoint;
  std::shared_ptr<NSXPCInterface> exportedInterface;
  std::shared_ptr<NSXPCInterface> remoteObjectInterface;
  ObjectPtr exportedObject;
  std::function<void()> invalidationHandler;
  bool resumed = false;
  bool accepted = false;
  bool invalidated = false;
  // The client owns the listener's end; the listener's end sees the client
  // weakly, so that releasing the client ends both.
  std::shared_ptr<NSXPCConnection> ownedPeer;
  std::weak_ptr<NSXPCConnection> peer;
};

// ----- NSXPCListener

std::shared_ptr<NSXPCListener> NSXPCListener::anonymousListener() {
  return std::make_shared<NSXPCListener>(Token{});
}

NSXPCListener::NSXPCListener(Token) : state_(std::make_unique<State>()) {}

NSXPCListener::~NSXPCListener() {
  // Held clients can no longer be reached: invalidate them.
  for (auto& weak : state_->held) {
    if (auto client = weak.lock()) client->invalidate();
  }
}

std::shared_ptr<NSXPCListenerDelegate> NSXPCListener::delegate() const {
  std::lock_guard lock(state_->mutex);
  return state_->delegate.lock();
}

void NSXPCListener::setDelegate(const std::shared_ptr<NSXPCListenerDelegate>& delegate) {
  std::lock_guard lock(state_->mutex);
  state_->delegate = delegate;
}

std::shared_ptr<NSXPCListenerEndpoint> NSXPCListener::endpoint() {
  std::lock_guard lock(state_->mutex);
  if (!state_->endpoint) {
    std::weak_ptr<NSXPCListener> self =
        std::static_pointer_cast<NSXPCListener>(weak_from_this().lock());
    state_->endpoint =
        std::make_shared<NSXPCListenerEndpoint>(NSXPCListenerEndpoint::Token{}, std::move(self));
  }
  return state_->endpoint;
}

void NSXPCListener::resume() {
  std::vector<std::weak_ptr<NSXPCConnection>> held;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->resumed || state_->invalidated) return;
    state_->resumed = true;
    held.swap(state_->held);
  }
  for (auto& weak : held) {
    if (auto client = weak.lock()) deliver(client);
  }
}

void NSXPCListener::invalidate() {
  std::vector<std::weak_ptr<NSXPCConnection>> held;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->invalidated) return;
    state_->invalidated = true;
    held.swap(state_->held);
  }
  for (auto& weak : held) {
    if (auto client = weak.lock()) client->invalidate();
  }
}

void NSXPCListener::connect(const std::shared_ptr<NSXPCConnection>& client) {
  {
    std::lock_guard lock(state_->mutex);
    if (!state_->invalidated && !state_->resumed) {
      state_->held.push_back(client);
      return;
    }
  }
  deliver(client);  // refuses when invalidated
}

void NSXPCListener::deliver(const std::shared_ptr<NSXPCConnection>& client) {
  {
    std::lock_guard lock(client->state_->mutex);
    if (client->state_->invalidated) return;  // gave up while held
  }
  std::shared_ptr<NSXPCListenerDelegate> delegate;
  {
    std::lock_guard lock(state_->mutex);
    if (!state_->invalidated) delegate = state_->delegate.lock();
  }
  if (!delegate) {
    client->invalidate();
    return;
  }
  auto end = std::make_shared<NSXPCConnection>(NSXPCConnection::Token{});
  {
    std::lock_guard lock(end->state_->mutex);
    end->state_->peer = client;
    end->state_->resumed = true;  // the delegate's resume() is then a no-op
  }
  auto self = std::static_pointer_cast<NSXPCListener>(weak_from_this().lock());
  const bool accepted = self && delegate->listener(self, end);
  if (!accepted) {
    end->invalidate();
    client->invalidate();
    return;
  }
  bool clientGone = false;
  {
    std::lock_guard lock(client->state_->mutex);
    if (client->state_->invalidated) {
      clientGone = true;
    } else {
      client->state_->accepted = true;
      client->state_->ownedPeer = end;
      client->state_->peer = end;
    }
  }
  {
    std::lock_guard lock(end->state_->mutex);
    if (!clientGone) end->state_->accepted = true;
  }
  if (clientGone) end->invalidate();
}

// ----- NSXPCConnection

NSXPCConnection::NSXPCConnection(std::shared_ptr<NSXPCListenerEndpoint> endpoint)
    : state_(std::make_unique<State>()) {
  state_->endpoint = std::move(endpoint);
}

NSXPCConnection::NSXPCConnection(Token) : state_(std::make_unique<State>()) {}

NSXPCConnection::~NSXPCConnection() {
  std::shared_ptr<NSXPCConnection> end;
  {
    std::lock_guard lock(state_->mutex);
    end = std::move(state_->ownedPeer);
  }
  if (end) end->invalidate();
}

std::shared_ptr<NSXPCInterface> NSXPCConnection::exportedInterface() const {
  std::lock_guard lock(state_->mutex);
  return state_->exportedInterface;
}

void NSXPCConnection::setExportedInterface(std::shared_ptr<NSXPCInterface> interface) {
  std::lock_guard lock(state_->mutex);
  state_->exportedInterface = std::move(interface);
}

ObjectPtr NSXPCConnection::exportedObject() const {
  std::lock_guard lock(state_->mutex);
  return state_->exportedObject;
}

void NSXPCConnection::setExportedObject(ObjectPtr object) {
  std::lock_guard lock(state_->mutex);
  state_->exportedObject = std::move(object);
}

std::shared_ptr<NSXPCInterface> NSXPCConnection::remoteObjectInterface() const {
  std::lock_guard lock(state_->mutex);
  return state_->remoteObjectInterface;
}

void NSXPCConnection::setRemoteObjectInterface(std::shared_ptr<NSXPCInterface> interface) {
  std::lock_guard lock(state_->mutex);
  state_->remoteObjectInterface = std::move(interface);
}

ObjectPtr NSXPCConnection::remoteObjectProxy() const {
  std::shared_ptr<NSXPCConnection> peer;
  {
    std::lock_guard lock(state_->mutex);
    if (!state_->accepted || state_->invalidated) return nullptr;
    peer = state_->peer.lock();
  }
  return peer ? peer->exportedObject() : nullptr;
}

std::function<void()> NSXPCConnection::invalidationHandler() const {
  std::lock_guard lock(state_->mutex);
  return state_->invalidationHandler;
}

void NSXPCConnection::setInvalidationHandler(std::function<void()> handler) {
  std::lock_guard lock(state_->mutex);
  if (!state_->invalidated) state_->invalidationHandler = std::move(handler);
}

void NSXPCConnection::resume() {
  std::shared_ptr<NSXPCListener> listener;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->resumed || state_->invalidated) return;
    state_->resumed = true;
    if (state_->endpoint) listener = state_->endpoint->listener_.lock();
  }
  auto self = std::static_pointer_cast<NSXPCConnection>(weak_from_this().lock());
  if (!listener || !self) {
    invalidate();
    return;
  }
  listener->connect(self);
}

void NSXPCConnection::invalidate() {
  std::function<void()> handler;
  std::shared_ptr<NSXPCConnection> peer;
  std::shared_ptr<NSXPCConnection> owned;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->invalidated) return;
    state_->invalidated = true;
    handler = std::move(state_->invalidationHandler);
    state_->invalidationHandler = nullptr;
    peer = state_->peer.lock();
    owned = std::move(state_->ownedPeer);
  }
  if (handler) handler();
  if (peer) peer->invalidate();
}

}  // namespace kivi
