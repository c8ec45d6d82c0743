// Attachments: which types they conform to, what their loads deliver and on which thread, and the
// colour strings (alpha last).

#include "platform/dispatch.h"
#include "platform/extensionkit/input_item.h"

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonObject>
#include <QSemaphore>
#include <QThread>

#include <gtest/gtest.h>

#include <mutex>

using namespace zaf::extensionkit;

namespace {

struct LoadOutcome {
    QVariant value;
    zaf::OptionalError error;
    QThread *thread = nullptr;
    bool ranInline = false;
};

// Loads and waits (bounded) for the handler.
LoadOutcome load(const ItemAttachment &attachment, const QString &type)
{
    auto outcome = std::make_shared<LoadOutcome>();
    auto done = std::make_shared<QSemaphore>();
    auto inLoadCall = std::make_shared<bool>(true);
    attachment.loadItemForTypeIdentifier(type, {}, [outcome, done, inLoadCall](const QVariant &value, const zaf::OptionalError &error) {
        outcome->value = value;
        outcome->error = error;
        outcome->thread = QThread::currentThread();
        outcome->ranInline = *inLoadCall && QThread::currentThread() == QCoreApplication::instance()->thread();
        done->release();
    });
    *inLoadCall = false;
    EXPECT_TRUE(done->tryAcquire(1, 5000)) << "the load handler never ran";
    return *outcome;
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

TEST(ItemAttachment, LoadsEveryJsonKindOnAGlobalQueueThread)
{
    struct Case {
        QJsonValue json;
        QVariant expected;
    };
    const QList<Case> cases{
        {QJsonValue("/home/me/rec.mp4"), QVariant(QString("/home/me/rec.mp4"))},
        {QJsonValue(2.5), QVariant(2.5)},
        {QJsonValue(true), QVariant(true)},
        {QJsonValue(QJsonArray{1, "a"}), QVariant(QVariantList{1.0, QString("a")})},
        {QJsonValue(QJsonObject{{"k", "v"}}), QVariant(QVariantMap{{"k", QString("v")}})},
    };
    for (const Case &c : cases) {
        const LoadOutcome outcome = load(ItemAttachment("application/json", c.json), kTypeIdentifierData);
        EXPECT_FALSE(outcome.error.has_value());
        EXPECT_EQ(outcome.value, c.expected);
        EXPECT_NE(outcome.thread, QCoreApplication::instance()->thread());
        EXPECT_FALSE(outcome.ranInline);
    }
}

TEST(ItemAttachment, ColourAttachmentLoadsAsQColorUnderEitherType)
{
    const ItemAttachment colour(kTypeIdentifierColor, "#11223380");
    for (const char *type : {kTypeIdentifierData, kTypeIdentifierColor}) {
        const LoadOutcome outcome = load(colour, type);
        ASSERT_FALSE(outcome.error.has_value()) << type;
        ASSERT_EQ(outcome.value.metaType(), QMetaType::fromType<QColor>());
        EXPECT_EQ(outcome.value.value<QColor>(), QColor(0x11, 0x22, 0x33, 0x80));
    }
    const LoadOutcome notAColour = load(ItemAttachment(kTypeIdentifierColor, "blue"), kTypeIdentifierData);
    ASSERT_TRUE(notAColour.error.has_value());
    EXPECT_EQ(notAColour.error->code, ItemAttachmentErrorBadValue);
    const LoadOutcome numberColour = load(ItemAttachment(kTypeIdentifierColor, 255), kTypeIdentifierColor);
    EXPECT_TRUE(numberColour.error.has_value());
}

TEST(ItemAttachment, LoadFailsOffTheCallingThreadForAMismatchedTypeOrNoValue)
{
    const LoadOutcome mismatch = load(ItemAttachment("text/plain", "x"), "image/png");
    ASSERT_TRUE(mismatch.error.has_value());
    EXPECT_EQ(mismatch.error->domain, QString::fromLatin1(kItemAttachmentErrorDomain));
    EXPECT_EQ(mismatch.error->code, ItemAttachmentErrorTypeMismatch);
    EXPECT_FALSE(mismatch.value.isValid());
    EXPECT_FALSE(mismatch.ranInline);

    const LoadOutcome untyped = load(ItemAttachment("", "x"), kTypeIdentifierData);
    ASSERT_TRUE(untyped.error.has_value());
    EXPECT_EQ(untyped.error->code, ItemAttachmentErrorTypeMismatch);

    for (const QJsonValue &empty : {QJsonValue(QJsonValue::Null), QJsonValue(QJsonValue::Undefined)}) {
        const LoadOutcome outcome = load(ItemAttachment("text/plain", empty), kTypeIdentifierData);
        ASSERT_TRUE(outcome.error.has_value());
        EXPECT_EQ(outcome.error->code, ItemAttachmentErrorBadValue);
    }
}

TEST(ItemAttachment, ManyConcurrentLoadsFromWorkerThreadsAllComplete)
{
    struct Shared {
        QSemaphore done;
        std::mutex mutex;
        int good = 0;
    };
    const auto shared = std::make_shared<Shared>();
    const auto attachment = std::make_shared<ItemAttachment>("text/plain", "value");
    constexpr int kLoads = 64;
    for (int i = 0; i < kLoads; ++i) {
        zaf::dispatch::async(zaf::dispatch::Priority::Background, [shared, attachment] {
            attachment->loadItemForTypeIdentifier(kTypeIdentifierData, {}, [shared](const QVariant &value, const zaf::OptionalError &error) {
                std::lock_guard lock(shared->mutex);
                if (!error && value.toString() == "value")
                    ++shared->good;
                shared->done.release();
            });
        });
    }
    ASSERT_TRUE(shared->done.tryAcquire(kLoads, 10000));
    std::lock_guard lock(shared->mutex);
    EXPECT_EQ(shared->good, kLoads);
}

TEST(InputItem, KeepsTitleAndAttachmentsInOrder)
{
    const InputItem item("ZafVideoEditorExtensionMovieURLKey",
                         {std::make_shared<ItemAttachment>("text/plain", "/a"), std::make_shared<ItemAttachment>("", 1)});
    EXPECT_EQ(item.attributedTitlePlainString(), "ZafVideoEditorExtensionMovieURLKey");
    ASSERT_EQ(item.attachments().size(), 2);
    EXPECT_EQ(item.attachments().at(0)->typeIdentifier(), "text/plain");
    EXPECT_FALSE(item.attachments().at(1)->hasItemConformingToTypeIdentifier(kTypeIdentifierData));
}
