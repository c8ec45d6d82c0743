#include "platform/store/store_lookup.h"

#include "platform/dispatch.h"
#include "platform/log.h"

#include <QDir>
#include <QFileInfo>
#include <QLocale>

#include <appstream.h>

Q_LOGGING_CATEGORY(zafStoreLog, "zaf.store")

namespace zaf::store {

namespace {

// The AppStream form of a language tag: "de-DE" -> "de_DE". An empty tag means the user's first
// preferred language.
QString posixLocale(const QString &locale)
{
    QString tag = locale;
    if (tag.isEmpty())
        tag = QLocale().uiLanguages().value(0, QStringLiteral("C"));
    tag.replace(QLatin1Char('-'), QLatin1Char('_'));
    return tag;
}

QString takeErrorMessage(GError *error)
{
    if (!error)
        return QStringLiteral("unknown error");
    const QString message = QString::fromUtf8(error->message);
    g_error_free(error);
    return message;
}

QString fromUtf8OrNothing(const gchar *text)
{
    return text ? QString::fromUtf8(text) : QString();
}

// Parses one collection file on its own so that a corrupt file can be named in the log: the pool
// itself skips such files without a word.
void reportUnreadableCollectionFile(const QString &path)
{
    AsMetadata *metadata = as_metadata_new();
    as_metadata_set_format_style(metadata, AS_FORMAT_STYLE_COLLECTION);
    GFile *file = g_file_new_for_path(QFile::encodeName(path).constData());
    GError *error = nullptr;
    if (!as_metadata_parse_file(metadata, file, AS_FORMAT_KIND_XML, &error)) {
        zaf::log::error(zafStoreLog(), QStringLiteral("Store catalogue file %1 is unreadable: %2")
                                           .arg(path, takeErrorMessage(error).trimmed()));
    }
    g_object_unref(file);
    g_object_unref(metadata);
}

} // namespace

struct Catalogue::Private {
    mutable std::mutex mutex;
    AsPool *pool = nullptr;
    bool loaded = false;
    QString locale;

