// The host channel as the extension reads it: a byte stream of length-prefixed frames, each a
// JSON-RPC message, and in a beginExtensionRequest the input items with their attachments.
//
// Input: byte 0 chooses how the stream is cut into reads (0: one read; n: reads of 1 to n+1 bytes),
// the rest is the stream. The same stream is also fed in one read to a second decoder, and both
// must see the same frames.

#include "fuzz_support.h"

#include "platform/extensionkit/frame_codec.h"
#include "platform/extensionkit/input_item.h"
#include "platform/extensionkit/json_rpc.h"

#include <QJsonArray>
#include <QJsonObject>
#include <QSemaphore>
#include <QUrl>

#include <cstddef>
#include <cstdint>

namespace kit = zaf::extensionkit;
namespace rpc = zaf::extensionkit::jsonrpc;

namespace {

// Our answers must always be messages the host can read back.
void checkAnswer(const QJsonObject &answer, rpc::MessageKind kind)
{
    const rpc::ParseResult reparsed = rpc::parseMessage(rpc::serialize(answer));
    ZAF_FUZZ_CHECK(reparsed.ok());
    ZAF_FUZZ_CHECK(reparsed.message->kind == kind);
}

// Loads an attachment as the extension does (as the generic data type, delivered on a global-queue
// thread) and waits for the value.
QVariant loadAsData(const kit::ItemAttachment &attachment)
{
    QSemaphore done;
    QVariant loaded;
    attachment.loadItemForTypeIdentifier(QString::fromLatin1(kit::kTypeIdentifierData), {},
                                         [&](const QVariant &value, const zaf::OptionalError &error) {
                                             if (!error)
                                                 loaded = value;
                                             done.release();
                                         });
    done.acquire();
    return loaded;
}

// The extension reads the first attachment of each item that conforms to the generic type, and
// turns the value into a colour or a file URL by the item's title.
void readItems(const QJsonArray &array)
{
    const QList<kit::InputItem> items = kit::inputItemsFromJson(array);
    ZAF_FUZZ_CHECK(items.size() <= array.size());
    for (const kit::InputItem &item : items) {
        for (const auto &attachment : item.attachments()) {
            ZAF_FUZZ_CHECK(attachment != nullptr);
            const bool conforms = attachment->hasItemConformingToTypeIdentifier(QString::fromLatin1(kit::kTypeIdentifierData));
            ZAF_FUZZ_CHECK(conforms == kit::isMimeType(attachment->typeIdentifier()));
            attachment->hasItemConformingToTypeIdentifier(QString::fromLatin1(kit::kTypeIdentifierColor));
        }
        if (item.attachments().isEmpty() || !item.attachments().first()->hasItemConformingToTypeIdentifier(QString::fromLatin1(kit::kTypeIdentifierData)))
            continue;
        const QVariant value = loadAsData(*item.attachments().first());
        if (value.metaType() != QMetaType::fromType<QColor>())
            kit::colorFromHexString(value.toString());
        QUrl::fromLocalFile(value.toString());
    }
}

void handlePayload(const QByteArray &payload)
{
    const rpc::ParseResult parsed = rpc::parseMessage(payload);
    if (!parsed.ok()) {
        ZAF_FUZZ_CHECK(parsed.errorCode == rpc::ParseError || parsed.errorCode == rpc::InvalidRequest);
        if (parsed.answerId) {
            ZAF_FUZZ_CHECK(rpc::isValidId(*parsed.answerId));
            checkAnswer(rpc::makeError(*parsed.answerId, parsed.errorCode, parsed.errorText), rpc::MessageKind::ErrorResponse);
        }
        return;
    }
    const rpc::Message &message = *parsed.message;
    if (message.kind != rpc::MessageKind::Request)
        return;
    ZAF_FUZZ_CHECK(rpc::isValidId(message.id));
    if (message.method != QLatin1String("beginExtensionRequest")) {
        checkAnswer(rpc::makeError(message.id, rpc::MethodNotFound, QStringLiteral("method not found: %1").arg(message.method)),
                    rpc::MessageKind::ErrorResponse);
        return;
    }
    const QJsonValue items = message.params.toObject().value(QLatin1String("inputItems"));
    if (!message.params.isObject() || !items.isArray())
        return;
    readItems(items.toArray());
    checkAnswer(rpc::makeResult(message.id, QJsonObject{{QStringLiteral("accepted"), true}}), rpc::MessageKind::Response);
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    zaf::fuzz::setUpOnce();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    if (size < 1)
        return 0;
    const unsigned cut = data[0];
    const char *stream = reinterpret_cast<const char *>(data + 1);
    const qsizetype length = qsizetype(size - 1);

    kit::FrameDecoder pieces;
    std::uint32_t state = cut * 2654435761u | 1u;
    QList<QByteArray> frames;
    for (qsizetype at = 0; at < length;) {
        qsizetype read = length - at;
        if (cut != 0) {
            state ^= state << 13;
            state ^= state >> 17;
            state ^= state << 5;
            read = std::min<qsizetype>(read, 1 + qsizetype(state % (cut + 1)));
        }
        const bool fed = pieces.feed(stream + at, read);
        frames += pieces.takeFrames();
        if (!fed)
            break;
        at += read;
    }

    kit::FrameDecoder whole;
    whole.feed(stream, length);
    ZAF_FUZZ_CHECK(whole.takeFrames() == frames);
    ZAF_FUZZ_CHECK(whole.hasError() == pieces.hasError());
    if (!pieces.hasError()) {
        qsizetype framed = pieces.pendingBytes();
        for (const QByteArray &frame : frames)
            framed += kit::kFrameHeaderSize + frame.size();
        ZAF_FUZZ_CHECK(framed == length);
    }

    for (const QByteArray &payload : frames) {
        ZAF_FUZZ_CHECK(payload.size() <= qsizetype(kit::kDefaultMaxFrameLength));
        handlePayload(payload);
    }
    return 0;
}
