// Attachments: the types they conform to, what their loads deliver and on which thread, and the
// colour strings (alpha last).

#include "platform/dispatch.h"
#include "platform/extensionkit/input_item.h"
#include "tests/support/named_cases.h"

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonObject>
#include <QThread>

#include <gtest/gtest.h>

#include <condition_variable>
#include <memory>
#include <mutex>

using namespace zaf::extensionkit;
using zaf::test::caseName;

ZAF_PRINT_CASES_AS_NAMES

namespace {

// The outcomes of loads, which may end on any thread. Standard locking rather than QSemaphore,
// whose hand-over ThreadSanitizer cannot see.
struct Loads : std::enable_shared_from_this<Loads> {
    std::mutex mutex;
    std::condition_variable arrived;
    QList<std::pair<QVariant, zaf::OptionalError>> outcomes;
    bool offMainThread = true;

    void load(const ItemAttachment &attachment, const QString &type)
    {
        attachment.loadItemForTypeIdentifier(type, {}, [self = shared_from_this()](const QVariant &value, const zaf::OptionalError &error) {
            std::lock_guard lock(self->mutex);
            self->outcomes.append({value, error});
            self->offMainThread &= QThread::currentThread() != QCoreApplication::instance()->thread();
            self->arrived.notify_all();
        });
    }
    bool waitFor(int count)
    {
        std::unique_lock lock(mutex);
        return arrived.wait_for(lock, std::chrono::seconds(10), [&] { return outcomes.size() == count; });
    }
};

} // namespace

class ColorFromHexStringTest : public ::testing::TestWithParam<std::pair<const char *, QColor>> {};

TEST_P(ColorFromHexStringTest, ReadsAlphaLast)
{
    EXPECT_EQ(colorFromHexString(GetParam().first), GetParam().second);
}

INSTANTIATE_TEST_SUITE_P(Forms, ColorFromHexStringTest, ::testing::Values(
    std::pair("#102030", QColor(0x10, 0x20, 0x30, 0xff)), std::pair("#10203040", QColor(0x10, 0x20, 0x30, 0x40)),
    std::pair("#aBcDeF80", QColor(0xab, 0xcd, 0xef, 0x80)), std::pair("#FF000000", QColor(0xff, 0, 0, 0))));

class BadHexColorTest : public ::testing::TestWithParam<const char *> {};

TEST_P(BadHexColorTest, IsNoColor)
{
    EXPECT_FALSE(colorFromHexString(QString::fromLatin1(GetParam())).isValid());
}

INSTANTIATE_TEST_SUITE_P(Strings, BadHexColorTest, ::testing::Values(
    "", "#", "102030", "#12345", "#1234567", "#123456789", "#12345g", "#1020304x", " #102030", "#102030 ", "red", "##10203"));

// An attachment of a MIME type conforms to that type (case and parameters aside) and to the generic
// data type, and to nothing else.
struct Conformance { const char *name; const char *type; const char *asked; bool conforms; };

class ItemAttachmentConformanceTest : public ::testing::TestWithParam<Conformance> {};

TEST_P(ItemAttachmentConformanceTest, FollowsTheMimeType)
{
    EXPECT_EQ(ItemAttachment(GetParam().type, "v").hasItemConformingToTypeIdentifier(GetParam().asked), GetParam().conforms);
}

INSTANTIATE_TEST_SUITE_P(Types, ItemAttachmentConformanceTest, ::testing::Values(
    Conformance{"GenericData", "text/plain", kTypeIdentifierData, true},
    Conformance{"ItsOwnType", "text/plain", "text/plain", true},
    Conformance{"OwnTypeInOtherCaseWithParameters", "text/plain", "TEXT/Plain; charset=utf-8", true},
    Conformance{"OwnTypeWithoutItsParameters", "text/plain;charset=utf-8", "text/plain", true},
    Conformance{"AnotherType", "text/plain", "text/html", false},
    Conformance{"TheColorType", "text/plain", kTypeIdentifierColor, false},
    Conformance{"NoType", "text/plain", "not a type", false}), caseName);

class NoMimeTypeTest : public ::testing::TestWithParam<const char *> {};

TEST_P(NoMimeTypeTest, ConformsToNothing)
{
    const ItemAttachment attachment(QString::fromLatin1(GetParam()), "v");
    EXPECT_FALSE(isMimeType(QString::fromLatin1(GetParam())));
    EXPECT_FALSE(attachment.hasItemConformingToTypeIdentifier(kTypeIdentifierData));
    EXPECT_FALSE(attachment.hasItemConformingToTypeIdentifier(QString::fromLatin1(GetParam())));
}

