#pragma once

// The host's request, as the extension sees it: input items, each with a title and attachments that
// carry typed values. Types are MIME types; every MIME type conforms to the generic data type.

#include "platform/error.h"

#include <QColor>
#include <QJsonArray>
#include <QJsonValue>
#include <QList>
#include <QString>
#include <QVariant>

#include <functional>
#include <memory>
#include <utility>

namespace zaf::extensionkit {

// The generic data type: the root type of arbitrary data.
inline constexpr const char *kTypeIdentifierData = "application/octet-stream";
// Colours travel as "#RRGGBB" or "#RRGGBBAA" strings of this type and load as QColor.
inline constexpr const char *kTypeIdentifierColor = "application/x-zaf-color";

// The error domain of attachment loads, and its codes.
inline constexpr const char *kItemAttachmentErrorDomain = "zaf.extensionkit.attachment";
enum ItemAttachmentErrorCode : int {
    // The attachment does not conform to the requested type (or has no valid MIME type).
    ItemAttachmentErrorTypeMismatch = 1,
    // The value cannot be loaded: null or absent, or a colour attachment that holds no colour.
    ItemAttachmentErrorBadValue = 2,
};

// True for a MIME type "major/minor" (restricted names, optionally followed by ";" parameters).
bool isMimeType(const QString &type);

class ItemAttachment {
public:
    // Runs on a thread of the global default-priority queue, never inline in the load call: the
    // loaded value, or an error (domain kItemAttachmentErrorDomain).
    using LoadHandler = std::function<void(const QVariant &value, const OptionalError &error)>;

    // Any type string is kept; one that is not a MIME type makes the attachment conform to nothing.
    ItemAttachment(QString typeIdentifier, QJsonValue value);

    QString typeIdentifier() const { return m_type; }
    // True when the attachment's type is a valid MIME type that conforms to `type`: the same type
    // (compared without parameters, case-insensitively), or any MIME type for the generic data type.
    // Any thread.
    bool hasItemConformingToTypeIdentifier(const QString &type) const;
    // Loads the value as `type`, asynchronously: strings as QString, numbers as double, booleans as
    // bool, a colour-typed "#RRGGBB"/"#RRGGBBAA" string as QColor, arrays and objects as QVariant
    // lists and maps. A colour-typed attachment loads as a QColor whether asked for as the colour
    // type or as the generic data type, and one that holds no colour string ends in an error. A type
    // the attachment does not conform to, or a null value, ends in an error. `options` are unused.
    // Any thread; a null handler loads nothing.
    void loadItemForTypeIdentifier(const QString &type, const QVariantMap &options, LoadHandler handler) const;

private:
    std::pair<QVariant, OptionalError> loadNow(const QString &type) const;

    QString m_type;
    QJsonValue m_value;
};

class InputItem {
public:
    InputItem(QString title, QList<std::shared_ptr<ItemAttachment>> attachments);
    // The title as plain text.
    QString attributedTitlePlainString() const { return m_title; }
    const QList<std::shared_ptr<ItemAttachment>> &attachments() const { return m_attachments; }

private:
    QString m_title;
    QList<std::shared_ptr<ItemAttachment>> m_attachments;
};

// The items of a request's "inputItems" array, in order. An item that is not an object, has a
// non-string title or a non-array attachments list is skipped with a logged error; an attachment
// without a MIME type is kept (it conforms to nothing, so readers pass it over). Any thread.
QList<InputItem> inputItemsFromJson(const QJsonArray &array);

// "#RRGGBB" or "#RRGGBBAA" (hex digits of either case, alpha last) to a colour; anything else
// gives an invalid QColor.
QColor colorFromHexString(const QString &text);

} // namespace zaf::extensionkit
