#include "host/input_items.h"

#include <QRegularExpression>

namespace zaf::host {

InputItem makeTextItem(const QString &title, const QString &text)
{
    return InputItem{title, {Attachment{QString(kTextType), QJsonValue(text)}}};
}

InputItem makeMoviePathItem(const QString &moviePath)
{
    return makeTextItem(ZafVideoEditorExtensionMoviePathKey, moviePath);
}

InputItem makeAppNameItem(const QString &appName)
{
    return makeTextItem(ZafVideoEditorExtensionAppNameKey, appName);
}

InputItem makeBundleIdentifierItem(const QString &bundleIdentifier)
{
    return makeTextItem(ZafVideoEditorExtensionBundleIdentifierKey, bundleIdentifier);
}

InputItem makeFileAttachmentItem(const QString &filePath)
{
    return makeTextItem(ZafVideoEditorExtensionFileAttachmentKey, filePath);
}

InputItem makeShareMessageItem(const QString &message)
{
    return makeTextItem(ZafVideoEditorExtensionOverrideShareMessageKey, message);
}

InputItem makeTintColorItem(int red, int green, int blue, int alpha)
{
    auto hex = [](int component) {
        return QStringLiteral("%1").arg(qBound(0, component, 255), 2, 16, QLatin1Char('0')).toUpper();
    };
    QString text = QLatin1Char('#') + hex(red) + hex(green) + hex(blue);
    if (qBound(0, alpha, 255) != 255)
        text += hex(alpha);
    return InputItem{QString(ZafVideoEditorExtensionOverrideTintColorKey), {Attachment{QString(kColorType), QJsonValue(text)}}};
}

std::optional<InputItem> makeTintColorItem(const QString &colorText)
{
    if (!isColorText(colorText))
        return std::nullopt;
    return InputItem{QString(ZafVideoEditorExtensionOverrideTintColorKey),
                     {Attachment{QString(kColorType), QJsonValue(colorText.toUpper())}}};
}

bool isColorText(const QString &text)
{
    static const QRegularExpression pattern(QStringLiteral("^#([0-9A-Fa-f]{6}|[0-9A-Fa-f]{8})$"));
    return pattern.match(text).hasMatch();
}

std::optional<QList<InputItem>> makeInputItems(const RecordingDetails &details, QString *error)
{
    QList<InputItem> items{makeMoviePathItem(details.moviePath), makeAppNameItem(details.appName),
                           makeBundleIdentifierItem(details.bundleIdentifier)};
    if (details.fileAttachmentPath)
        items.append(makeFileAttachmentItem(*details.fileAttachmentPath));
    if (details.shareMessage)
        items.append(makeShareMessageItem(*details.shareMessage));
    if (details.tintColor) {
        const std::optional<InputItem> tint = makeTintColorItem(*details.tintColor);
        if (!tint) {
            if (error)
                *error = QStringLiteral("not a colour (#RRGGBB or #RRGGBBAA): %1").arg(*details.tintColor);
            return std::nullopt;
        }
        items.append(*tint);
    }
    return items;
}

QJsonObject toJson(const InputItem &item)
{
    QJsonArray attachments;
    for (const Attachment &attachment : item.attachments)
        attachments.append(QJsonObject{{QStringLiteral("type"), attachment.type}, {QStringLiteral("value"), attachment.value}});
    return QJsonObject{{QStringLiteral("title"), item.title}, {QStringLiteral("attachments"), attachments}};
}

QJsonArray toJson(const QList<InputItem> &items)
{
    QJsonArray array;
    for (const InputItem &item : items)
        array.append(toJson(item));
    return array;
}

} // namespace zaf::host
