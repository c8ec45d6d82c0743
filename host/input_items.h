#pragma once

// The input items a host hands to the video editor extension: one item per value, the item's title
// is the key text and its first attachment carries the value as a MIME-typed JSON value.
//
// Plain values (paths, names, texts) travel as "text/plain" strings; the tint colour travels
// as an "application/x-zaf-color" string "#RRGGBB" or "#RRGGBBAA".
//
// Threads: plain values and free functions, usable from any thread.

#include <QJsonArray>
#include <QJsonObject>
#include <QJsonValue>
#include <QLatin1String>
#include <QList>
#include <QString>

#include <optional>

namespace zaf::host {

// The six key texts, i.e. the titles of the items. The movie's key text is "...MovieURLKey" although
// its value is a plain path.
inline constexpr QLatin1String ZafVideoEditorExtensionMoviePathKey{"ZafVideoEditorExtensionMovieURLKey"};
inline constexpr QLatin1String ZafVideoEditorExtensionAppNameKey{"ZafVideoEditorExtensionAppNameKey"};
inline constexpr QLatin1String ZafVideoEditorExtensionBundleIdentifierKey{"ZafVideoEditorExtensionBundleIdentifierKey"};
inline constexpr QLatin1String ZafVideoEditorExtensionFileAttachmentKey{"ZafVideoEditorExtensionFileAttachmentKey"};
inline constexpr QLatin1String ZafVideoEditorExtensionOverrideShareMessageKey{"ZafVideoEditorExtensionOverrideShareMessageKey"};
inline constexpr QLatin1String ZafVideoEditorExtensionOverrideTintColorKey{"ZafVideoEditorExtensionOverrideTintColorKey"};

inline constexpr QLatin1String kTextType{"text/plain"};
inline constexpr QLatin1String kColorType{"application/x-zaf-color"};

struct Attachment {
    QString type;
    QJsonValue value;
};

struct InputItem {
    QString title;
    QList<Attachment> attachments;
};

// An item whose one attachment is `text` as "text/plain".
InputItem makeTextItem(const QString &title, const QString &text);

InputItem makeMoviePathItem(const QString &moviePath);
InputItem makeAppNameItem(const QString &appName);
InputItem makeBundleIdentifierItem(const QString &bundleIdentifier);
InputItem makeFileAttachmentItem(const QString &filePath);
InputItem makeShareMessageItem(const QString &message);
// The colour as "#RRGGBB" when fully opaque, "#RRGGBBAA" otherwise (upper-case hex digits).
InputItem makeTintColorItem(int red, int green, int blue, int alpha = 255);
// `colorText` must satisfy isColorText(); it is sent upper-cased. Nullopt for anything else.
std::optional<InputItem> makeTintColorItem(const QString &colorText);

// True for "#RRGGBB" and "#RRGGBBAA" (hex digits of either case).
bool isColorText(const QString &text);

// What a recording hands to the editor; the optional values are left out of the items when unset.
struct RecordingDetails {
    QString moviePath;
    QString appName;
    QString bundleIdentifier;
    std::optional<QString> fileAttachmentPath;
    std::optional<QString> shareMessage;
    std::optional<QString> tintColor; // "#RRGGBB" or "#RRGGBBAA"
};

// The standard items: the three required ones, then each optional one that is set. Nullopt (with
// `error` filled) when the tint colour is not a colour text.
std::optional<QList<InputItem>> makeInputItems(const RecordingDetails &details, QString *error = nullptr);

// {"title": ..., "attachments": [{"type": ..., "value": ...}, ...]}
QJsonObject toJson(const InputItem &item);
QJsonArray toJson(const QList<InputItem> &items);

} // namespace zaf::host
