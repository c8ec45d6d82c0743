#include "publishing/plugin/upload/video_metadata.h"

#include <QJsonDocument>
#include <QJsonObject>

namespace zaf::publishing {

namespace {

QString withoutAngleBrackets(QString text)
{
    text.remove(QLatin1Char('<'));
    text.remove(QLatin1Char('>'));
    return text;
}

Error metadataError(MetadataErrorCode code, const QString &message)
{
    return Error{QString::fromLatin1(kMetadataErrorDomain), code, message};
}

} // namespace

const QList<VideoCategory> &assignableCategories()
{
    static const QList<VideoCategory> categories = {
        {QStringLiteral("1"), QStringLiteral("Film & Animation")},
        {QStringLiteral("2"), QStringLiteral("Autos & Vehicles")},
        {QStringLiteral("10"), QStringLiteral("Music")},
        {QStringLiteral("15"), QStringLiteral("Pets & Animals")},
        {QStringLiteral("17"), QStringLiteral("Sports")},
        {QStringLiteral("19"), QStringLiteral("Travel & Events")},
        {QStringLiteral("20"), QStringLiteral("Gaming")},
        {QStringLiteral("22"), QStringLiteral("People & Blogs")},
        {QStringLiteral("23"), QStringLiteral("Comedy")},
        {QStringLiteral("24"), QStringLiteral("Entertainment")},
        {QStringLiteral("25"), QStringLiteral("News & Politics")},
        {QStringLiteral("26"), QStringLiteral("Howto & Style")},
        {QStringLiteral("27"), QStringLiteral("Education")},
        {QStringLiteral("28"), QStringLiteral("Science & Technology")},
        {QStringLiteral("29"), QStringLiteral("Nonprofits & Activism")},
    };
    return categories;
}

bool isAssignableCategory(const QString &categoryId)
{
    return !categoryLabel(categoryId).isEmpty();
}

QString categoryLabel(const QString &categoryId)
{
    for (const VideoCategory &category : assignableCategories()) {
        if (category.id == categoryId)
            return category.label;
    }
    return {};
}

QString VideoMetadata::normaliseTitle(const QString &title)
{
    const QString cleaned = withoutAngleBrackets(title).trimmed();
    // Count characters (code points), never splitting a surrogate pair.
    qsizetype end = 0;
    int characters = 0;
    while (end < cleaned.size() && characters < kMaxTitleCharacters) {
        end += (cleaned.at(end).isHighSurrogate() && end + 1 < cleaned.size()
                && cleaned.at(end + 1).isLowSurrogate()) ? 2 : 1;
        ++characters;
    }
    const QString cut = cleaned.left(end).trimmed();
    return cut.isEmpty() ? QStringLiteral("Untitled") : cut;
}

QString VideoMetadata::normaliseDescription(const QString &description)
{
    const QByteArray utf8 = withoutAngleBrackets(description).toUtf8();
    if (utf8.size() <= kMaxDescriptionBytes)
        return QString::fromUtf8(utf8);
    // Back up over continuation bytes (10xxxxxx) so the cut falls before a lead byte.
    qsizetype end = kMaxDescriptionBytes;
    while (end > 0 && (static_cast<unsigned char>(utf8.at(end)) & 0xC0) == 0x80)
        --end;
    return QString::fromUtf8(utf8.left(end));
}

QString VideoMetadata::normalisePrivacyStatus(const QString &privacyStatus)
{
    const QString status = privacyStatus.trimmed().toLower();
    if (status == QLatin1String("public") || status == QLatin1String("unlisted")
        || status == QLatin1String("private"))
        return status;
    return {};
}

Result<VideoMetadata> VideoMetadata::normalised() const
{
    VideoMetadata result;
    result.title = normaliseTitle(title);
    result.description = normaliseDescription(description);
    result.categoryId = categoryId.trimmed();
    if (!isAssignableCategory(result.categoryId)) {
        return Result<VideoMetadata>::failure(metadataError(
            InvalidCategoryError,
            QStringLiteral("The category \"%1\" cannot be assigned to a video").arg(categoryId)));
    }
    result.privacyStatus = normalisePrivacyStatus(privacyStatus);
    if (result.privacyStatus.isEmpty()) {
        return Result<VideoMetadata>::failure(metadataError(
            InvalidPrivacyStatusError,
            QStringLiteral("The privacy status \"%1\" is not public, unlisted or private")
                .arg(privacyStatus)));
    }
    return Result<VideoMetadata>::success(result);
}

QByteArray VideoMetadata::toJson() const
{
    QJsonObject snippet;
    snippet.insert(QStringLiteral("title"), title);
    snippet.insert(QStringLiteral("description"), description);
    snippet.insert(QStringLiteral("categoryId"), categoryId);
    QJsonObject status;
    status.insert(QStringLiteral("privacyStatus"), privacyStatus);
    QJsonObject body;
    body.insert(QStringLiteral("snippet"), snippet);
    body.insert(QStringLiteral("status"), status);
    return QJsonDocument(body).toJson(QJsonDocument::Compact);
}

} // namespace zaf::publishing
