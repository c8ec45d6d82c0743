// The store record's dictionary form: set properties become entries (empty strings too), unset ones
// and an empty category list do not, and categories are joined by commas.
#include "identity/store_info.h"

#include <gtest/gtest.h>

TEST(StoreInfoDictionaryTest, HoldsExactlyTheSetProperties)
{
    ZafStoreInfo info;
    EXPECT_TRUE(info.dictionary().isEmpty());

    info.setBundleID(QStringLiteral("org.zafrel.Recorder"));
    info.setAppName(QStringLiteral("Zafrel Recorder"));
    info.setAuthor(QStringLiteral("Zafrel Labs"));
    info.setItemURL(QStringLiteral("appstream://org.zafrel.Recorder"));
    info.setCategories(QStringList{QStringLiteral("A"), QStringLiteral("B")});
    const QVariantMap complete = info.dictionary();
    EXPECT_EQ(complete, (QVariantMap{{ZafStoreInfoBundleIDKey, QStringLiteral("org.zafrel.Recorder")},
                                     {ZafStoreInfoAppNameKey, QStringLiteral("Zafrel Recorder")},
                                     {ZafStoreInfoAuthorKey, QStringLiteral("Zafrel Labs")},
                                     {ZafStoreInfoItemURLKey, QStringLiteral("appstream://org.zafrel.Recorder")},
                                     {ZafStoreInfoCategoriesKey, QStringLiteral("A,B")}}));

    info.setCategories(QStringList{});
    EXPECT_EQ(info.dictionary().keys(),
              (QStringList{ZafStoreInfoAppNameKey, ZafStoreInfoAuthorKey, ZafStoreInfoBundleIDKey, ZafStoreInfoItemURLKey}));
    info.setCategories(std::nullopt);
    info.setAppName(std::nullopt);
    info.setAuthor(QStringLiteral(""));
    // The key names are read outside this system.
    EXPECT_EQ(info.dictionary().keys(), (QStringList{"ZafStoreInfoAuthorKey", "ZafStoreInfoBundleIDKey", "ZafStoreInfoItemURLKey"}));
    EXPECT_EQ(info.dictionary().value(ZafStoreInfoAuthorKey).toString(), QString());
}
