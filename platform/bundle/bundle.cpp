#include "platform/bundle/bundle.h"

#include "platform/bundle/mo_catalog.h"
#include "platform/log.h"

#include <QDir>
#include <QDirIterator>
#include <QFileInfo>
#include <QHash>
#include <QLocale>
#include <QLoggingCategory>
#include <QSet>

#include <glib.h>
#include <unicode/localematcher.h>
#include <unicode/locid.h>

#include <mutex>
#include <optional>
#include <unistd.h>

Q_LOGGING_CATEGORY(lcBundle, "zaf.bundle")

namespace zaf::bundle {

namespace {

constexpr const char *kDesktopGroup = "Desktop Entry";
constexpr const char *kIdentifierEntryKey = "X-Zaf-Identifier";
constexpr const char *kInfoFileName = "Info.desktop";

std::mutex g_preferencesMutex;
QStringList g_preferencesOverride;

using KeyFilePtr = std::shared_ptr<GKeyFile>;

KeyFilePtr newKeyFile()
{
    return KeyFilePtr(g_key_file_new(), [](GKeyFile *k) { g_key_file_unref(k); });
}

// Takes ownership of a GLib string.
QString takeString(gchar *s)
{
    QString result = s ? QString::fromUtf8(s) : QString();
    g_free(s);
    return result;
}

QString entryString(GKeyFile *keyFile, const char *key)
{
    return takeString(g_key_file_get_string(keyFile, kDesktopGroup, key, nullptr));
}

// A program as a desktop entry names it: absolute, or looked up in PATH. A program that PATH does
// not hold keeps its bare name.
QString resolveProgram(const QString &program)
{
    if (program.isEmpty() || program.contains(QLatin1Char('/')))
        return program;
    const QString found = takeString(g_find_program_in_path(program.toUtf8().constData()));
    return found.isEmpty() ? program : found;
}

struct DesktopEntry {
    KeyFilePtr keyFile;
    QString name;
    QString program;  // the Exec program, resolved
    QString tryExec;  // resolved
    QString identifier; // X-Zaf-Identifier, when present
    QString executable() const { return program.isEmpty() ? tryExec : program; }
};

// Reads a desktop entry. `requireApplication`: the entry must describe an application (Type
// "Application" with a Name). Malformed entries give none and a logged error.
std::optional<DesktopEntry> loadDesktopEntry(const QString &path, bool requireApplication)
{
    DesktopEntry entry;
    entry.keyFile = newKeyFile();
    GError *error = nullptr;
    // Translations must be kept: the localized name is chosen per lookup, not at load time.
    if (!g_key_file_load_from_file(entry.keyFile.get(), QFile::encodeName(path).constData(), G_KEY_FILE_KEEP_TRANSLATIONS, &error)) {
        zaf::log::error(lcBundle(), QStringLiteral("Desktop entry %1 cannot be read: %2").arg(path, QString::fromUtf8(error->message)));
        g_error_free(error);
        return std::nullopt;
    }
    if (!g_key_file_has_group(entry.keyFile.get(), kDesktopGroup)) {
        zaf::log::error(lcBundle(), QStringLiteral("Desktop entry %1 has no [Desktop Entry] group").arg(path));
        return std::nullopt;
    }
    entry.name = entryString(entry.keyFile.get(), "Name");
    entry.identifier = entryString(entry.keyFile.get(), kIdentifierEntryKey);
    if (requireApplication) {
        const QString type = entryString(entry.keyFile.get(), "Type");
        if (type != QLatin1String("Application")) {
            zaf::log::error(lcBundle(), QStringLiteral("Desktop entry %1 is of type \"%2\", not an application").arg(path, type));
            return std::nullopt;
        }
        if (entry.name.isEmpty()) {
            zaf::log::error(lcBundle(), QStringLiteral("Desktop entry %1 has no Name").arg(path));
            return std::nullopt;
        }
    }
    const QString exec = entryString(entry.keyFile.get(), "Exec");
    if (!exec.isEmpty()) {
        gint argc = 0;
        gchar **argv = nullptr;
        if (!g_shell_parse_argv(exec.toUtf8().constData(), &argc, &argv, &error)) {
            zaf::log::error(lcBundle(), QStringLiteral("Desktop entry %1 has a malformed Exec line \"%2\": %3")
                                            .arg(path, exec, QString::fromUtf8(error->message)));
            g_error_free(error);
            return std::nullopt;
        }
        entry.program = resolveProgram(QString::fromUtf8(argv[0]));
        g_strfreev(argv);
    }
    entry.tryExec = resolveProgram(entryString(entry.keyFile.get(), "TryExec"));
    return entry;
}

// The "applications" folders of the XDG data directories, in precedence order.
QStringList applicationDirectories()
{
    QStringList bases;
    QString home = qEnvironmentVariable("XDG_DATA_HOME");
    if (home.isEmpty() || QDir::isRelativePath(home))
        home = QDir::homePath() + QStringLiteral("/.local/share");
    bases << home;
    QString dirs = qEnvironmentVariable("XDG_DATA_DIRS");
    if (dirs.isEmpty())
        dirs = QStringLiteral("/usr/local/share/:/usr/share/");
    for (const QString &dir : dirs.split(QLatin1Char(':'), Qt::SkipEmptyParts)) {
        if (!QDir::isRelativePath(dir))
            bases << dir;
    }
    QStringList result;
    for (const QString &base : bases) {
        const QString applications = QDir::cleanPath(base + QStringLiteral("/applications"));
        if (!result.contains(applications))
            result << applications;
    }
    return result;
}

// The desktop-file ID of an entry inside an applications folder: its path below the folder with
// "/" turned into "-", without ".desktop".
QString desktopFileId(const QString &applicationsDir, const QString &entryPath)
{
    QString relative = QDir(applicationsDir).relativeFilePath(entryPath);
    relative.replace(QLatin1Char('/'), QLatin1Char('-'));
    if (relative.endsWith(QLatin1String(".desktop")))
        relative.chop(8);
    return relative;
}

// Visits every desktop entry of the applications folders, in precedence order, skipping entries
// whose ID an earlier folder already supplied. The visitor returns true to stop.
template<typename Visitor>
void forEachDesktopEntry(Visitor visit)
{
    QSet<QString> seen;
    for (const QString &dir : applicationDirectories()) {
        QStringList paths;
        QDirIterator it(dir, {QStringLiteral("*.desktop")}, QDir::Files | QDir::Readable, QDirIterator::Subdirectories | QDirIterator::FollowSymlinks);
        while (it.hasNext())
            paths << it.next();
        paths.sort();
        for (const QString &path : paths) {
            const QString id = desktopFileId(dir, path);
            if (seen.contains(id))
                continue;
            seen.insert(id);
            if (visit(id, path))
                return;
        }
    }
}

QString desktopEntryPathForIdentifier(const QString &identifier)
{
    // The entry named after the ID wins in each folder; otherwise a sub-folder may supply the ID
    // ("kde-foo" from "kde/foo.desktop").
    for (const QString &dir : applicationDirectories()) {
        const QString direct = dir + QLatin1Char('/') + identifier + QStringLiteral(".desktop");
        if (QFileInfo(direct).isFile())
            return direct;
        if (!identifier.contains(QLatin1Char('-')))
            continue;
        QDirIterator it(dir, {QStringLiteral("*.desktop")}, QDir::Files, QDirIterator::Subdirectories | QDirIterator::FollowSymlinks);
        while (it.hasNext()) {
            const QString path = it.next();
            if (desktopFileId(dir, path) == identifier)
                return path;
        }
    }
    return QString();
}

// The desktop-file ID of an entry given by path: relative to the applications folder holding it,
// else its file name.
QString identifierForEntryPath(const QString &path)
{
    const QString absolute = QFileInfo(path).absoluteFilePath();
    for (const QString &dir : applicationDirectories()) {
        if (absolute.startsWith(dir + QLatin1Char('/')))
            return desktopFileId(dir, absolute);
    }
    return desktopFileId(QFileInfo(absolute).absolutePath(), absolute);
}

QVariantMap infoDictionaryOf(const DesktopEntry &entry, const QString &identifier)
{
    QVariantMap info;
    if (!entry.name.isEmpty())
        info.insert(QString::fromLatin1(kDisplayNameKey), entry.name);
    const QString executable = entry.executable();
    if (!executable.isEmpty()) {
        info.insert(QString::fromLatin1(kExecutableKey), executable);
        info.insert(QString::fromLatin1(kBundleNameKey), QFileInfo(executable).fileName());
    }
    if (!identifier.isEmpty())
        info.insert(QString::fromLatin1(kIdentifierKey), identifier);
    return info;
}

// A BCP 47 tag ("de-CH", "sr-Latn-RS") as a POSIX locale name for desktop entries ("de_CH",
// "sr_RS@latin"). Scripts other than Latin and Cyrillic have no modifier there and are dropped.
QString posixLocaleName(const QString &tag)
{
    const QStringList parts = QString(tag).replace(QLatin1Char('_'), QLatin1Char('-')).split(QLatin1Char('-'), Qt::SkipEmptyParts);
    if (parts.isEmpty())
        return QString();
    QString result = parts.first().toLower();
    QString region;
    QString modifier;
    for (qsizetype i = 1; i < parts.size(); ++i) {
        const QString &part = parts[i];
        if (part.size() == 4 && region.isEmpty()) {
            if (part.compare(QLatin1String("Latn"), Qt::CaseInsensitive) == 0)
                modifier = QStringLiteral("latin");
            else if (part.compare(QLatin1String("Cyrl"), Qt::CaseInsensitive) == 0)
                modifier = QStringLiteral("cyrillic");
        } else if ((part.size() == 2 || part.size() == 3) && region.isEmpty()) {
            region = part.toUpper();
        }
    }
    if (!region.isEmpty())
        result += QLatin1Char('_') + region;
    if (!modifier.isEmpty())
        result += QLatin1Char('@') + modifier;
    return result;
}

// An ICU locale for a localization or preference name; "bogus" when it is not a language tag.
icu::Locale icuLocale(const QString &name)
{
    QString tag = name;
    tag.replace(QLatin1Char('_'), QLatin1Char('-'));
    UErrorCode status = U_ZERO_ERROR;
    icu::Locale locale = icu::Locale::forLanguageTag(tag.toStdString(), status);
    if (U_FAILURE(status) || locale.isBogus() || locale.getLanguage()[0] == '\0')
        locale.setToBogus();
    return locale;
}

} // namespace

struct Bundle::Private {
    QString path;
    QString identifier;
    QString resourcePath;
    QVariantMap info;
    QStringList localizations;
    KeyFilePtr keyFile; // the desktop entry, for its translations; may be null

