#include "platform/bundle/desktop_entry.h"

#include "platform/log.h"

#include <QDir>
#include <QDirIterator>
#include <QFile>
#include <QFileInfo>
#include <QLoggingCategory>
#include <QSet>

#include <glib.h>

#include <mutex>

namespace zaf::bundle {

namespace {

Q_LOGGING_CATEGORY(lcDesktopEntry, "zaf.bundle")

constexpr const char *kDesktopGroup = "Desktop Entry";
constexpr const char *kIdentifierEntryKey = "X-Zaf-Identifier";

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

// The desktop-file ID of an entry inside an applications folder.
QString desktopFileId(const QString &applicationsDir, const QString &entryPath)
{
    QString relative = QDir(applicationsDir).relativeFilePath(entryPath);
    relative.replace(QLatin1Char('/'), QLatin1Char('-'));
    if (relative.endsWith(QLatin1String(".desktop")))
        relative.chop(8);
    return relative;
}

} // namespace

struct DesktopEntry::Private {
    std::unique_ptr<GKeyFile, void (*)(GKeyFile *)> keyFile{g_key_file_new(), g_key_file_unref};
    QString name;
    QString identifier;
    QString program;
    QString tryExec;
    std::mutex keyFileMutex; // guards the translation lookups in keyFile
};

DesktopEntry::DesktopEntry() : d(std::make_unique<Private>()) {}
DesktopEntry::DesktopEntry(DesktopEntry &&other) noexcept = default;
DesktopEntry &DesktopEntry::operator=(DesktopEntry &&other) noexcept = default;
DesktopEntry::~DesktopEntry() = default;

std::optional<DesktopEntry> DesktopEntry::read(const QString &path, Requirement requirement)
{
    DesktopEntry entry;
    GKeyFile *keyFile = entry.d->keyFile.get();
    GError *error = nullptr;
    // Translations must be kept: the localized name is chosen per lookup, not at load time.
    if (!g_key_file_load_from_file(keyFile, QFile::encodeName(path).constData(), G_KEY_FILE_KEEP_TRANSLATIONS, &error)) {
        zaf::log::error(lcDesktopEntry(), QStringLiteral("Desktop entry %1 cannot be read: %2").arg(path, QString::fromUtf8(error->message)));
        g_error_free(error);
        return std::nullopt;
    }
    if (!g_key_file_has_group(keyFile, kDesktopGroup)) {
        zaf::log::error(lcDesktopEntry(), QStringLiteral("Desktop entry %1 has no [Desktop Entry] group").arg(path));
        return std::nullopt;
    }
    entry.d->name = entryString(keyFile, "Name");
    entry.d->identifier = entryString(keyFile, kIdentifierEntryKey);
    if (requirement == Requirement::Application) {
        const QString type = entryString(keyFile, "Type");
        if (type != QLatin1String("Application")) {
            zaf::log::error(lcDesktopEntry(), QStringLiteral("Desktop entry %1 is of type \"%2\", not an application").arg(path, type));
            return std::nullopt;
        }
        if (entry.d->name.isEmpty()) {
            zaf::log::error(lcDesktopEntry(), QStringLiteral("Desktop entry %1 has no Name").arg(path));
            return std::nullopt;
        }
    }
    const QString exec = entryString(keyFile, "Exec");
    if (!exec.isEmpty()) {
        gint argc = 0;
        gchar **argv = nullptr;
        if (!g_shell_parse_argv(exec.toUtf8().constData(), &argc, &argv, &error)) {
            zaf::log::error(lcDesktopEntry(), QStringLiteral("Desktop entry %1 has a malformed Exec line \"%2\": %3")
                                                  .arg(path, exec, QString::fromUtf8(error->message)));
            g_error_free(error);
            return std::nullopt;
        }
        entry.d->program = resolveProgram(QString::fromUtf8(argv[0]));
        g_strfreev(argv);
    }
    entry.d->tryExec = resolveProgram(entryString(keyFile, "TryExec"));
    return entry;
}

QString DesktopEntry::name() const
{
    return d->name;
}

QString DesktopEntry::identifier() const
{
    return d->identifier;
}

QString DesktopEntry::program() const
{
    return d->program;
}

QString DesktopEntry::tryExec() const
{
    return d->tryExec;
}

QString DesktopEntry::executable() const
{
    return d->program.isEmpty() ? d->tryExec : d->program;
}

QString DesktopEntry::localizedName(const QStringList &languages) const
{
    std::lock_guard lock(d->keyFileMutex);
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
        if (!name.isEmpty())
            return name;
    }
    return QString();
}

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

QString applicationEntryPath(const QString &identifier)
{
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

QString desktopFileIdOfEntry(const QString &path)
{
    const QString absolute = QFileInfo(path).absoluteFilePath();
    for (const QString &dir : applicationDirectories()) {
        if (absolute.startsWith(dir + QLatin1Char('/')))
            return desktopFileId(dir, absolute);
    }
    return desktopFileId(QFileInfo(absolute).absolutePath(), absolute);
}

void forEachApplicationEntry(const std::function<bool(const QString &path)> &visit)
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
            if (visit(path))
                return;
        }
    }
}

} // namespace zaf::bundle
