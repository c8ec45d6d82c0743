#include "tempstore/temp_directory.h"

#include "tempstore/process_directory.h"

#include <cmath>
#include <ctime>

const QString &ZafScreenRecorderTempDirectory()
{
    return zaf::tempstore::processDirectory().path();
}

QString ZafTempMovieFileName(const QString &stem)
{
    return stem + QString::number(qint64(std::time(nullptr))) + QStringLiteral(".mp4");
}

QString ZafTempMovieFileNameAt(const QString &stem, double secondsSince1970)
{
    return stem + QString::number(qint64(std::trunc(secondsSince1970))) + QStringLiteral(".mp4");
}
