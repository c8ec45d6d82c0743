// The publishing texts: four tables of the photo-library component, tried in order.
#include "identity/framework_strings.h"
#include "tests/identity/identity_test_support.h"

namespace zaf::test {
namespace {

TEST(FrameworkStrings, TablesAreTriedInOrderAndATextEqualToItsKeyIsMissing)
{
    ScratchDir scratch;
    const QString component = scratch.file(QStringLiteral("ZafPhotoLibrary"));
    qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", QFile::encodeName(component));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("en")});
    writeTable(component, QStringLiteral("en"), QStringLiteral("PhotoLibraryDevice"),
               {{QStringLiteral("A"), QStringLiteral("device A")}, {QStringLiteral("D"), QStringLiteral("D")}});
    writeTable(component, QStringLiteral("en"), QStringLiteral("PhotoLibrary"),
               {{QStringLiteral("A"), QStringLiteral("main A")}, {QStringLiteral("D"), QStringLiteral("main D")}});
    writeTable(component, QStringLiteral("en"), QStringLiteral("PhotoLibrarySupplement"), {});
    writeTable(component, QStringLiteral("en"), QStringLiteral("PhotoLibraryShared"), {{QStringLiteral("B"), QStringLiteral("last B")}});

    EXPECT_EQ(ZafLocalizedFrameworkString(QStringLiteral("A")), QStringLiteral("device A"));
    EXPECT_EQ(ZafLocalizedFrameworkString(QStringLiteral("B")), QStringLiteral("last B"));
    EXPECT_EQ(ZafLocalizedFrameworkString(QStringLiteral("C")), QStringLiteral("C"));
    EXPECT_EQ(ZafLocalizedFrameworkString(QStringLiteral("D")), QStringLiteral("main D"));
}

TEST(FrameworkStrings, MissingComponentAnswersNothing)
{
    ScratchDir scratch;
    qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", QFile::encodeName(scratch.file(QStringLiteral("absent"))));
    EXPECT_FALSE(ZafPhotoLibraryFrameworkBundle());
    EXPECT_FALSE(ZafLocalizedFrameworkString(QStringLiteral("CLOSE")).has_value());
}

class ShippedFrameworkStrings : public ::testing::TestWithParam<const char *> {};

TEST_P(ShippedFrameworkStrings, HaveEveryPublishingText)
{
    qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", ZAF_SHIPPED_PHOTO_LIBRARY_BUNDLE);
    bundle::setPreferredLanguagesForTesting({QString::fromLatin1(GetParam())});
    for (const char *key : {"PUBLISHED_VIDEO", "VIEW_BUTTON_TITLE_FORMAT", "FAILED_PUBLISH_VIDEO", "CLOSE"}) {
        const std::optional<QString> text = ZafLocalizedFrameworkString(QString::fromLatin1(key));
        ASSERT_TRUE(text.has_value());
        EXPECT_NE(*text, QString::fromLatin1(key)) << "lacks " << key;
    }
}

INSTANTIATE_TEST_SUITE_P(Languages, ShippedFrameworkStrings, kShippedLanguages, languageName);

} // namespace
} // namespace zaf::test
