// The store record's dictionary form.
#include "identity/store_info.h"

#include <gtest/gtest.h>

namespace {

ZafStoreInfo completeRecord()
{
    ZafStoreInfo info;
    info.setBundleID(QStringLiteral("org.zafrel.Recorder"));
    info.setAppName(QStringLiteral("Zafrel Recorder"));
    info.setAuthor(QStringLiteral("Zafrel Labs"));
    info.setItemURL(QStringLiteral("appstream://org.zafrel.Recorder"));
    info.setCategories(QStringList{QStringLiteral("A"), QStringLiteral("B")});
    return info;
}

} // namespace

TEST(StoreInfoDictionaryTest, ExportedKeys_AreTheirOwnNames)
{
    EXPECT_STREQ(ZafStoreInfoBundleIDKey, "ZafStoreInfoBundleIDKey");
    EXPECT_STREQ(ZafStoreInfoAppNameKey, "ZafStoreInfoAppNameKey");
    EXPECT_STREQ(ZafStoreInfoAuthorKey, "ZafStoreInfoAuthorKey");
    EXPECT_STREQ(ZafStoreInfoItemURLKey, "ZafStoreInfoItemURLKey");
    EXPECT_STREQ(ZafStoreInfoCategoriesKey, "ZafStoreInfoCategoriesKey");
}

TEST(StoreInfoDictionaryTest, Dictionary_EveryPropertySet_HasFiveEntriesWithCategoriesJoinedByComma)
{
    const QVariantMap dictionary = completeRecord().dictionary();
    EXPECT_EQ(dictionary.size(), 5);
    EXPECT_EQ(dictionary.value(ZafStoreInfoBundleIDKey).toString(), QStringLiteral("org.zafrel.Recorder"));
    EXPECT_EQ(dictionary.value(ZafStoreInfoAppNameKey).toString(), QStringLiteral("Zafrel Recorder"));
    EXPECT_EQ(dictionary.value(ZafStoreInfoAuthorKey).toString(), QStringLiteral("Zafrel Labs"));
    EXPECT_EQ(dictionary.value(ZafStoreInfoItemURLKey).toString(), QStringLiteral("appstream://org.zafrel.Recorder"));
    EXPECT_EQ(dictionary.value(ZafStoreInfoCategoriesKey).toString(), QStringLiteral("A,B"));
}

TEST(StoreInfoDictionaryTest, Dictionary_EmptyCategoryList_HasNoCategoriesKey)
{
    ZafStoreInfo info = completeRecord();
    info.setCategories(QStringList{});
    const QVariantMap dictionary = info.dictionary();
    EXPECT_FALSE(dictionary.contains(ZafStoreInfoCategoriesKey));
    EXPECT_EQ(dictionary.size(), 4);
}

TEST(StoreInfoDictionaryTest, Dictionary_EmptyStrings_AreKeptAsEntries)
{
    ZafStoreInfo info;
    info.setBundleID(QStringLiteral(""));
    info.setAuthor(QStringLiteral(""));
    info.setItemURL(QStringLiteral(""));
    const QVariantMap dictionary = info.dictionary();
    EXPECT_EQ(dictionary.size(), 3);
    ASSERT_TRUE(dictionary.contains(ZafStoreInfoAuthorKey));
    EXPECT_EQ(dictionary.value(ZafStoreInfoAuthorKey).toString(), QString());
    EXPECT_TRUE(dictionary.contains(ZafStoreInfoItemURLKey));
    EXPECT_TRUE(dictionary.contains(ZafStoreInfoBundleIDKey));
}

TEST(StoreInfoDictionaryTest, Dictionary_UnsetProperties_HaveNoEntries)
{
    EXPECT_TRUE(ZafStoreInfo().dictionary().isEmpty());

    ZafStoreInfo info = completeRecord();
    info.setAppName(std::nullopt);
    info.setCategories(std::nullopt);
    const QVariantMap dictionary = info.dictionary();
    EXPECT_FALSE(dictionary.contains(ZafStoreInfoAppNameKey));
    EXPECT_FALSE(dictionary.contains(ZafStoreInfoCategoriesKey));
    EXPECT_EQ(dictionary.size(), 3);
}

