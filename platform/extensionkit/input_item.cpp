#include "platform/extensionkit/input_item.h"

#include "platform/dispatch.h"
#include "platform/extensionkit/extensionkit_log.h"
#include "platform/log.h"

#include <QJsonArray>
#include <QJsonObject>
#include <QRegularExpression>

namespace zaf::extensionkit {

namespace {

// type "/" subtype, each a restricted name (letters, digits and !#$&-^_.+, starting with a letter or
// digit, at most 127 characters), optionally followed by ";" parameters, which are not compared.
QString mimeEssence(const QString &type)
{
    static const QRegularExpression pattern(QStringLiteral(
        "^([A-Za-z0-9][A-Za-z0-9!#$&^_.+-]{0,126}/[A-Za-z0-9][A-Za-z0-9!#$&^_.+-]{0,126})\\s*(;.*)?$"));
    const QRegularExpressionMatch match = pattern.match(type.trimmed());
    if (!match.hasMatch())
        return {};
    return match.captured(1).toLower();
}

int hexDigit(QChar c)
{
    const char16_t u = c.unicode();
    if (u >= u'0' && u <= u'9')
        return u - u'0';
    if (u >= u'a' && u <= u'f')
        return u - u'a' + 10;
    if (u >= u'A' && u <= u'F')
        return u - u'A' + 10;
    return -1;
}

Error loadError(int code, const QString &message)
{
    return Error{QString::fromLatin1(kItemAttachmentErrorDomain), code, message};
}

} // namespace

bool isMimeType(const QString &type)
{
    return !mimeEssence(type).isEmpty();
}

QColor colorFromHexString(const QString &text)
{
    if ((text.size() != 7 && text.size() != 9) || text.at(0) != QLatin1Char('#'))
        return {};
    int components[4] = {0, 0, 0, 255};
    const int count = (text.size() - 1) / 2;
    for (int i = 0; i < count; ++i) {
        const int high = hexDigit(text.at(1 + 2 * i));
        const int low = hexDigit(text.at(2 + 2 * i));
        if (high < 0 || low < 0)
            return {};
        components[i] = high * 16 + low;
    }
    return QColor(components[0], components[1], components[2], components[3]);
}

ItemAttachment::ItemAttachment(QString typeIdentifier, QJsonValue value) : m_type(std::move(typeIdentifier)), m_value(std::move(value)) {}

bool ItemAttachment::hasItemConformingToTypeIdentifier(const QString &type) const
{
    const QString own = mimeEssence(m_type);
    if (own.isEmpty())
        return false;
    const QString wanted = mimeEssence(type);
    if (wanted.isEmpty())
        return false;
    return wanted == QLatin1String(kTypeIdentifierData) || wanted == own;
}

std::pair<QVariant, OptionalError> ItemAttachment::loadNow(const QString &type) const
{
    if (!hasItemConformingToTypeIdentifier(type)) {
        return {QVariant(), loadError(ItemAttachmentErrorTypeMismatch,
                                      QStringLiteral("the attachment of type \"%1\" holds no value of type \"%2\"").arg(m_type, type))};
    }
    if (mimeEssence(m_type) == QLatin1String(kTypeIdentifierColor)) {
        const QColor color = m_value.isString() ? colorFromHexString(m_value.toString()) : QColor();
        if (!color.isValid())
            return {QVariant(), loadError(ItemAttachmentErrorBadValue, QStringLiteral("the colour attachment holds no \"#RRGGBB\" or \"#RRGGBBAA\" string"))};
        return {QVariant::fromValue(color), std::nullopt};
    }
    switch (m_value.type()) {
    case QJsonValue::String: return {m_value.toString(), std::nullopt};
    case QJsonValue::Double: return {m_value.toDouble(), std::nullopt};
    case QJsonValue::Bool: return {m_value.toBool(), std::nullopt};
    case QJsonValue::Array: return {m_value.toArray().toVariantList(), std::nullopt};
    case QJsonValue::Object: return {m_value.toObject().toVariantMap(), std::nullopt};
    case QJsonValue::Null:
    case QJsonValue::Undefined: break;
    }
    return {QVariant(), loadError(ItemAttachmentErrorBadValue, QStringLiteral("the attachment carries no value"))};
}

void ItemAttachment::loadItemForTypeIdentifier(const QString &type, const QVariantMap &options, LoadHandler handler) const
{
    Q_UNUSED(options);
    if (!handler)
        return;
    // The value is converted on the calling thread (the attachment is immutable, so this is cheap
    // and safe); only the delivery goes to the global queue.
    auto [value, error] = loadNow(type);
    dispatch::async(dispatch::Priority::Default, [handler = std::move(handler), value = std::move(value), error = std::move(error)] {
        handler(value, error);
    });
}

InputItem::InputItem(QString title, QList<std::shared_ptr<ItemAttachment>> attachments)
    : m_title(std::move(title)), m_attachments(std::move(attachments))
{
}

QList<InputItem> inputItemsFromJson(const QJsonArray &array)
{
    QList<InputItem> items;
    for (qsizetype i = 0; i < array.size(); ++i) {
        const QJsonValue entry = array.at(i);
        if (!entry.isObject()) {
            log::error(lcExtensionKit(), QStringLiteral("input item %1 is not an object; skipped").arg(i));
            continue;
        }
        const QJsonObject object = entry.toObject();
        const QJsonValue title = object.value(QLatin1String("title"));
        if (!title.isString()) {
            log::error(lcExtensionKit(), QStringLiteral("input item %1 has no string \"title\"; skipped").arg(i));
            continue;
        }
        const QJsonValue attachments = object.value(QLatin1String("attachments"));
        if (!attachments.isArray()) {
            log::error(lcExtensionKit(), QStringLiteral("input item %1 (%2) has no \"attachments\" array; skipped").arg(i).arg(title.toString()));
            continue;
        }
        QList<std::shared_ptr<ItemAttachment>> list;
        const QJsonArray attachmentArray = attachments.toArray();
        for (qsizetype j = 0; j < attachmentArray.size(); ++j) {
            const QJsonObject attachment = attachmentArray.at(j).toObject();
            const QJsonValue type = attachment.value(QLatin1String("type"));
            const QString typeText = type.isString() ? type.toString() : QString();
            if (!isMimeType(typeText)) {
                log::info(lcExtensionKit(), QStringLiteral("attachment %1 of input item %2 (%3) has no MIME type; it conforms to nothing")
                                              .arg(j).arg(i).arg(title.toString()));
            }
            list.append(std::make_shared<ItemAttachment>(typeText, attachment.value(QLatin1String("value"))));
        }
        items.append(InputItem(title.toString(), std::move(list)));
    }
    return items;
}

} // namespace zaf::extensionkit
