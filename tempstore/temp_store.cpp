#include "tempstore/temp_store.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/text/string_compare.h"
#include "tempstore/process_directory.h"
#include "tempstore/temp_directory.h"

#include <chrono>
#include <cmath>
#include <limits>

Q_LOGGING_CATEGORY(lcTempStore, "zaf.tempstore")

using zaf::log::console;
using zaf::log::error;
using zaf::log::info;

namespace {

// The store's directory is private to the user: recordings are personal.
constexpr mode_t kTempDirectoryMode = 0700;

// "%i" of a double: the fraction dropped toward zero, saturated to the 32-bit range.
int toInt32(double v)
{
    if (std::isnan(v))
        return 0;
    if (v >= double(std::numeric_limits<int>::max()))
        return std::numeric_limits<int>::max();
    if (v <= double(std::numeric_limits<int>::min()))
        return std::numeric_limits<int>::min();
    return int(v);
}

} // namespace

ZafTempStore &ZafTempStore::defaultStore()
{
    static ZafTempStore store(zaf::FileManager::defaultManager(), ZafScreenRecorderTempDirectory(), {},
                              [] { zaf::tempstore::processDirectory().sweepAbandonedSiblings(); });
    return store;
}

ZafTempStore::ZafTempStore(const zaf::FileManager &fileManager, QString directory, Clock clock, AbandonedSweep sweep)
    : m_fileManager(fileManager)
    , m_directory(std::move(directory))
    , m_clock(clock ? std::move(clock) : Clock([] { return std::chrono::system_clock::now(); }))
    , m_sweep(std::move(sweep))
{
}

QString ZafTempStore::_srTempPath() const
{
    return m_directory;
}

QString ZafTempStore::entryPath(const QString &name) const
{
    // "%@/%@": the directory already ends in "/", so the path holds "//"; the kernel reads one.
    return m_directory + QLatin1Char('/') + name;
}

void ZafTempStore::_srSetupTempDirectory() const
{
    info(lcTempStore(), QStringLiteral("_srSetupTempDirectory"));
    if (m_fileManager.fileExistsAtPath(m_directory))
        return;
    if (zaf::OptionalError e = m_fileManager.createDirectoryAtPath(m_directory, false, kTempDirectoryMode)) {
        console(QStringLiteral("error: %1").arg(e->description()));
        error(lcTempStore(), QStringLiteral("error creating temp directory"));
    }
}

void ZafTempStore::prepareAtProcessStart() const
{
    QString parent = m_directory;
    while (parent.endsWith(QLatin1Char('/')) && parent.size() > 1)
        parent.chop(1);
    parent = parent.left(qMax(1, parent.lastIndexOf(QLatin1Char('/'))));
    if (!m_fileManager.fileExistsAtPath(parent)) {
        if (zaf::OptionalError e = m_fileManager.createDirectoryAtPath(parent, true, kTempDirectoryMode))
            error(lcTempStore(), QStringLiteral("cannot create %1: %2").arg(parent, e->description()));
    }
    _srSetupTempDirectory();
}

std::int64_t ZafTempStore::_srSizeOfTempDir(zaf::OptionalError *errorOut) const
{
    const zaf::Result<zaf::FileAttributes> attributes = m_fileManager.attributesOfItemAtPath(m_directory);
    if (errorOut)
        *errorOut = attributes.error;
    return attributes.ok() ? attributes.value->size : 0;
}

std::int64_t ZafTempStore::_srDeleteAllTempFiles() const
{
    const std::int64_t freed = _srDeleteFilesOlderThanTimeToLiveInSeconds(0.0);
    if (m_sweep)
        m_sweep();
    return freed;
}

void ZafTempStore::reportAgeCleanupError(const zaf::Error &e) const
{
    error(lcTempStore(),
          QStringLiteral("error in _zavRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: %1").arg(e.code));
    console(QStringLiteral("error = %1").arg(e.description()));
}

