#include "tempstore/process_directory.h"

#include "platform/log.h"
#include "tempstore/temp_store.h"

#include <QDir>
#include <QFile>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <unistd.h>

namespace zaf::tempstore {

namespace {

constexpr mode_t kPrivateDirectoryMode = 0700;
// Loose entries in the root come from versions that wrote there directly; a day is far longer
// than any editor of such a version stays open.
constexpr std::chrono::hours kLooseEntryAge{24};

QString withTrailingSlash(QString path)
{
    if (!path.endsWith(QLatin1Char('/')))
        path += QLatin1Char('/');
    return path;
}

// Makes a new, uniquely named directory (mode 0700) in the root; empty on failure, with errno set.
QString makeUniqueDirectory(const QString &root)
{
    QByteArray pattern = QFile::encodeName(root + QLatin1String(ProcessDirectory::kNamePrefix) + QStringLiteral("XXXXXX"));
    if (!::mkdtemp(pattern.data()))
        return {};
    return withTrailingSlash(QFile::decodeName(pattern));
}

} // namespace

QString perUserTempRoot()
{
    const QString overridden = qEnvironmentVariable("ZAF_TEMP_DIRECTORY");
    if (!overridden.isEmpty())
        return withTrailingSlash(QDir::cleanPath(QDir::current().absoluteFilePath(overridden)));
    QString cache = qEnvironmentVariable("XDG_CACHE_HOME");
    // The base directory specification ignores relative paths.
    if (cache.isEmpty() || !QDir::isAbsolutePath(cache))
        cache = QDir::homePath() + QStringLiteral("/.cache");
    return withTrailingSlash(QDir::cleanPath(cache) + QStringLiteral("/Zafrel"));
}

ProcessDirectory::ProcessDirectory(const FileManager &fileManager, QString root, QString path, DirectoryLock lock)
    : m_fileManager(&fileManager)
    , m_root(std::move(root))
    , m_path(std::move(path))
    , m_lock(std::move(lock))
{
}

ProcessDirectory ProcessDirectory::claim(const FileManager &fileManager, const QString &rootPath)
{
    const QString root = withTrailingSlash(rootPath);
    // What is used when no directory can be claimed: a name no other process uses, which a later
    // setup may still create.
    const QString fallback = root + QLatin1String(kNamePrefix) + QStringLiteral("pid%1/").arg(::getpid());
    auto unclaimed = [&](const QString &path, const QString &why) {
        zaf::log::error(lcTempStore(), QStringLiteral("cannot claim a temporary directory in %1: %2").arg(root, why));
        return ProcessDirectory(fileManager, root, path, DirectoryLock());
    };

    if (!fileManager.fileExistsAtPath(root)) {
        if (OptionalError e = fileManager.createDirectoryAtPath(root, true, kPrivateDirectoryMode))
            return unclaimed(fallback, e->description());
    }
    Result<DirectoryLock> rootLock = DirectoryLock::lock(root, DirectoryLock::Wait::Yes);
    if (!rootLock.ok())
        return unclaimed(fallback, rootLock.error->description());

    const QString path = makeUniqueDirectory(root);
    if (path.isEmpty())
        return unclaimed(fallback, Error::fromErrno(errno, root).description());
    // New, and the root is held: nobody else can have locked it.
    Result<DirectoryLock> own = DirectoryLock::lock(path, DirectoryLock::Wait::No);
    if (!own.ok())
        return unclaimed(path, own.error->description());

    ProcessDirectory directory(fileManager, root, path, std::move(*own.value));
    rootLock.value->unlock();
    directory.sweepAbandonedSiblings();
    return directory;
}

ProcessDirectory::~ProcessDirectory()
{
    if (!m_lock.isLocked())
        return;
    if (m_fileManager->fileExistsAtPath(m_path)) {
        if (OptionalError e = m_fileManager->removeItemAtPath(m_path))
            zaf::log::error(lcTempStore(), QStringLiteral("cannot remove the temporary directory %1: %2").arg(m_path, e->description()));
    }
    m_lock.unlock();
}

int ProcessDirectory::sweepAbandonedSiblings() const
{
    return sweep(*m_fileManager, m_root, m_path);
}

int ProcessDirectory::sweepAbandoned(const FileManager &fileManager, const QString &root)
{
    return sweep(fileManager, withTrailingSlash(root), QString());
}

bool ProcessDirectory::isHeldByLivingProcess(const QString &directory)
{
    const Result<DirectoryLock> probe = DirectoryLock::lock(directory, DirectoryLock::Wait::No);
    return !probe.ok() && probe.error->code == EWOULDBLOCK;
}

int ProcessDirectory::sweep(const FileManager &fileManager, const QString &root, const QString &keep)
{
    Result<DirectoryLock> rootLock = DirectoryLock::lock(root, DirectoryLock::Wait::Yes);
    if (!rootLock.ok()) {
        zaf::log::error(lcTempStore(), QStringLiteral("cannot sweep %1: %2").arg(root, rootLock.error->description()));
        return 0;
    }
    const Result<QStringList> listing = fileManager.contentsOfDirectoryAtPath(root);
    if (!listing.ok())
        return 0;
    const Date now = std::chrono::system_clock::now();
    int removed = 0;
    for (const QString &name : *listing.value) {
        const QString path = root + name;
        if (withTrailingSlash(path) == keep)
            continue;
        const Result<FileAttributes> attributes = fileManager.attributesOfItemAtPath(path);
        if (!attributes.ok())
            continue; // gone since the listing
        if (name.startsWith(QLatin1String(kNamePrefix)) && attributes.value->isDirectory) {
            // The lock is held while the directory is removed, so its owner cannot be mistaken
            // for alive or dead half-way.
            const Result<DirectoryLock> owner = DirectoryLock::lock(path, DirectoryLock::Wait::No);
            if (!owner.ok())
                continue; // a living process holds it (or it cannot be opened: leave it)
            zaf::log::notice(lcTempStore(), QStringLiteral("removing %1, left by a process that has ended").arg(path));
        } else if (now - attributes.value->modificationDate < kLooseEntryAge) {
            continue;
        }
        if (OptionalError e = fileManager.removeItemAtPath(path))
            zaf::log::error(lcTempStore(), QStringLiteral("cannot remove %1: %2").arg(path, e->description()));
        else
            ++removed;
    }
    return removed;
}

const ProcessDirectory &processDirectory()
{
    static const ProcessDirectory directory = ProcessDirectory::claim(FileManager::defaultManager(), perUserTempRoot());
    return directory;
}

} // namespace zaf::tempstore
