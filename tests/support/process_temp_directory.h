#pragma once

// The editor's temporary directory is resolved once per process; test programs give the whole
// process one private directory, made ready as the extension does at start.

#include "tempstore/temp_store.h"

#include <QFile>
#include <QTemporaryDir>

namespace zaf::test {

inline void usePrivateTempDirectoryForProcess()
{
    static QTemporaryDir root;
    static const bool prepared = [] {
        qputenv("ZAF_TEMP_DIRECTORY", QFile::encodeName(root.path() + QStringLiteral("/Zafrel")));
        ZafTempStore::defaultStore().prepareAtProcessStart();
        return true;
    }();
    (void)prepared;
}

} // namespace zaf::test
