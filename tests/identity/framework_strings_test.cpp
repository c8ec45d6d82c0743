// The publishing texts (four tables of the photo-library component, tried in order), and the
// shipped string tables.
#include "identity/bundle_extensions.h"
#include "identity/framework_strings.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <gtest/gtest.h>

namespace zaf::test {
namespace {

TEST(FrameworkStrings, TablesAreTriedInOrderAndATextEqualToItsKeyIsMissing)
{
    ScratchDir scratch;
    const QString component = scratch.file(QStringLiteral("ZafPhotoLibrary"));
    qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", QFile::encodeName(component));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("en")});
    bundle::test::writeTable(component, "en", "PhotoLibraryDevice", {{"A", "device A"}, {"D", "D"}});
    bundle::test::writeTable(component, "en", "PhotoLibrary", {{"A", "main A"}, {"D", "main D"}});
    bundle::test::writeTable(component, "en", "PhotoLibrarySupplement", {});
    bundle::test::writeTable(component, "en", "PhotoLibraryShared", {{"B", "last B"}});

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

class ShippedStrings : public ::testing::TestWithParam<const char *> {};

// In every shipped language: every publishing text, and a share text taking the name and the author.
TEST_P(ShippedStrings, HaveEveryPublishingTextAndTheShareText)
{
    qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", ZAF_SHIPPED_PHOTO_LIBRARY_BUNDLE);
    qputenv("ZAF_FRAMEWORK_BUNDLE_PATH", ZAF_SHIPPED_FRAMEWORK_BUNDLE);
    bundle::setPreferredLanguagesForTesting({QString::fromLatin1(GetParam())});
    for (const char *key : {"PUBLISHED_VIDEO", "VIEW_BUTTON_TITLE_FORMAT", "FAILED_PUBLISH_VIDEO", "CLOSE"})
        EXPECT_NE(ZafLocalizedFrameworkString(QString::fromLatin1(key)).value_or(QString::fromLatin1(key)), QString::fromLatin1(key));
    const QString format =
        ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("SHARE_TEXT_FORMAT")).value_or(QString());
    EXPECT_TRUE(format.contains(QStringLiteral("%1$@")) && format.contains(QStringLiteral("%2$@"))) << format.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Languages, ShippedStrings, ::testing::Values("en", "de", "fr", "es", "ja"),
                         [](const auto &info) { return std::string(info.param); });

} // namespace
} // namespace zaf::test