std::int64_t ZafTempStore::_srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive) const
{
    info(lcTempStore(), QStringLiteral("_srDeleteFilesOlderThanTimeToLiveInSeconds: %1").arg(toInt32(timeToLive)));

    const zaf::Result<QStringList> listing = m_fileManager.contentsOfDirectoryAtPath(m_directory);
    if (!listing.ok()) {
        reportAgeCleanupError(*listing.error);
        return 0;
    }

    const bool removeEverything = timeToLive == 0.0;
    std::int64_t total = 0;
    for (const QString &name : *listing.value) {
        const QString path = entryPath(name);
        const zaf::Result<zaf::FileAttributes> attributes = m_fileManager.attributesOfItemAtPath(path);
        std::int64_t size = 0;
        if (attributes.ok()) {
            size = attributes.value->size;
            const double age =
                std::chrono::duration<double>(m_clock() - attributes.value->modificationDate).count();
            if (!removeEverything && !(age > timeToLive))
                continue;
        } else {
            reportAgeCleanupError(*attributes.error);
            // An entry without attributes has no age to judge. Emptying the directory (a time to live
            // of 0.0) does not need one, so the removal is still attempted there; under any other
            // time to live the entry is left alone. Either way it adds no bytes.
            if (!removeEverything)
                continue;
        }
        info(lcTempStore(), QStringLiteral("deleting old file"));
        if (zaf::OptionalError e = m_fileManager.removeItemAtPath(path))
            reportAgeCleanupError(*e);
        else
            total += size;
    }
    return total;
}

void ZafTempStore::_srRemoveFile(const QUrl &fileURL, Completion completion) const
{
    const zaf::FileManager *fm = &m_fileManager;
    const QString path = fileURL.toLocalFile();
    zaf::dispatch::async(zaf::dispatch::Priority::Background, [fm, path, completion = std::move(completion)] {
        zaf::OptionalError result;
        if (!path.isEmpty() && fm->fileExistsAtPath(path)) {
            result = fm->removeItemAtPath(path);
            if (result)
                info(lcTempStore(), QStringLiteral("_zavRemoveFile error: %1").arg(result->code));
        }
        if (completion)
            completion(result);
    });
}

void ZafTempStore::_srMoveFileFromURL(const QUrl &source, const QUrl &destination, Completion completion) const
{
    const zaf::FileManager *fm = &m_fileManager;
    const QString from = source.toLocalFile(), to = destination.toLocalFile();
    zaf::dispatch::async(zaf::dispatch::Priority::Default, [fm, from, to, completion = std::move(completion)] {
        // The destination makes way only for a source that is there: with the source missing, the
        // move fails anyway, and clearing the destination first would lose a file for nothing.
        if (fm->fileExistsAtPath(to) && fm->fileExistsAtPath(from))
            fm->removeItemAtPath(to); // outcome ignored: the move reports what matters
        zaf::OptionalError result = fm->moveItemAtPath(from, to);
        if (result)
            error(lcTempStore(), QStringLiteral("_zavMoveFileFromURL error: %1").arg(result->code));
        if (completion)
            completion(result);
    });
}

void ZafTempStore::_srDeleteFilesWithPrefix(const QString &prefix) const
{
    const zaf::FileManager *fm = &m_fileManager;
    const QString directory = m_directory;
    zaf::dispatch::async(zaf::dispatch::Priority::Default, [fm, directory, prefix] {
        const zaf::Result<QStringList> listing = fm->contentsOfDirectoryAtPath(directory);
        if (!listing.ok())
            return;
        for (const QString &name : *listing.value) {
            if (!zaf::text::hasPrefixIgnoringCaseAndDiacritics(name, prefix))
                continue;
            if (zaf::OptionalError e = fm->removeItemAtPath(directory + QLatin1Char('/') + name))
                error(lcTempStore(), QStringLiteral("_zavDeleteFilesWithPrefix error: %1").arg(e->code));
        }
    });
}

bool ZafTempStore::_srDeviceHasSufficientFreeSpaceForRecording() const
{
    return _srDeviceFreeDiskSpace() > std::uint64_t(ZafScreenRecorderRequiredFreeSpace);
}

std::uint64_t ZafTempStore::_srDeviceFreeDiskSpace() const
{
    const zaf::Result<zaf::FileSystemAttributes> fs = m_fileManager.attributesOfFileSystemForPath(m_directory);
    return fs.ok() ? fs.value->freeSize : 0;
}
