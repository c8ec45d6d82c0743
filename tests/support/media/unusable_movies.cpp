#include "tests/support/media/unusable_movies.h"

#include "tests/support/media/fixture_movies.h"

#include <QFile>
#include <gtest/gtest.h>

namespace zaf::test {

namespace {

QString fileOf(const ScratchDir &dir, const QByteArray &bytes)
{
    QFile file(dir.file(QStringLiteral("movie.mp4")));
    EXPECT_TRUE(file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size()) << qPrintable(file.fileName());
    return file.fileName();
}

QByteArray movieBytes()
{
    return fileContents(sharedFixtureMovie({.seconds = 2, .audioTracks = 1}));
}

} // namespace

const std::vector<UnusableMovie> &unusableMovies()
{
    static const std::vector<UnusableMovie> movies{
        {"NothingThere", [](const ScratchDir &dir) { return dir.file(QStringLiteral("nothing-here.mp4")); }},
        {"Empty", [](const ScratchDir &dir) { return fileOf(dir, {}); }},
        {"Text", [](const ScratchDir &dir) { return fileOf(dir, QByteArray("This is a text file, not a movie.\n").repeated(2000)); }},
        {"Directory", [](const ScratchDir &dir) { return dir.path(); }},
        {"FirstHalf", [](const ScratchDir &dir) { return fileOf(dir, movieBytes().left(movieBytes().size() / 2)); }},
        {"LastTwoThirds", [](const ScratchDir &dir) { return fileOf(dir, movieBytes().mid(movieBytes().size() / 3)); }},
    };
    return movies;
}

} // namespace zaf::test
