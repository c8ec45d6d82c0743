#include "tempstore/temp_directory.h"

#include <QDir>

#include <cmath>
#include <ctime>

namespace {

QString withTrailingSlash(QString path)
{
    if (!path.endsWith(QLatin1Char('/')))
        path += QLatin1Char('/');
    return path;
}

QString resolveTempDirectory()
{
    const QString overridden = qEnvironmentVariable("ZAF_TEMP_DIRECTORY");
    if (!overridden.isEmpty())
        return withTrailingSlash(QDir::cleanPath(QDir::current().absoluteFilePath(overridden)));
    QString cache = qEnvironmentVariable("XDG_CACHE_HOME");
    // The base directory specification ignores relative paths.
    if (cache.isEmpty() || !QDir::isAbsolutePath(cache))
        cache = QDir::homePath() + QStringLiteral("/.cache");
    return withTrailingSlash(QDir::cleanPath(cache) + QStringLiteral("/Zafrel"));
}

} // namespace

const QString &ZafScreenRecorderTempDirectory()
{
    static const QString path = resolveTempDirectory();
    return path;
}

QString ZafTempMovieFileName(const QString &stem)
{
    return stem + QString::number(qint64(std::time(nullptr))) + QStringLiteral(".mp4");
}

QString ZafTempMovieFileNameAt(const QString &stem, double secondsSince1970)
{
    return stem + QString::number(qint64(std::trunc(secondsSince1970))) + QStringLiteral(".mp4");
}