    ~Private()
    {
        if (pool)
            g_object_unref(pool);
    }
};

Catalogue::Catalogue(std::unique_ptr<Private> d) : d(std::move(d)) {}

Catalogue::~Catalogue() = default;

std::shared_ptr<Catalogue> Catalogue::loadSystem(const QString &locale)
{
    auto d = std::make_unique<Private>();
    d->locale = posixLocale(locale);
    d->pool = as_pool_new();
    as_pool_set_locale(d->pool, d->locale.toUtf8().constData());
    GError *error = nullptr;
    d->loaded = as_pool_load(d->pool, nullptr, &error);
    if (!d->loaded) {
        zaf::log::error(zafStoreLog(), QStringLiteral("Cannot load the AppStream catalogue: %1")
                                           .arg(takeErrorMessage(error)));
    }
    return std::shared_ptr<Catalogue>(new Catalogue(std::move(d)));
}

std::shared_ptr<Catalogue> Catalogue::loadFromDirectory(const QString &directory, const QString &locale)
{
    auto d = std::make_unique<Private>();
    d->locale = posixLocale(locale);
    d->pool = as_pool_new();
    as_pool_set_locale(d->pool, d->locale.toUtf8().constData());
    as_pool_set_load_std_data_locations(d->pool, FALSE);

    const QFileInfo info(directory);
    const QDir dir(info.absoluteFilePath());
    if (!info.isDir() || !info.isReadable()) {
        zaf::log::error(zafStoreLog(), QStringLiteral("Store catalogue directory %1 is missing or unreadable")
                                           .arg(directory));
        return std::shared_ptr<Catalogue>(new Catalogue(std::move(d)));
    }
    const QStringList files = dir.entryList({QStringLiteral("*.xml"), QStringLiteral("*.xml.gz")},
                                            QDir::Files | QDir::Readable, QDir::Name);
    for (const QString &name : files)
        reportUnreadableCollectionFile(dir.filePath(name));
    for (const QString &name : dir.entryList(QDir::Files, QDir::Name)) {
        if (!files.contains(name) && (name.endsWith(QLatin1String(".xml")) || name.endsWith(QLatin1String(".xml.gz"))))
            zaf::log::error(zafStoreLog(), QStringLiteral("Store catalogue file %1 is unreadable: permission denied")
                                               .arg(dir.filePath(name)));
    }

    as_pool_add_extra_data_location(d->pool, QFile::encodeName(dir.path()).constData(), AS_FORMAT_STYLE_COLLECTION);
    // A directory's files may change between two loads within the same second (tests rewrite
    // their fixtures): never answer from an older cache of them.
    as_pool_set_flags(d->pool, static_cast<AsPoolFlags>(as_pool_get_flags(d->pool) | AS_POOL_FLAG_IGNORE_CACHE_AGE));
    GError *error = nullptr;
    d->loaded = as_pool_load(d->pool, nullptr, &error);
    if (!d->loaded) {
        zaf::log::error(zafStoreLog(), QStringLiteral("Cannot load the store catalogue in %1: %2")
                                           .arg(directory, takeErrorMessage(error)));
    }
    return std::shared_ptr<Catalogue>(new Catalogue(std::move(d)));
}

std::shared_ptr<Catalogue> Catalogue::shared()
{
    static std::once_flag once;
    static std::shared_ptr<Catalogue> catalogue;
    std::call_once(once, [] {
        const QString directory = qEnvironmentVariable(kCatalogDirEnvironmentVariable);
        if (!directory.isEmpty()) {
            zaf::log::notice(zafStoreLog(), QStringLiteral("Store catalogue loaded from %1 only").arg(directory));
            catalogue = loadFromDirectory(directory);
        } else {
            catalogue = loadSystem();
        }
    });
    return catalogue;
}

bool Catalogue::isLoaded() const
{
    std::lock_guard lock(d->mutex);
    return d->loaded;
}

QString Catalogue::locale() const
{
    std::lock_guard lock(d->mutex);
    return d->locale;
}

std::optional<ResultItem> Catalogue::itemForIdentifier(const QString &identifier) const
{
    if (identifier.isEmpty())
        return std::nullopt;
    std::lock_guard lock(d->mutex);
    if (!d->loaded)
        return std::nullopt;
    GPtrArray *components = as_pool_get_components_by_id(d->pool, identifier.toUtf8().constData());
    if (!components)
        return std::nullopt;
    std::optional<ResultItem> item;
    if (components->len > 0) {
        auto *component = static_cast<AsComponent *>(g_ptr_array_index(components, 0));
        ResultItem result;
        const QString id = fromUtf8OrNothing(as_component_get_id(component));
        result.shortProductURL = QStringLiteral("appstream://") + (id.isEmpty() ? identifier : id);
        if (const gchar *name = as_component_get_name(component))
            result.displayName = QString::fromUtf8(name);
        if (const gchar *developer = as_component_get_developer_name(component))
            result.artistName = QString::fromUtf8(developer);
        // A component without categories has no genre information at all, not an empty one.
        GPtrArray *categories = as_component_get_categories(component);
        if (categories && categories->len > 0) {
            QStringList genres;
            for (guint i = 0; i < categories->len; ++i)
                genres.append(fromUtf8OrNothing(static_cast<const gchar *>(g_ptr_array_index(categories, i))));
            result.genreNames = genres;
        }
        item = std::move(result);
    }
    g_ptr_array_unref(components);
    return item;
}

void StoreLookup::start(Callback callback) const
{
    zaf::dispatch::async(zaf::dispatch::Priority::Default,
        [catalogue = m_catalogue, profile = m_keyProfile, identifiers = m_bundleIdentifiers,
         callback = std::move(callback)]() mutable {
            if (profile != KeyProfile::Product || identifiers.isEmpty()) {
                callback(std::nullopt);
                return;
            }
            if (!catalogue)
                catalogue = Catalogue::shared();
            if (!catalogue || !catalogue->isLoaded()) {
                callback(std::nullopt);
                return;
            }
            Response response;
            for (const QString &identifier : identifiers) {
                if (std::optional<ResultItem> item = catalogue->itemForIdentifier(identifier))
                    response.results.append(std::move(*item));
            }
            callback(response);
        });
}

} // namespace zaf::store
