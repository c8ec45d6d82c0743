// zaf-tempstore: shows and tidies the editors' temporary directories.
//
//   zaf-tempstore [status]   the per-user root, its free space, and each editor's directory there:
//                            in use by a running editor, or left by one that has ended
//   zaf-tempstore clean      remove what editors that have ended left behind (never the directory
//                            of a running editor)
#include "platform/files/file_manager.h"
#include "platform/log.h"
#include "tempstore/process_directory.h"
#include "tempstore/temp_directory.h"

#include <QCoreApplication>
#include <QDirIterator>

#include <cstdio>

using zaf::tempstore::ProcessDirectory;

namespace {

int usage()
{
    std::fprintf(stderr, "usage: zaf-tempstore [status | clean]\n");
    return 2;
}

// Bytes in the regular files below a directory (or of the file itself).
qint64 bytesBelow(const QString &path)
{
    const QFileInfo info(path);
    if (!info.isDir())
        return info.size();
    qint64 total = 0;
    QDirIterator it(path, QDir::Files | QDir::Hidden | QDir::System, QDirIterator::Subdirectories);
    while (it.hasNext()) {
        it.next();
        total += it.fileInfo().size();
    }
    return total;
}

int status(const QString &root)
{
    const zaf::FileManager &fm = zaf::FileManager::defaultManager();
    std::printf("root:        %s\n", qPrintable(root));
    const auto fs = fm.attributesOfFileSystemForPath(root);
    std::printf("free space:  %llu bytes (%s for a recording)\n", static_cast<unsigned long long>(fs.ok() ? fs.value->freeSize : 0),
                fs.ok() && fs.value->freeSize > std::uint64_t(ZafScreenRecorderRequiredFreeSpace) ? "enough" : "not enough");
    const zaf::Result<QStringList> entries = fm.contentsOfDirectoryAtPath(root);
    if (!entries.ok()) {
        std::printf("state:       %s\n", qPrintable(entries.error->message));
        return 0;
    }
    std::printf("entries:     %lld\n", static_cast<long long>(entries.value->size()));
    for (const QString &name : *entries.value) {
        const QString path = root + name;
        const char *state = !QFileInfo(path).isDir()           ? "loose file"
                            : ProcessDirectory::isHeldByLivingProcess(path) ? "in use"
                                                                            : "left by an editor that has ended";
        std::printf("  %12lld  %s  (%s)\n", static_cast<long long>(bytesBelow(path)), qPrintable(name), state);
    }
    return 0;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    const QStringList args = app.arguments().mid(1);
    const QString root = zaf::tempstore::perUserTempRoot();

    if (args.isEmpty() || args == QStringList{QStringLiteral("status")})
        return status(root);
    if (args == QStringList{QStringLiteral("clean")}) {
        std::printf("removed %d entries\n", ProcessDirectory::sweepAbandoned(zaf::FileManager::defaultManager(), root));
        return 0;
    }
    return usage();
}
