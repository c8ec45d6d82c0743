#include "platform/bundle/bundle.h"

#include "platform/bundle/desktop_entry.h"
#include "platform/bundle/mo_catalog.h"
#include "platform/log.h"

#include <QDir>
#include <QFileInfo>
#include <QHash>
#include <QLoggingCategory>

#include <mutex>
#include <optional>
#include <unistd.h>

namespace zaf::bundle {

namespace {

Q_LOGGING_CATEGORY(lcBundle, "zaf.bundle")

constexpr const char *kInfoFileName = "Info.desktop";

using StringTable = QHash<QString, QString>;

QVariantMap infoDictionaryOf(const DesktopEntry &entry, const QString &identifier)
{
    QVariantMap info;
    if (!entry.name().isEmpty())
        info.insert(QString::fromLatin1(kDisplayNameKey), entry.name());
    const QString executable = entry.executable();
    if (!executable.isEmpty()) {
        info.insert(QString::fromLatin1(kExecutableKey), executable);
        info.insert(QString::fromLatin1(kBundleNameKey), QFileInfo(executable).fileName());
    }
    if (!identifier.isEmpty())
        info.insert(QString::fromLatin1(kIdentifierKey), identifier);
    return info;
}

} // namespace

struct Bundle::Private {
    QString path;
    QString identifier;
    QString resourcePath;
    QVariantMap info;
    QStringList localizations;
    std::optional<DesktopEntry> entry; // for its translations

    mutable std::mutex tablesMutex; // guards the table cache
    mutable QHash<QString, std::shared_ptr<const StringTable>> tables;

