#include "editor/date_extensions.h"

#include "platform/files/file_manager.h"
#include "platform/text/date_format.h"

#include <chrono>

std::optional<QDateTime> ZafDateExtensions::_srGetCreationDateForFile(const QUrl &fileURL)
{
    const zaf::Result<zaf::FileAttributes> attributes =
        zaf::FileManager::defaultManager().attributesOfItemAtPath(fileURL.toLocalFile());
    if (!attributes.ok())
        return std::nullopt;
    const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(
        attributes.value->creationDate.time_since_epoch());
    return QDateTime::fromMSecsSinceEpoch(ms.count());
}

QString ZafDateExtensions::_srGetStringFromDate(const std::optional<QDateTime> &date)
{
    if (!date)
        return QString();
    return zaf::text::formatDate(*date, QStringLiteral("MMMM d hh:mm a"));
}
