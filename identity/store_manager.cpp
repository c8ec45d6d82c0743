#include "identity/store_manager.h"

#include "identity/bundle_extensions.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/store/store_lookup.h"

#include <mutex>

ZafStoreManager &ZafStoreManager::sharedManager()
{
    static std::once_flag once;
    static ZafStoreManager *manager = nullptr;
    std::call_once(once, [] { manager = new ZafStoreManager(); });
    return *manager;
}

ZafStoreManager::ZafStoreManager(std::shared_ptr<zaf::store::Catalogue> catalogue)
    : m_catalogue(std::move(catalogue))
{
}

void ZafStoreManager::loadItemDetailsForBundleIdentifier(const QString &bundleIdentifier, Completion completion) const
{
    if (!completion) {
        zaf::log::error(zafStoreLog(), QStringLiteral("Store lookup for %1 made without a completion; not started")
                                           .arg(bundleIdentifier));
        return;
    }

    zaf::store::StoreLookup lookup(m_catalogue);
    lookup.setKeyProfile(zaf::store::KeyProfile::Product);
    lookup.setLocalizationStyle(zaf::store::kLocalizationStyleUser);
    lookup.setBundleIdentifiers({bundleIdentifier});

    // Runs on the lookup's worker thread. Whether the lookup failed is not looked at: no response
    // and no results both mean no item, and the record is filled from local knowledge.
    lookup.start([bundleIdentifier, completion = std::move(completion)](
                     const std::optional<zaf::store::Response> &response) mutable {
        std::optional<zaf::store::ResultItem> item;
        if (response && !response->results.isEmpty())
            item = response->results.first();

        ZafStoreInfo info;
        info.setItemURL(item && item->shortProductURL ? *item->shortProductURL : QStringLiteral(""));
        if (item && item->displayName)
            info.setAppName(*item->displayName);
        else
            info.setAppName(ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(bundleIdentifier));
        info.setAuthor(item && item->artistName ? *item->artistName : QStringLiteral(""));
        info.setCategories(item ? item->genreNames : std::nullopt);
        info.setBundleID(bundleIdentifier);

        zaf::dispatch::main([completion = std::move(completion), info = std::move(info)] { completion(info); });
    });
}