    // The string table at `tablePath`, read on first use; a missing or corrupt one is empty.
    std::shared_ptr<const StringTable> table(const QString &tablePath) const
    {
        std::lock_guard lock(tablesMutex);
        auto it = tables.constFind(tablePath);
        if (it != tables.constEnd())
            return it.value();
        MoCatalog catalog = readMoCatalog(tablePath);
        if (!catalog.isValid()) {
            zaf::log::error(lcBundle(), QStringLiteral("String table unusable, treated as empty: %1").arg(catalog.error));
            catalog.strings.clear();
        }
        auto parsed = std::make_shared<const StringTable>(std::move(catalog.strings));
        tables.insert(tablePath, parsed);
        return parsed;
    }
};

Bundle::Bundle() : d(std::make_unique<Private>()) {}
Bundle::~Bundle() = default;

std::shared_ptr<Bundle> Bundle::bundleWithPath(const QString &path)
{
    if (path.isEmpty())
        return nullptr;
    const QFileInfo info(path);
    std::shared_ptr<Bundle> bundle(new Bundle);
    Private &d = *bundle->d;
    d.path = QDir::cleanPath(info.absoluteFilePath());

    if (info.isFile() && path.endsWith(QLatin1String(".desktop"))) {
        d.entry = DesktopEntry::read(d.path, DesktopEntry::Requirement::Application);
        if (!d.entry)
            return nullptr;
        d.identifier = desktopFileIdOfEntry(d.path);
        d.info = infoDictionaryOf(*d.entry, d.identifier);
    } else if (info.isDir() && info.isReadable()) {
        const QString resources = d.path + QStringLiteral("/Resources");
        d.resourcePath = QFileInfo(resources).isDir() ? resources : d.path;
        const QString infoFile = d.path + QLatin1Char('/') + QLatin1String(kInfoFileName);
        // A malformed information dictionary leaves the bundle without one (logged).
        if (QFileInfo(infoFile).isFile())
            d.entry = DesktopEntry::read(infoFile, DesktopEntry::Requirement::AnyEntry);
        if (d.entry) {
            d.identifier = d.entry->identifier();
            d.info = infoDictionaryOf(*d.entry, d.identifier);
        }
        const QStringList folders = QDir(d.resourcePath).entryList({QStringLiteral("*.lproj")}, QDir::Dirs | QDir::NoDotAndDotDot, QDir::Name);
        for (const QString &folder : folders)
            d.localizations << folder.chopped(6);
    } else {
        return nullptr;
    }
    return bundle;
}

std::shared_ptr<Bundle> Bundle::bundleWithURL(const QUrl &url)
{
    if (!url.isValid() || !url.isLocalFile())
        return nullptr;
    return bundleWithPath(url.toLocalFile());
}

std::shared_ptr<Bundle> Bundle::bundleWithIdentifier(const QString &identifier)
{
    QString id = identifier;
    if (id.endsWith(QLatin1String(".desktop")))
        id.chop(8);
    if (id.isEmpty() || id.contains(QLatin1Char('/')))
        return nullptr;
    const QString path = applicationEntryPath(id);
    if (path.isEmpty())
        return nullptr;
    return bundleWithPath(path);
}

std::shared_ptr<Bundle> Bundle::bundleForExecutablePath(const QString &executablePath)
{
    if (executablePath.isEmpty())
        return nullptr;
    const QFileInfo target(executablePath);
    const QString wanted = target.canonicalFilePath().isEmpty() ? target.absoluteFilePath() : target.canonicalFilePath();
    const auto sameProgram = [&](const QString &program) {
        if (program.isEmpty() || !program.startsWith(QLatin1Char('/')))
            return false;
        const QFileInfo candidate(program);
        return candidate.absoluteFilePath() == wanted || (!candidate.canonicalFilePath().isEmpty() && candidate.canonicalFilePath() == wanted);
    };
    QString found;
    forEachApplicationEntry([&](const QString &path) {
        const auto entry = DesktopEntry::read(path, DesktopEntry::Requirement::Application);
        if (entry && (sameProgram(entry->tryExec()) || sameProgram(entry->program()))) {
            found = path;
            return true;
        }
        return false;
    });
    return found.isEmpty() ? nullptr : bundleWithPath(found);
}

QString Bundle::bundlePath() const
{
    return d->path;
}

QString Bundle::bundleIdentifier() const
{
    return d->identifier;
}

QVariantMap Bundle::infoDictionary() const
{
    return d->info;
}

QVariantMap Bundle::localizedInfoDictionary() const
{
    QVariantMap localized;
    const QString name = d->entry ? d->entry->localizedName(preferredLanguages()) : QString();
    if (!name.isEmpty())
        localized.insert(QString::fromLatin1(kDisplayNameKey), name);
    return localized;
}

QString Bundle::resourcePath() const
{
    return d->resourcePath;
}

QStringList Bundle::localizations() const
{
    return d->localizations;
}

QString Bundle::pathForResource(const QString &name, const QString &type, const QString &localization) const
{
    if (d->resourcePath.isEmpty() || name.isEmpty() || name.contains(QLatin1Char('/')) || localization.contains(QLatin1Char('/')))
        return QString();
    QString dir = d->resourcePath;
    if (!localization.isEmpty())
        dir += QLatin1Char('/') + localization + QStringLiteral(".lproj");
    const QString base = dir + QLatin1Char('/') + name;
    const QString path = type.isEmpty() ? base : base + QLatin1Char('.') + type;
    if (QFileInfo(path).isFile())
        return path;
    if (type == QLatin1String("strings") && QFileInfo(base + QStringLiteral(".mo")).isFile())
        return base + QStringLiteral(".mo");
    return QString();
}

QString Bundle::localizedStringForKey(const QString &key, const QString &value, const QString &table) const
{
    const QString fallback = value.isEmpty() ? key : value;
    if (d->resourcePath.isEmpty())
        return fallback;
    const QString tableName = table.isEmpty() ? QStringLiteral("Localizable") : table;
    if (tableName.contains(QLatin1Char('/')))
        return fallback;
    QString dir = d->resourcePath;
    if (!d->localizations.isEmpty()) {
        const QStringList order = preferredLocalizationsFromArray(d->localizations, preferredLanguages());
        dir += QLatin1Char('/') + order.first() + QStringLiteral(".lproj");
    }
    const auto strings = d->table(dir + QLatin1Char('/') + tableName + QStringLiteral(".mo"));
    const auto it = strings->constFind(key);
    return it == strings->constEnd() ? fallback : it.value();
}

int executablePathOfProcess(pid_t pid, QString *path)
{
    if (path)
        path->clear();
    if (pid <= 0)
        return 0;
    char buffer[4096];
    const QByteArray link = QByteArrayLiteral("/proc/") + QByteArray::number(pid) + QByteArrayLiteral("/exe");
    const ssize_t length = ::readlink(link.constData(), buffer, sizeof buffer);
    // A path that fills the whole buffer may have been cut short.
    if (length <= 0 || length >= ssize_t(sizeof buffer))
        return 0;
    if (path)
        *path = QString::fromUtf8(buffer, length);
    return int(length);
}

} // namespace zaf::bundle
