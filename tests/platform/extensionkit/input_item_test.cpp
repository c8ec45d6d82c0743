// Attachments: which types they conform to, what their loads deliver and on which thread, and the
// colour strings (alpha last).

#include "platform/dispatch.h"
#include "platform/extensionkit/input_item.h"

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonObject>
#include <QThread>

#include <gtest/gtest.h>

#include <condition_variable>
#include <mutex>

#include <atomic>

using namespace zaf::extensionkit;

namespace {

struct LoadOutcome {
    QVariant value;
    zaf::OptionalError error;
    bool onMainThread = true;
    // Standard locking rather than QSemaphore, whose hand-over ThreadSanitizer cannot see.
    std::mutex mutex;
    std::condition_variable arrived;
    bool done = false;
};

// Loads from the main thread and waits (bounded) for the handler.
std::shared_ptr<LoadOutcome> load(const ItemAttachment &attachment, const QString &type)
{
    auto outcome = std::make_shared<LoadOutcome>();
    attachment.loadItemForTypeIdentifier(type, {}, [outcome](const QVariant &value, const zaf::OptionalError &error) {
        std::lock_guard lock(outcome->mutex);
        outcome->value = value;
        outcome->error = error;
        outcome->onMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
        outcome->done = true;
        outcome->arrived.notify_all();
    });
    std::unique_lock lock(outcome->mutex);
    EXPECT_TRUE(outcome->arrived.wait_for(lock, std::chrono::seconds(5), [&] { return outcome->done; })) << "the load handler never ran";
    return outcome;
}

} // namespace

TEST(ColorFromHexString, ParsesSixAndEightDigitFormsWithAlphaLast)
{
    EXPECT_EQ(colorFromHexString("#102030"), QColor(0x10, 0x20, 0x30, 0xff));
    EXPECT_EQ(colorFromHexString("#10203040"), QColor(0x10, 0x20, 0x30, 0x40));
    EXPECT_EQ(colorFromHexString("#aBcDeF80"), QColor(0xab, 0xcd, 0xef, 0x80));
    EXPECT_EQ(colorFromHexString("#FF000000").alpha(), 0);
    for (const char *bad : {"", "#", "102030", "#12345", "#1234567", "#123456789", "#12345g", "#1020304x", " #102030", "#102030 ", "red", "##10203"})
        EXPECT_FALSE(colorFromHexString(QString::fromLatin1(bad)).isValid()) << bad;
}

TEST(ItemAttachment, ConformsToItsOwnTypeAndTheGenericTypeOnlyWhenItHasAMimeType)
{
    const ItemAttachment text("text/plain", "v");
    EXPECT_TRUE(text.hasItemConformingToTypeIdentifier(kTypeIdentifierData));
    EXPECT_TRUE(text.hasItemConformingToTypeIdentifier("text/plain"));
    EXPECT_TRUE(text.hasItemConformingToTypeIdentifier("TEXT/Plain; charset=utf-8"));
    EXPECT_FALSE(text.hasItemConformingToTypeIdentifier("text/html"));
    EXPECT_FALSE(text.hasItemConformingToTypeIdentifier(kTypeIdentifierColor));
    EXPECT_FALSE(text.hasItemConformingToTypeIdentifier("not a type"));

    const ItemAttachment withParameters("text/plain;charset=utf-8", "v");
    EXPECT_TRUE(withParameters.hasItemConformingToTypeIdentifier("text/plain"));

    for (const char *bad : {"", "text", "text/", "/plain", "text/plain/extra", "te xt/plain", "public.data", "*/*", "text/pl ain"}) {
        const ItemAttachment attachment(QString::fromLatin1(bad), "v");
        EXPECT_FALSE(attachment.hasItemConformingToTypeIdentifier(kTypeIdentifierData)) << bad;
        EXPECT_FALSE(attachment.hasItemConformingToTypeIdentifier(QString::fromLatin1(bad))) << bad;
        EXPECT_FALSE(isMimeType(QString::fromLatin1(bad))) << bad;
    }
}

