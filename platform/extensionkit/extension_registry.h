#pragma once

// Installed extensions, looked up by identifier. An extension is installed by a manifest
// "zafrel/extensions/ID.json" in the XDG data directories ($XDG_DATA_HOME first, then
// $XDG_DATA_DIRS), a JSON object; {"enabled": false} disables it. A malformed manifest is logged and
// counts as absent. Any thread.

#include <QJsonObject>
#include <QString>

#include <optional>

namespace zaf::extensionkit {

struct InstalledExtension {
    QString identifier;
    QString manifestPath;
    QJsonObject manifest;
};

struct ExtensionRegistry {
    // The installed, enabled extension with that identifier, or none.
    static std::optional<InstalledExtension> extensionWithIdentifier(const QString &identifier);
};

} // namespace zaf::extensionkit
