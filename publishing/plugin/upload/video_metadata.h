#pragma once

// The metadata a new video is published with, and the rules the video service puts on it.
//
// normalised() turns what the person typed into something the service accepts: the title is trimmed,
// loses its angle brackets, is cut to 100 characters and falls back to "Untitled"; the description
// loses its angle brackets and is cut to 5000 UTF-8 bytes on a character boundary. The category and
// the privacy status cannot be repaired and are reported as errors instead.
// Plain values; usable from any thread.

#include "platform/error.h"

#include <QByteArray>
#include <QList>
#include <QString>

namespace zaf::publishing {

inline constexpr const char *kMetadataErrorDomain = "zaf.publishing.metadata";

enum MetadataErrorCode {
    InvalidCategoryError = 1,
    InvalidPrivacyStatusError = 2,
};

// A category a video can be filed under in the US region, with its English label.
struct VideoCategory {
    QString id;
    QString label;
};

// The assignable US categories in the service's order: 1, 2, 10, 15, 17, 19, 20, 22 ... 29.
const QList<VideoCategory> &assignableCategories();
bool isAssignableCategory(const QString &categoryId);
// The English label of an assignable category, empty for any other id.
QString categoryLabel(const QString &categoryId);

struct VideoMetadata {
    static constexpr int kMaxTitleCharacters = 100;
    static constexpr int kMaxDescriptionBytes = 5000;
    static constexpr const char *kGamingCategory = "20";

    QString title;
    QString description;
    QString categoryId = QString::fromLatin1(kGamingCategory);
    // "public", "unlisted" or "private".
    QString privacyStatus = QStringLiteral("private");

    // The title as it will be sent (see the comment at the top).
    static QString normaliseTitle(const QString &title);
    // The description as it will be sent (see the comment at the top).
    static QString normaliseDescription(const QString &description);
    // "public", "unlisted" or "private" from any letter case and surrounding spaces; empty when the
    // text names no privacy status.
    static QString normalisePrivacyStatus(const QString &privacyStatus);

    // A copy with every field normalised, or the error naming the field that cannot be repaired.
    Result<VideoMetadata> normalised() const;

    // {"snippet":{"title","description","categoryId"},"status":{"privacyStatus"}} of the fields as
    // they are; call it on a normalised() copy.
    QByteArray toJson() const;
};

} // namespace zaf::publishing
