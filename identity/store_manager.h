#pragma once

// Looks up an application in the application store and hands back its record.
//
// Threads: loadItemDetailsForBundleIdentifier() may be called from any thread and returns at once.
// The store answers on a worker thread, where the record is built; the completion is then queued on
// the main thread and runs there exactly once, on a later pass of the event loop, whatever the
// store answered (also when the lookup fails at once). Lookups are independent of each other.
//
// The lookup never fails towards the caller: without a store item the record holds the identifier
// asked for, the local application name (or none), an empty author and item URL, no categories.

#include "identity/store_info.h"

#include <QString>

#include <functional>
#include <memory>

namespace zaf::store {
class Catalogue;
}

class ZafStoreManager {
public:
    using Completion = std::function<void(const ZafStoreInfo &info)>;

    // The process-wide manager, made on first use; it answers from the process-wide catalogue.
    static ZafStoreManager &sharedManager();

    // A manager answering from a catalogue of the caller's (none: the process-wide catalogue).
    explicit ZafStoreManager(std::shared_ptr<zaf::store::Catalogue> catalogue = {});

    // Asks the store about one application. `completion` is required; an empty one is logged and
    // the lookup is not made.
    void loadItemDetailsForBundleIdentifier(const QString &bundleIdentifier, Completion completion) const;

private:
    std::shared_ptr<zaf::store::Catalogue> m_catalogue;
};
