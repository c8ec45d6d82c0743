#include "extension/extension_keys.h"

const char *const ZafVideoEditorExtensionMoviePathKey = "ZafVideoEditorExtensionMovieURLKey";
const char *const ZafVideoEditorExtensionAppNameKey = "ZafVideoEditorExtensionAppNameKey";
const char *const ZafVideoEditorExtensionBundleIdentifierKey = "ZafVideoEditorExtensionBundleIdentifierKey";
const char *const ZafVideoEditorExtensionFileAttachmentKey = "ZafVideoEditorExtensionFileAttachmentKey";
const char *const ZafVideoEditorExtensionOverrideShareMessageKey = "ZafVideoEditorExtensionOverrideShareMessageKey";
const char *const ZafVideoEditorExtensionOverrideTintColorKey = "ZafVideoEditorExtensionOverrideTintColorKey";
