#pragma once

// The extension context: the host's request (its input items), the principal object, and the
// auxiliary connection to the host with proxies for the host's object.
//
// Threads: created and used on the main thread. Messages to the host are written from the calling
// thread under a lock (the report may come from a worker thread); a write that fails goes to the
// proxy's error handler on that thread.

#include "platform/error.h"
#include "platform/extensionkit/input_item.h"

#include <QJsonArray>
#include <QList>
#include <QObject>
#include <QPointer>
#include <QStringList>

#include <functional>
#include <memory>

namespace zaf::extensionkit {

class Channel;

// The description of an interface made from a protocol: its name and its one-way operations
// (the JSON-RPC notification method names it may carry).
struct InterfaceDescription {
    QString protocolName;
    QStringList oneWayMethods;
};

// A proxy for the host's object: each call sends one one-way message (a JSON-RPC notification whose
// params are the positional arguments); a failure is handed to the error handler (with an integer
// code: the errno of the failed write, ENOTCONN without a channel, EINVAL for a method the interface
// does not declare) and goes no further.
class RemoteObjectProxy {
public:
    // Runs on the thread that called sendOneWay, before sendOneWay returns.
    using ErrorHandler = std::function<void(const Error &error)>;
    RemoteObjectProxy(std::shared_ptr<Channel> channel, InterfaceDescription interface, ErrorHandler errorHandler);
    // Sends `method` (one of the interface's one-way methods) with positional params. Any thread.
    void sendOneWay(const QString &method, const QJsonArray &params) const;

private:
    std::shared_ptr<Channel> m_channel;
    InterfaceDescription m_interface;
    ErrorHandler m_errorHandler;
};

class ExtensionContext : public QObject {
    Q_OBJECT
public:
    explicit ExtensionContext(QObject *parent = nullptr);
    ~ExtensionContext() override;

    // The request's input items, in the host's order (empty until the request has arrived).
    QList<InputItem> inputItems() const;
    // The principal object (the extension's root view controller).
    QObject *principalObject() const;

    // What this extension offers the host and what the host offers it; subclasses describe them.
    virtual InterfaceDescription auxiliaryVendorInterface() const { return {}; }
    virtual InterfaceDescription auxiliaryHostInterface() const { return {}; }

    // A new proxy for the host's object on the auxiliary connection (nothing is cached).
    std::shared_ptr<RemoteObjectProxy> remoteObjectProxyWithErrorHandler(RemoteObjectProxy::ErrorHandler handler) const;

    // The context of a principal object (set by setPrincipalObject), or null. Main thread.
    static ExtensionContext *contextOfPrincipal(const QObject *principal);

    // Wiring done by the runtime.
    void setInputItems(const QList<InputItem> &items);
    void setPrincipalObject(QObject *principal);
    void setChannel(std::shared_ptr<Channel> channel);

private:
    QList<InputItem> m_items;
    QPointer<QObject> m_principal;
    std::shared_ptr<Channel> m_channel;
};

} // namespace zaf::extensionkit
