#include "extension/extension_context.h"

#include "extension/extension_view_controller.h"
#include "platform/log.h"

#include <QJsonArray>

Q_LOGGING_CATEGORY(lcExtension, "zaf.extension")

using zaf::extensionkit::InterfaceDescription;
using zaf::extensionkit::RemoteObjectProxy;

namespace {

constexpr const char *kDidFinishMethod = "extensionDidFinishWithActivityTypes";

// The host's object as seen through the auxiliary connection.
class HostObjectProxy : public ZafVideoEditorExtensionHostProtocol {
public:
    explicit HostObjectProxy(std::shared_ptr<RemoteObjectProxy> proxy)
        : m_proxy(std::move(proxy))
    {
    }
    void extensionDidFinishWithActivityTypes(const QStringList &activityTypes) override
    {
        // The array goes as it is, as the single positional argument: no wrapper, key or version.
        m_proxy->sendOneWay(QLatin1String(kDidFinishMethod), QJsonArray{QJsonArray::fromStringList(activityTypes)});
    }

private:
    std::shared_ptr<RemoteObjectProxy> m_proxy;
};

} // namespace

ZafVideoEditorExtensionContext::ZafVideoEditorExtensionContext(QObject *parent)
    : ExtensionContext(parent)
{
}

InterfaceDescription ZafVideoEditorExtensionContext::_extensionAuxiliaryVendorProtocol()
{
    return InterfaceDescription{QStringLiteral("ZafVideoEditorExtensionProtocol"), {}};
}

InterfaceDescription ZafVideoEditorExtensionContext::_extensionAuxiliaryHostProtocol()
{
    return InterfaceDescription{QStringLiteral("ZafVideoEditorExtensionHostProtocol"), {QLatin1String(kDidFinishMethod)}};
}

InterfaceDescription ZafVideoEditorExtensionContext::auxiliaryVendorInterface() const
{
    return _extensionAuxiliaryVendorProtocol();
}

InterfaceDescription ZafVideoEditorExtensionContext::auxiliaryHostInterface() const
{
    return _extensionAuxiliaryHostProtocol();
}

ZafVideoEditorExtensionViewController *ZafVideoEditorExtensionContext::videoEditorExtensionViewController() const
{
    return qobject_cast<ZafVideoEditorExtensionViewController *>(principalObject());
}

std::shared_ptr<ZafVideoEditorExtensionHostProtocol> ZafVideoEditorExtensionContext::extensionObjectProxy() const
{
    const std::shared_ptr<RemoteObjectProxy> proxy = remoteObjectProxyWithErrorHandler([](const zaf::Error &error) {
        zaf::log::error(lcExtension(), QStringLiteral("error calling extension - %1").arg(qint32(error.code)));
    });
    return std::make_shared<HostObjectProxy>(proxy);
}
