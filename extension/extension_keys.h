#pragma once

// The titles of the host's input items. The movie's key is named for a path but its text says URL:
// hosts send the text.

extern const char *const ZafVideoEditorExtensionMoviePathKey;            // "ZafVideoEditorExtensionMovieURLKey"
extern const char *const ZafVideoEditorExtensionAppNameKey;
extern const char *const ZafVideoEditorExtensionBundleIdentifierKey;
extern const char *const ZafVideoEditorExtensionFileAttachmentKey;
extern const char *const ZafVideoEditorExtensionOverrideShareMessageKey;
extern const char *const ZafVideoEditorExtensionOverrideTintColorKey;
