#pragma once

// The store lookup role: application details by bundle identifier, answered from the AppStream
// catalogue.
//
// A request names the identifiers it asks about (AppStream component IDs, reverse-DNS like desktop
// file IDs), a key profile and a localization style, and is started with a callback. start()
// returns at once; the callback runs exactly once on a thread of the default global queue (never
// the main thread) with the response, or with none when the request cannot be answered at all
// (no catalogue, an identifier list that is empty, a key profile other than the product one).
// A response holds one result item per identifier found, in the order asked; identifiers the
// catalogue does not know have no item.
//
// Each item carries, when the catalogue has them: the short product URL ("appstream://ID", which
// software centres open on the application's page), the display name (the component's name in the
// catalogue's locale), the artist name (the developer name) and the genre names (the categories).
//
// The catalogue behind the requests is loaded once per process, on the first request's worker
// thread: from the system's AppStream locations, or, when ZAF_APPSTREAM_CATALOG_DIR is set at that
// moment, from the collection files in that directory only. A catalogue that cannot be read, or a
// collection file in it that is corrupt, is logged in the "zaf.store" category; what cannot be read
// yields no items.

#include <QList>
#include <QLoggingCategory>
#include <QString>
#include <QStringList>

#include <functional>
#include <memory>
#include <mutex>
#include <optional>

Q_DECLARE_LOGGING_CATEGORY(zafStoreLog)

namespace zaf::store {

enum class KeyProfile { None, Product };

// Localization style 1: texts in the catalogue's locale, which follows the user's languages. The
// catalogue holds one locale, so every other style is answered the same way.
inline constexpr int kLocalizationStyleUser = 1;

// The environment variable that points the process-wide catalogue at a directory of collection
// files (tests); read once, when the catalogue is first loaded.
inline constexpr const char *kCatalogDirEnvironmentVariable = "ZAF_APPSTREAM_CATALOG_DIR";

struct ResultItem {
    std::optional<QString> shortProductURL;
    std::optional<QString> displayName;
    std::optional<QString> artistName;
    std::optional<QStringList> genreNames;
};

struct Response {
    QList<ResultItem> results;
};

// A loaded AppStream catalogue. Loading blocks; queries are serialised and callable from any thread.
class Catalogue {
public:
    // The system's catalogue (the standard AppStream locations), in the given locale ("" = the
    // user's first preferred language).
    static std::shared_ptr<Catalogue> loadSystem(const QString &locale = {});
    // Only the collection files (*.xml, *.xml.gz) of one directory. Corrupt files are logged and
    // left out; a missing or unreadable directory is logged and gives an empty catalogue.
    static std::shared_ptr<Catalogue> loadFromDirectory(const QString &directory, const QString &locale = {});
    // The process-wide catalogue, loaded by the first caller (see the header comment). Blocks that
    // caller; call it from a worker thread.
    static std::shared_ptr<Catalogue> shared();

    ~Catalogue();
    Catalogue(const Catalogue &) = delete;
    Catalogue &operator=(const Catalogue &) = delete;

    // Whether the pool loaded; false after a load error (already logged).
    bool isLoaded() const;
    // The locale the catalogue answers in, in POSIX form ("de_DE").
    QString locale() const;
    // The item for one component ID, or none when the catalogue has no such component.
    std::optional<ResultItem> itemForIdentifier(const QString &identifier) const;

private:
    struct Private;
    explicit Catalogue(std::unique_ptr<Private> d);
    std::unique_ptr<Private> d;
};

class StoreLookup {
public:
    using Callback = std::function<void(const std::optional<Response> &response)>;

    // A request answered from the process-wide catalogue.
    StoreLookup() = default;
    // A request answered from a given catalogue (tests, or a caller that owns one).
    explicit StoreLookup(std::shared_ptr<Catalogue> catalogue) : m_catalogue(std::move(catalogue)) {}

    void setKeyProfile(KeyProfile profile) { m_keyProfile = profile; }
    KeyProfile keyProfile() const { return m_keyProfile; }
    void setLocalizationStyle(int style) { m_localizationStyle = style; }
    int localizationStyle() const { return m_localizationStyle; }
    void setBundleIdentifiers(const QStringList &identifiers) { m_bundleIdentifiers = identifiers; }
    QStringList bundleIdentifiers() const { return m_bundleIdentifiers; }

    // Answers the request on the default global queue and calls `callback` there, exactly once.
    // The request's parameters are copied at this point; the object may go away right after.
    void start(Callback callback) const;

private:
    std::shared_ptr<Catalogue> m_catalogue;
    KeyProfile m_keyProfile = KeyProfile::None;
    int m_localizationStyle = 0;
    QStringList m_bundleIdentifiers;
};

} // namespace zaf::store
