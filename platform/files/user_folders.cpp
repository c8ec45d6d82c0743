#include "platform/files/user_folders.h"

#include <QDir>
#include <QStandardPaths>

namespace zaf::files {

QString videosFolder()
{
    const QString movies = QStandardPaths::writableLocation(QStandardPaths::MoviesLocation);
    return movies.isEmpty() ? QDir::homePath() + QStringLiteral("/Videos") : movies;
}

QString videoLibraryFolder()
{
    const QString overridden = qEnvironmentVariable("ZAF_VIDEO_LIBRARY");
    return overridden.isEmpty() ? videosFolder() : overridden;
}

} // namespace zaf::files
