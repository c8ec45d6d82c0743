#pragma once

// The store record of an application: what the application store says about it, as the share text
// needs it. A plain value; every property can be set, and can also be left unset, which is not the
// same as an empty string: the dictionary form carries an entry only for a property that is set.

#include <QString>
#include <QStringList>
#include <QVariantMap>

#include <optional>

// The keys of the dictionary form, exported for consumers outside this system.
inline constexpr const char *ZafStoreInfoBundleIDKey = "ZafStoreInfoBundleIDKey";
inline constexpr const char *ZafStoreInfoAppNameKey = "ZafStoreInfoAppNameKey";
inline constexpr const char *ZafStoreInfoAuthorKey = "ZafStoreInfoAuthorKey";
inline constexpr const char *ZafStoreInfoItemURLKey = "ZafStoreInfoItemURLKey";
inline constexpr const char *ZafStoreInfoCategoriesKey = "ZafStoreInfoCategoriesKey";

class ZafStoreInfo {
public:
    // The bundle identifier that was looked up.
    const std::optional<QString> &bundleID() const { return m_bundleID; }
    void setBundleID(std::optional<QString> value) { m_bundleID = std::move(value); }
    // The application's display name.
    const std::optional<QString> &appName() const { return m_appName; }
    void setAppName(std::optional<QString> value) { m_appName = std::move(value); }
    // The author (artist) name the store shows.
    const std::optional<QString> &author() const { return m_author; }
    void setAuthor(std::optional<QString> value) { m_author = std::move(value); }
    // The short link to the application's store page.
    const std::optional<QString> &itemURL() const { return m_itemURL; }
    void setItemURL(std::optional<QString> value) { m_itemURL = std::move(value); }
    // The store's genre names for the application.
    const std::optional<QStringList> &categories() const { return m_categories; }
    void setCategories(std::optional<QStringList> value) { m_categories = std::move(value); }

    // A new map with an entry per set property under the keys above; empty strings are entries
    // too. The categories are joined with "," and only present when there is at least one.
    QVariantMap dictionary() const;

private:
    std::optional<QString> m_bundleID;
    std::optional<QString> m_appName;
    std::optional<QString> m_author;
    std::optional<QString> m_itemURL;
    std::optional<QStringList> m_categories;
};
