// MockKivNSXPCListener: a working in-process listener that exports one
// object, for tests of code that connects to a service through an endpoint.
//
// Made with an interface and an exported object, it creates a real
// anonymous NSXPCListener, becomes its delegate and resumes it; endpoint()
// is that listener's endpoint, to hand to the client under test. For each
// new connection it asks shouldAcceptNewConnectionBlock, if set: false
// refuses the connection. Otherwise (and always without the callback) the
// connection exports connectionInterface and exportedObject, is resumed and
// accepted, so that the client's remoteObjectProxy() is exportedObject.
//
//   auto agent = std::make_shared<FakeAgent>();
//   auto service = std::make_shared<kivi::MockKivNSXPCListener>(
//       kivi::NSXPCInterface::interfaceWithProtocol("Agent"), agent);
//   client.connect(service->endpoint());  // reaches `agent`
//
// The double is the listener's delegate for as long as it lives (the
// listener holds it weakly); destroying it invalidates the listener.
//
// Thread contract: none of its own. The callback runs synchronously on the
// thread that resumed the client's connection; set it and the values before
// handing the endpoint out.
#pragma once

#include <functional>
#include <memory>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/ns_xpc.h"

namespace kivi {

class KIVI_EXPORT MockKivNSXPCListener : public Object, public NSXPCListenerDelegate {
 public:
  // Listens at once: makes an anonymous listener, becomes its delegate and resumes it. Destroying
  // the double invalidates the listener.
  MockKivNSXPCListener(std::shared_ptr<NSXPCInterface> interface, ObjectPtr exportedObject);
  ~MockKivNSXPCListener() override;

  // Asked about each new connection; false refuses it. Without it every connection is accepted.
  std::function<bool(const std::shared_ptr<NSXPCListener>&,
                     const std::shared_ptr<NSXPCConnection>&)>
      shouldAcceptNewConnectionBlock;

  // The interface each accepted connection exports; the constructor's at first.
  std::shared_ptr<NSXPCInterface> connectionInterface() const { return connectionInterface_; }
  void setConnectionInterface(std::shared_ptr<NSXPCInterface> interface) {
    connectionInterface_ = std::move(interface);
  }
  // The object each accepted connection exports; the constructor's at first.
  ObjectPtr exportedObject() const { return exportedObject_; }
  void setExportedObject(ObjectPtr object) { exportedObject_ = std::move(object); }
  // The real listener the double is the delegate of.
  const std::shared_ptr<NSXPCListener>& listener() const { return listener_; }
  // The listener's endpoint, for the client under test.
  std::shared_ptr<NSXPCListenerEndpoint> endpoint() const { return listener_->endpoint(); }

  bool listener(const std::shared_ptr<NSXPCListener>& listener,
                const std::shared_ptr<NSXPCConnection>& newConnection) override;

 private:
  std::shared_ptr<NSXPCInterface> connectionInterface_;
  ObjectPtr exportedObject_;
  const std::shared_ptr<NSXPCListener> listener_;
  // Owns the listener's weak view of this double: it expires with it.
  const std::shared_ptr<char> lifetime_;
};

}  // namespace kivi
