#pragma once

// The extension's declaration to the runtime: its context and principal classes, its window, what
// the process does at start, and closing the window as Cancel.

#include "platform/extensionkit/extension_runtime.h"

zaf::extensionkit::ExtensionDeclaration ZafVideoEditorExtensionDeclaration();
