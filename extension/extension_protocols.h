#pragma once

// The two interfaces between host and extension.

#include <QStringList>

// What the extension offers the host: nothing; the host calls nothing in the extension.
class ZafVideoEditorExtensionProtocol {
public:
    virtual ~ZafVideoEditorExtensionProtocol() = default;
};

// What the host offers the extension: one one-way operation, the report of the activity types the
// user carried out (no reply, no completion).
class ZafVideoEditorExtensionHostProtocol {
public:
    virtual ~ZafVideoEditorExtensionHostProtocol() = default;
    virtual void extensionDidFinishWithActivityTypes(const QStringList &activityTypes) = 0;
};
