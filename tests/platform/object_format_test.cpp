#include "platform/text/object_format.h"

#include <gtest/gtest.h>

namespace zaf::text {
namespace {

TEST(ObjectFormat, FillsSequentialAndPositionalObjectsAndKeepsOtherText)
{
    const QStringList args{QStringLiteral("Recorder"), QStringLiteral("Zafrel")};
    EXPECT_EQ(formatWithObjects(QStringLiteral("Recorded with %@ by %@"), args), QStringLiteral("Recorded with Recorder by Zafrel"));
    EXPECT_EQ(formatWithObjects(QString::fromUtf8("%2$@ \xE3\x81\xAE %1$@"), args), QString::fromUtf8("Zafrel \xE3\x81\xAE Recorder"));
    EXPECT_EQ(formatWithObjects(QStringLiteral("100%% of %@"), args), QStringLiteral("100% of Recorder"));
    EXPECT_EQ(formatWithObjects(QStringLiteral("%@ %@ %@"), args), QStringLiteral("Recorder Zafrel "));
    EXPECT_EQ(formatWithObjects(QStringLiteral("%3$@|%0$@|%d|50%"), args), QStringLiteral("||%d|50%"));
}

} // namespace
} // namespace zaf::text
