#pragma once

// Every picture of a movie as the ffmpeg tool decodes it, held in memory, to compare an export's
// pictures with its source's pixel for pixel. Fixture movies are small, so a few seconds of them
// take a few tens of megabytes.

#include <QByteArray>
#include <QByteArrayView>
#include <QList>
#include <QString>

namespace zaf::test {

// The pictures of the first video stream in presentation order, as displayed (the display rotation
// applied, every decoded picture exactly once), each in planar 4:2:0: the luma plane, then the two
// chroma planes.
struct DecodedPictures {
    int width = 0;
    int height = 0;
    QList<QByteArray> planes;
    // The number each picture shows (see readFrameNumber), or -1.
    QList<int> numbers;
};
// Runs on the calling thread. Empty, with a test failure, when ffmpeg cannot decode the movie.
DecodedPictures decodePictures(const QString &moviePath);

// The peak signal-to-noise ratio in dB of two runs of 8-bit samples of one size (a plane, or a
// whole picture's planes); infinity when they are identical, 0 when their sizes differ.
double psnr(QByteArrayView a, QByteArrayView b);

} // namespace zaf::test
