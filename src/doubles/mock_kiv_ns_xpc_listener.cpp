#include "kivi/doubles/mock_kiv_ns_xpc_listener.h"

namespace kivi {

MockKivNSXPCListener::MockKivNSXPCListener(std::shared_ptr<NSXPCInterface> interface,
                                           ObjectPtr exportedObject)
    : connectionInterface_(std::move(interface)),
      exportedObject_(std::move(exportedObject)),
      listener_(NSXPCListener::anonymousListener()),
      lifetime_(std::make_shared<char>(0)) {
  // A pointer to this double that shares the lifetime token's count, so
  // that the listener's weak reference expires when the double goes.
  listener_->setDelegate(std::shared_ptr<NSXPCListenerDelegate>(lifetime_, this));
  listener_->resume();
}

MockKivNSXPCListener::~MockKivNSXPCListener() { listener_->invalidate(); }

bool MockKivNSXPCListener::listener(const std::shared_ptr<NSXPCListener>& listener,
                                    const std::shared_ptr<NSXPCConnection>& newConnection) {
  if (shouldAcceptNewConnectionBlock && !shouldAcceptNewConnectionBlock(listener, newConnection)) {
    return false;
  }
  newConnection->setExportedInterface(connectionInterface_);
  newConnection->setExportedObject(exportedObject_);
  newConnection->resume();
  return true;
}

}  // namespace kivi