TEST(ItemAttachment, LoadsEveryJsonKindAndColoursUnderEitherTypeOnAGlobalQueueThread)
{
    const ItemAttachment colour(kTypeIdentifierColor, "#11223380");
    const struct {
        ItemAttachment attachment;
        const char *type;
        QVariant expected;
    } cases[] = {
        {ItemAttachment("application/json", "/home/me/rec.mp4"), kTypeIdentifierData, QString("/home/me/rec.mp4")},
        {ItemAttachment("application/json", 2.5), kTypeIdentifierData, 2.5},
        {ItemAttachment("application/json", true), kTypeIdentifierData, true},
        {ItemAttachment("application/json", QJsonArray{1, "a"}), kTypeIdentifierData, QVariantList{1.0, QString("a")}},
        {ItemAttachment("application/json", QJsonObject{{"k", "v"}}), kTypeIdentifierData, QVariantMap{{"k", QString("v")}}},
        {colour, kTypeIdentifierData, QColor(0x11, 0x22, 0x33, 0x80)},
        {colour, kTypeIdentifierColor, QColor(0x11, 0x22, 0x33, 0x80)},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.expected.toString().toStdString());
        const auto outcome = load(c.attachment, c.type);
        EXPECT_FALSE(outcome->error.has_value());
        EXPECT_EQ(outcome->value.metaType(), c.expected.metaType());
        EXPECT_EQ(outcome->value, c.expected);
        EXPECT_FALSE(outcome->onMainThread);
    }
}

TEST(ItemAttachment, LoadFailsOffTheCallingThreadForAMismatchedTypeOrABadValue)
{
    const struct {
        const char *name;
        ItemAttachment attachment;
        const char *type;
        int code;
    } cases[] = {
        {"another type", ItemAttachment("text/plain", "x"), "image/png", ItemAttachmentErrorTypeMismatch},
        {"no type", ItemAttachment("", "x"), kTypeIdentifierData, ItemAttachmentErrorTypeMismatch},
        {"null", ItemAttachment("text/plain", QJsonValue(QJsonValue::Null)), kTypeIdentifierData, ItemAttachmentErrorBadValue},
        {"undefined", ItemAttachment("text/plain", QJsonValue(QJsonValue::Undefined)), kTypeIdentifierData, ItemAttachmentErrorBadValue},
        {"colour name", ItemAttachment(kTypeIdentifierColor, "blue"), kTypeIdentifierData, ItemAttachmentErrorBadValue},
        {"colour number", ItemAttachment(kTypeIdentifierColor, 255), kTypeIdentifierColor, ItemAttachmentErrorBadValue},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        const auto outcome = load(c.attachment, c.type);
        ASSERT_TRUE(outcome->error.has_value());
        EXPECT_EQ(outcome->error->domain, QString::fromLatin1(kItemAttachmentErrorDomain));
        EXPECT_EQ(outcome->error->code, c.code);
        EXPECT_FALSE(outcome->value.isValid());
        EXPECT_FALSE(outcome->onMainThread);
    }
}

TEST(ItemAttachment, ManyConcurrentLoadsFromWorkerThreadsAllComplete)
{
    struct Shared {
        std::mutex mutex;
        std::condition_variable arrived;
        int done = 0;
        int good = 0;
    };
    const auto shared = std::make_shared<Shared>();
    const auto attachment = std::make_shared<ItemAttachment>("text/plain", "value");
    constexpr int kLoads = 64;
    for (int i = 0; i < kLoads; ++i) {
        zaf::dispatch::async(zaf::dispatch::Priority::Background, [shared, attachment] {
            attachment->loadItemForTypeIdentifier(kTypeIdentifierData, {}, [shared](const QVariant &value, const zaf::OptionalError &error) {
                std::lock_guard lock(shared->mutex);
                shared->good += !error && value.toString() == "value";
                ++shared->done;
                shared->arrived.notify_all();
            });
        });
    }
    std::unique_lock lock(shared->mutex);
    ASSERT_TRUE(shared->arrived.wait_for(lock, std::chrono::seconds(10), [&] { return shared->done == kLoads; }));
    EXPECT_EQ(shared->good, kLoads);
}
