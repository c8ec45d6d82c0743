#include "platform/extensionkit/extension_registry.h"

#include "platform/extensionkit/extensionkit_log.h"
#include "platform/log.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>

namespace zaf::extensionkit {

namespace {

QStringList dataDirectories()
{
    QStringList dirs;
    QString home = qEnvironmentVariable("XDG_DATA_HOME");
    if (home.isEmpty())
        home = QDir::homePath() + QStringLiteral("/.local/share");
    dirs << home;
    QString system = qEnvironmentVariable("XDG_DATA_DIRS");
    if (system.isEmpty())
        system = QStringLiteral("/usr/local/share:/usr/share");
    dirs << system.split(QLatin1Char(':'), Qt::SkipEmptyParts);
    return dirs;
}

} // namespace

std::optional<InstalledExtension> ExtensionRegistry::extensionWithIdentifier(const QString &identifier)
{
    if (identifier.isEmpty() || identifier.contains(QLatin1Char('/')))
        return std::nullopt;
    for (const QString &dir : dataDirectories()) {
        const QString path = dir + QStringLiteral("/zafrel/extensions/") + identifier + QStringLiteral(".json");
        QFile file(path);
        if (!file.exists())
            continue;
        if (!file.open(QIODevice::ReadOnly)) {
            log::error(lcExtensionKit(), QStringLiteral("cannot read extension manifest %1").arg(path));
            continue;
        }
        QJsonParseError error;
        const QJsonDocument doc = QJsonDocument::fromJson(file.read(1 << 16), &error);
        if (!doc.isObject()) {
            log::error(lcExtensionKit(), QStringLiteral("extension manifest %1 is not a JSON object: %2").arg(path, error.errorString()));
            continue;
        }
        // The first manifest found decides, as the data directories' order says.
        if (!doc.object().value(QStringLiteral("enabled")).toBool(true))
            return std::nullopt;
        return InstalledExtension{identifier, path, doc.object()};
    }
    return std::nullopt;
}

} // namespace zaf::extensionkit
