// zaf-tempstore: shows and tidies the editor's temporary directory.
//
//   zaf-tempstore [status]             path, size of the directory entry, free space, entries
//   zaf-tempstore setup                create the directory (mode 0700) if it is missing
//   zaf-tempstore clean [--older-than SECONDS]   remove entries (all of them by default)
//   zaf-tempstore clean --prefix TEXT  remove entries whose names begin with TEXT (any case, accents)
#include "platform/dispatch.h"
#include "platform/files/file_manager.h"
#include "platform/log.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QCoreApplication>
#include <QThreadPool>

#include <cstdio>

namespace {

int usage()
{
    std::fprintf(stderr, "usage: zaf-tempstore [status | setup | clean [--older-than SECONDS | --prefix TEXT]]\n");
    return 2;
}

int status(const ZafTempStore &store)
{
    const zaf::FileManager &fm = zaf::FileManager::defaultManager();
    std::printf("directory:   %s\n", qPrintable(store._srTempPath()));
    zaf::OptionalError error;
    const std::int64_t size = store._srSizeOfTempDir(&error);
    if (error)
        std::printf("state:       %s\n", qPrintable(error->message));
    else
        std::printf("entry size:  %lld bytes\n", static_cast<long long>(size));
    std::printf("free space:  %llu bytes (%s for a recording)\n",
                static_cast<unsigned long long>(store._srDeviceFreeDiskSpace()),
                store._srDeviceHasSufficientFreeSpaceForRecording() ? "enough" : "not enough");
    const zaf::Result<QStringList> entries = fm.contentsOfDirectoryAtPath(store._srTempPath());
    if (entries.ok()) {
        std::printf("entries:     %lld\n", static_cast<long long>(entries.value->size()));
        for (const QString &name : *entries.value) {
            const auto attrs = fm.attributesOfItemAtPath(store._srTempPath() + name);
            std::printf("  %12lld  %s\n", static_cast<long long>(attrs.ok() ? attrs.value->size : 0), qPrintable(name));
        }
    }
    return 0;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    const QStringList args = app.arguments().mid(1);
    const ZafTempStore &store = ZafTempStore::defaultStore();

    if (args.isEmpty() || args == QStringList{QStringLiteral("status")})
        return status(store);
    if (args == QStringList{QStringLiteral("setup")}) {
        store.prepareAtProcessStart();
        return zaf::FileManager::defaultManager().fileExistsAtPath(store._srTempPath()) ? 0 : 1;
    }
    if (args.first() != QLatin1String("clean"))
        return usage();
    if (args.size() == 1) {
        std::printf("freed %lld bytes\n", static_cast<long long>(store._srDeleteAllTempFiles()));
        return 0;
    }
    if (args.size() == 3 && args[1] == QLatin1String("--older-than")) {
        bool ok = false;
        const double ttl = args[2].toDouble(&ok);
        if (!ok || ttl < 0)
            return usage();
        std::printf("freed %lld bytes\n",
                    static_cast<long long>(store._srDeleteFilesOlderThanTimeToLiveInSeconds(ttl)));
        return 0;
    }
    if (args.size() == 3 && args[1] == QLatin1String("--prefix")) {
        store._srDeleteFilesWithPrefix(args[2]);
        zaf::dispatch::waitForGlobalQueue(zaf::dispatch::Priority::Default);
        return 0;
    }
    return usage();
}
