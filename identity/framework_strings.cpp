#include "identity/framework_strings.h"

#include "platform/install_layout.h"

#include <QFileInfo>

#include <atomic>

using zaf::bundle::Bundle;

namespace {

// The component's four tables, in lookup order.
const char *const kTables[] = {"PhotoLibraryDevice", "PhotoLibrary", "PhotoLibrarySupplement", "PhotoLibraryShared"};

// The remembered bundle. Filled without a lock: two first callers find the same bundle, and the
// shared pointer is swapped atomically.
std::shared_ptr<Bundle> g_componentBundle;

QString componentBundlePath()
{
    return zaf::install::dataPath("ZAF_PHOTO_LIBRARY_BUNDLE_PATH",
                                  QLatin1String(zaf::install::kStringTablesDir) + QStringLiteral("/ZafPhotoLibrary"),
                                  QStringLiteral(ZAF_PHOTO_LIBRARY_BUNDLE_DIR));
}

} // namespace

std::shared_ptr<Bundle> ZafPhotoLibraryFrameworkBundle()
{
    if (std::shared_ptr<Bundle> found = std::atomic_load(&g_componentBundle))
        return found;
    std::shared_ptr<Bundle> bundle = Bundle::bundleWithPath(componentBundlePath());
    std::atomic_store(&g_componentBundle, bundle);
    return bundle;
}

std::optional<QString> ZafLocalizedFrameworkString(const QString &key)
{
    std::optional<QString> result;
    for (const char *table : kTables) {
        const std::shared_ptr<Bundle> bundle = ZafPhotoLibraryFrameworkBundle();
        if (!bundle)
            return std::nullopt;
        result = bundle->localizedStringForKey(key, QStringLiteral(""), QLatin1String(table));
        if (*result != key)
            break;
    }
    return result;
}
