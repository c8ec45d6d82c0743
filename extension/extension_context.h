#pragma once

// The editor extension's context: the interfaces it declares, its principal controller, and a proxy
// for the host's object. It holds no state of its own.

#include "extension/extension_protocols.h"
#include "platform/extensionkit/extension_context.h"

#include <QLoggingCategory>

#include <memory>

Q_DECLARE_LOGGING_CATEGORY(lcExtension)

class ZafVideoEditorExtensionViewController;

class ZafVideoEditorExtensionContext : public zaf::extensionkit::ExtensionContext, public ZafVideoEditorExtensionProtocol {
    Q_OBJECT
public:
    explicit ZafVideoEditorExtensionContext(QObject *parent = nullptr);

    // The interface descriptions made from the two protocols.
    static zaf::extensionkit::InterfaceDescription _extensionAuxiliaryVendorProtocol();
    static zaf::extensionkit::InterfaceDescription _extensionAuxiliaryHostProtocol();
    zaf::extensionkit::InterfaceDescription auxiliaryVendorInterface() const override;
    zaf::extensionkit::InterfaceDescription auxiliaryHostInterface() const override;

    ZafVideoEditorExtensionViewController *videoEditorExtensionViewController() const;

    // A proxy for the host's object, asked anew from the connection at every call. Its error
    // handler logs "error calling extension - %i" and does nothing else. Callable from any thread.
    std::shared_ptr<ZafVideoEditorExtensionHostProtocol> extensionObjectProxy() const;
};