    mutable std::mutex mutex; // guards keyFile reads and the table cache
    mutable QHash<QString, std::shared_ptr<const QHash<QString, QString>>> tables;

    std::shared_ptr<const QHash<QString, QString>> table(const QString &path) const;
};

std::shared_ptr<const QHash<QString, QString>> Bundle::Private::table(const QString &tablePath) const
{
    std::lock_guard lock(mutex);
    auto it = tables.constFind(tablePath);
    if (it != tables.constEnd())
        return it.value();
    MoCatalog catalog = readMoCatalog(tablePath);
    if (!catalog.isValid()) {
        zaf::log::error(lcBundle(), QStringLiteral("String table unusable, treated as empty: %1").arg(catalog.error));
        catalog.strings.clear();
    }
    auto parsed = std::make_shared<const QHash<QString, QString>>(std::move(catalog.strings));
    tables.insert(tablePath, parsed);
    return parsed;
}

std::shared_ptr<Bundle> Bundle::bundleWithPath(const QString &path)
{
    if (path.isEmpty())
        return nullptr;
    const QFileInfo info(path);
    auto d = std::make_shared<Private>();
    d->path = QDir::cleanPath(info.absoluteFilePath());

    if (info.isFile() && path.endsWith(QLatin1String(".desktop"))) {
        const auto entry = loadDesktopEntry(d->path, true);
        if (!entry)
            return nullptr;
        d->identifier = identifierForEntryPath(d->path);
        d->info = infoDictionaryOf(*entry, d->identifier);
        d->keyFile = entry->keyFile;
    } else if (info.isDir() && info.isReadable()) {
        const QString resources = d->path + QStringLiteral("/Resources");
        d->resourcePath = QFileInfo(resources).isDir() ? resources : d->path;
        const QString infoFile = d->path + QLatin1Char('/') + QLatin1String(kInfoFileName);
        if (QFileInfo(infoFile).isFile()) {
            // A malformed information dictionary leaves the bundle without one (logged).
            if (const auto entry = loadDesktopEntry(infoFile, false)) {
                d->identifier = entry->identifier;
                d->info = infoDictionaryOf(*entry, d->identifier);
                d->keyFile = entry->keyFile;
            }
        }
        const QStringList folders = QDir(d->resourcePath).entryList({QStringLiteral("*.lproj")}, QDir::Dirs | QDir::NoDotAndDotDot, QDir::Name);
        for (const QString &folder : folders)
            d->localizations << folder.chopped(6);
    } else {
        return nullptr;
    }
    std::shared_ptr<Bundle> bundle(new Bundle);
    bundle->d = std::move(d);
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
    const QString path = desktopEntryPathForIdentifier(id);
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
    forEachDesktopEntry([&](const QString &, const QString &path) {
        const auto entry = loadDesktopEntry(path, true);
        if (entry && (sameProgram(entry->tryExec) || sameProgram(entry->program))) {
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
    if (!d->keyFile)
        return localized;
    const QStringList languages = preferredLanguages();
    std::lock_guard lock(d->mutex);
    GKeyFile *keyFile = d->keyFile.get();
    for (const QString &language : languages) {
        const QByteArray locale = posixLocaleName(language).toUtf8();
        if (locale.isEmpty())
            continue;
        // GLib applies the Desktop Entry fallbacks (ll_CC@mod, ll_CC, ll@mod, ll) for this language.
        gchar *match = g_key_file_get_locale_for_key(keyFile, kDesktopGroup, "Name", locale.constData());
        if (!match)
            continue;
        const QString name = takeString(g_key_file_get_locale_string(keyFile, kDesktopGroup, "Name", match, nullptr));
        g_free(match);
        if (!name.isEmpty()) {
            localized.insert(QString::fromLatin1(kDisplayNameKey), name);
            break;
        }
    }
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

QStringList preferredLanguages()
{
    {
        std::lock_guard lock(g_preferencesMutex);
        if (!g_preferencesOverride.isEmpty())
            return g_preferencesOverride;
    }
    QStringList languages;
    for (QString language : QLocale::system().uiLanguages()) {
        // The C (POSIX) locale asks for the untranslated messages, and those are written in English.
        if (language == QLatin1String("C") || language == QLatin1String("POSIX"))
            language = QString::fromLatin1(kDevelopmentLocalization);
        language.replace(QLatin1Char('_'), QLatin1Char('-'));
        if (!languages.contains(language))
            languages << language;
    }
    return languages;
}

void setPreferredLanguagesForTesting(const QStringList &languages)
{
    std::lock_guard lock(g_preferencesMutex);
    g_preferencesOverride = languages;
}

QStringList preferredLocalizationsFromArray(const QStringList &localizations, const QStringList &preferences)
{
    QStringList remaining = localizations;
    remaining.removeDuplicates();
    QStringList ordered;
    for (const QString &preference : preferences) {
        const icu::Locale desired = icuLocale(preference);
        if (desired.isBogus())
            continue;
        // Take every localization that serves this preference, best first; the matcher breaks ties
        // by the order of the supported list, which is the given order.
        while (!remaining.isEmpty()) {
            icu::LocaleMatcher::Builder builder;
            QList<qsizetype> indexOf; // supported index -> index into `remaining`
            for (qsizetype i = 0; i < remaining.size(); ++i) {
                const icu::Locale supported = icuLocale(remaining[i]);
                if (supported.isBogus())
                    continue;
                builder.addSupportedLocale(supported);
                indexOf << i;
            }
            if (indexOf.isEmpty())
                break;
            builder.setNoDefaultLocale();
            UErrorCode status = U_ZERO_ERROR;
            const icu::LocaleMatcher matcher = builder.build(status);
            if (U_FAILURE(status)) {
                zaf::log::error(lcBundle(), QStringLiteral("Locale matcher cannot be built: %1").arg(QString::fromLatin1(u_errorName(status))));
                break;
            }
            const icu::LocaleMatcher::Result result = matcher.getBestMatchResult(desired, status);
            if (U_FAILURE(status) || result.getSupportedIndex() < 0)
                break;
            const qsizetype index = indexOf.at(result.getSupportedIndex());
            ordered << remaining.takeAt(index);
        }
    }
    // The texts are written in the development language: when no preference is served, it is the
    // best remaining choice, ahead of the other localizations in their given order.
    for (qsizetype i = 0; i < remaining.size(); ++i) {
        if (remaining[i] == QLatin1String(kDevelopmentLocalization)) {
            remaining.move(i, 0);
            break;
        }
    }
    return ordered + remaining;
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