INSTANTIATE_TEST_SUITE_P(Strings, NoMimeTypeTest, ::testing::Values(
    "", "text", "text/", "/plain", "text/plain/extra", "te xt/plain", "public.data", "*/*", "text/pl ain"));

// A load ends off the calling thread, on a global queue's, with the value or with an error code.
struct Load {
    const char *name;
    ItemAttachment attachment;
    const char *type;
    QVariant expected; // invalid: the load fails with `code`
    int code = 0;
};

class ItemAttachmentLoadTest : public ::testing::TestWithParam<Load> {};

TEST_P(ItemAttachmentLoadTest, EndsOnAGlobalQueueThread)
{
    const auto loads = std::make_shared<Loads>();
    loads->load(GetParam().attachment, GetParam().type);
    ASSERT_TRUE(loads->waitFor(1)) << "the load handler never ran";
    EXPECT_TRUE(loads->offMainThread);
    const auto &[value, error] = loads->outcomes[0];
    EXPECT_EQ(value.metaType(), GetParam().expected.metaType());
    EXPECT_EQ(value, GetParam().expected);
    EXPECT_EQ(error.value_or(zaf::Error{}).code, GetParam().code);
    EXPECT_EQ(error.value_or(zaf::Error{kItemAttachmentErrorDomain, 0, {}}).domain, QString::fromLatin1(kItemAttachmentErrorDomain));
}

const ItemAttachment kColour(kTypeIdentifierColor, "#11223380");
const QJsonValue kNull(QJsonValue::Null), kUndefined(QJsonValue::Undefined);

INSTANTIATE_TEST_SUITE_P(Values, ItemAttachmentLoadTest, ::testing::Values(
    Load{"String", ItemAttachment("application/json", "/home/me/rec.mp4"), kTypeIdentifierData, QString("/home/me/rec.mp4")},
    Load{"Number", ItemAttachment("application/json", 2.5), kTypeIdentifierData, 2.5},
    Load{"Boolean", ItemAttachment("application/json", true), kTypeIdentifierData, true},
    Load{"Array", ItemAttachment("application/json", QJsonArray{1, "a"}), kTypeIdentifierData, QVariantList{1.0, QString("a")}},
    Load{"Object", ItemAttachment("application/json", QJsonObject{{"k", "v"}}), kTypeIdentifierData, QVariantMap{{"k", QString("v")}}},
    Load{"ColourAsData", kColour, kTypeIdentifierData, QColor(0x11, 0x22, 0x33, 0x80)},
    Load{"ColourAsColour", kColour, kTypeIdentifierColor, QColor(0x11, 0x22, 0x33, 0x80)},
    Load{"AnotherType", ItemAttachment("text/plain", "x"), "image/png", {}, ItemAttachmentErrorTypeMismatch},
    Load{"NoType", ItemAttachment("", "x"), kTypeIdentifierData, {}, ItemAttachmentErrorTypeMismatch},
    Load{"Null", ItemAttachment("text/plain", kNull), kTypeIdentifierData, {}, ItemAttachmentErrorBadValue},
    Load{"Undefined", ItemAttachment("text/plain", kUndefined), kTypeIdentifierData, {}, ItemAttachmentErrorBadValue},
    Load{"ColourName", ItemAttachment(kTypeIdentifierColor, "blue"), kTypeIdentifierData, {}, ItemAttachmentErrorBadValue},
    Load{"ColourNumber", ItemAttachment(kTypeIdentifierColor, 255), kTypeIdentifierColor, {}, ItemAttachmentErrorBadValue}), caseName);

TEST(ItemAttachment, ManyConcurrentLoadsFromWorkerThreadsAllComplete)
{
    const auto loads = std::make_shared<Loads>();
    const auto attachment = std::make_shared<ItemAttachment>("text/plain", "value");
    constexpr int kLoads = 64;
    for (int i = 0; i < kLoads; ++i)
        zaf::dispatch::async(zaf::dispatch::Priority::Background, [loads, attachment] { loads->load(*attachment, kTypeIdentifierData); });
    ASSERT_TRUE(loads->waitFor(kLoads));
    std::lock_guard lock(loads->mutex);
    for (const auto &[value, error] : loads->outcomes)
        EXPECT_TRUE(!error && value.toString() == "value");
}
