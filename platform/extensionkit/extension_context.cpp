#include "platform/extensionkit/extension_context.h"

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/extensionkit_log.h"
#include "platform/log.h"

#include <QVariant>

#include <cerrno>

namespace zaf::extensionkit {

namespace {

// The dynamic property of a principal that points back at its context.
constexpr const char *kContextProperty = "_zafExtensionContext";

} // namespace

RemoteObjectProxy::RemoteObjectProxy(std::shared_ptr<Channel> channel, InterfaceDescription interface, ErrorHandler errorHandler)
    : m_channel(std::move(channel)), m_interface(std::move(interface)), m_errorHandler(std::move(errorHandler))
{
}

void RemoteObjectProxy::sendOneWay(const QString &method, const QJsonArray &params) const
{
    auto fail = [&](const Error &error) {
        log::error(lcExtensionKit(), QStringLiteral("one-way call %1 of %2 failed: %3")
                                       .arg(method, m_interface.protocolName, error.description()));
        if (m_errorHandler)
            m_errorHandler(error);
    };
    // Only what the host's interface declares goes out: anything else is the caller's mistake, not
    // something to put on the wire.
    if (!m_interface.oneWayMethods.contains(method)) {
        fail(Error{QString::fromLatin1(kPosixErrorDomain), EINVAL,
                   QStringLiteral("%1 is not a one-way method of %2").arg(method, m_interface.protocolName)});
        return;
    }
    if (!m_channel) {
        fail(Error::fromErrno(ENOTCONN));
        return;
    }
    if (const OptionalError error = m_channel->sendNotification(method, params))
        fail(*error);
}

ExtensionContext::ExtensionContext(QObject *parent) : QObject(parent) {}

ExtensionContext::~ExtensionContext()
{
    if (m_principal && m_principal->property(kContextProperty).value<QObject *>() == this)
        m_principal->setProperty(kContextProperty, QVariant());
}

QList<InputItem> ExtensionContext::inputItems() const
{
    return m_items;
}

QObject *ExtensionContext::principalObject() const
{
    return m_principal;
}

std::shared_ptr<RemoteObjectProxy> ExtensionContext::remoteObjectProxyWithErrorHandler(RemoteObjectProxy::ErrorHandler handler) const
{
    return std::make_shared<RemoteObjectProxy>(m_channel, auxiliaryHostInterface(), std::move(handler));
}

ExtensionContext *ExtensionContext::contextOfPrincipal(const QObject *principal)
{
    if (!principal)
        return nullptr;
    return qobject_cast<ExtensionContext *>(principal->property(kContextProperty).value<QObject *>());
}

void ExtensionContext::setInputItems(const QList<InputItem> &items)
{
    m_items = items;
}

void ExtensionContext::setPrincipalObject(QObject *principal)
{
    if (m_principal && m_principal->property(kContextProperty).value<QObject *>() == this)
        m_principal->setProperty(kContextProperty, QVariant());
    m_principal = principal;
    if (principal)
        principal->setProperty(kContextProperty, QVariant::fromValue<QObject *>(this));
}

void ExtensionContext::setChannel(std::shared_ptr<Channel> channel)
{
    m_channel = std::move(channel);
}

} // namespace zaf::extensionkit
