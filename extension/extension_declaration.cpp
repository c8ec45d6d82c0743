#include "extension/extension_declaration.h"

#include "extension/extension_context.h"
#include "extension/extension_view_controller.h"
#include "platform/log.h"
#include "tempstore/temp_store.h"

zaf::extensionkit::ExtensionDeclaration ZafVideoEditorExtensionDeclaration()
{
    zaf::extensionkit::ExtensionDeclaration d;
    d.contextClassName = QStringLiteral("ZafVideoEditorExtensionContext");
    d.principalClassName = QStringLiteral("ZafVideoEditorExtensionViewController");
    d.makeContext = [] { return new ZafVideoEditorExtensionContext; };
    d.makePrincipal = [] { return new ZafVideoEditorExtensionViewController; };
    d.prepareProcess = [] {
        zaf::log::hideInformationalEntriesByDefault();
        // The temporary directory (and its parent) exist before the editor is built.
        ZafTempStore::defaultStore().prepareAtProcessStart();
    };
    d.windowTitle = QStringLiteral("Zafrel Video Editor");
    d.windowSize = QSize(1280, 720);
    // Closing the editor's window is Cancel, with an editor or without one.
    d.onWindowClosed = [](zaf::ui::ViewController *principal) {
        if (auto *controller = qobject_cast<ZafVideoEditorExtensionViewController *>(principal))
            controller->cancel();
    };
    return d;
}
