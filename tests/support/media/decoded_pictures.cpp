#include "tests/support/media/decoded_pictures.h"

#include "tests/support/media/fixture_movies.h"

#include <QImage>

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>

namespace zaf::test {

namespace {

// The picture as RGB for the frame-number reader: limited-range BT.601, as the fixtures store it.
// The pattern's cells are far apart in colour, so the matrix need not be exact.
QImage rgbImage(const QByteArray &yuv, int width, int height)
{
    const int chromaWidth = (width + 1) / 2, chromaHeight = (height + 1) / 2;
    const auto *luma = reinterpret_cast<const uchar *>(yuv.constData());
    const uchar *cb = luma + width * height, *cr = cb + chromaWidth * chromaHeight;
    QImage image(width, height, QImage::Format_RGB32);
    for (int y = 0; y < height; ++y) {
        auto *line = reinterpret_cast<QRgb *>(image.scanLine(y));
        for (int x = 0; x < width; ++x) {
            const double l = 1.164 * (luma[y * width + x] - 16);
            const int c = (y / 2) * chromaWidth + x / 2;
            const double u = cb[c] - 128, v = cr[c] - 128;
            const auto clamp = [](double value) { return std::clamp(int(std::lround(value)), 0, 255); };
            line[x] = qRgb(clamp(l + 1.596 * v), clamp(l - 0.392 * u - 0.813 * v), clamp(l + 2.017 * u));
        }
    }
    return image;
}

} // namespace

DecodedPictures decodePictures(const QString &moviePath)
{
    // YUV4MPEG carries the size in its header line, then each picture after a "FRAME" line.
    DecodedPictures pictures;
    qsizetype pictureBytes = 0;
    const ToolRun r = runTool(QStringLiteral("ffmpeg"),
                              words("-nostdin -v error -i") << moviePath
                                  << words("-map 0:v:0 -fps_mode passthrough -pix_fmt yuv420p -f yuv4mpegpipe -"),
                              [&](QByteArray &data) {
                                  for (qsizetype line; (line = data.indexOf('\n')) >= 0; ) {
                                      if (pictureBytes == 0) {
                                          for (const QByteArray &field : data.left(line).split(' ')) {
                                              if (field.startsWith('W'))
                                                  pictures.width = field.mid(1).toInt();
                                              else if (field.startsWith('H'))
                                                  pictures.height = field.mid(1).toInt();
                                          }
                                          pictureBytes = qsizetype(pictures.width) * pictures.height
                                                         + 2 * qsizetype((pictures.width + 1) / 2) * ((pictures.height + 1) / 2);
                                          data.remove(0, line + 1);
                                          if (pictureBytes == 0)
                                              return;
                                          continue;
                                      }
                                      if (data.size() < line + 1 + pictureBytes)
                                          return;
                                      pictures.planes.append(data.mid(line + 1, pictureBytes));
                                      pictures.numbers.append(readFrameNumber(rgbImage(pictures.planes.last(), pictures.width, pictures.height)));
                                      data.remove(0, line + 1 + pictureBytes);
                                  }
                              });
    if (!r.ok() || pictureBytes == 0 || !r.out.isEmpty()) {
        ADD_FAILURE() << "ffmpeg did not decode every picture of " << qPrintable(moviePath) << ": " << r.err.trimmed().toStdString();
        return {};
    }
    return pictures;
}

double psnr(QByteArrayView a, QByteArrayView b)
{
    if (a.size() != b.size() || a.isEmpty())
        return 0;
    double squares = 0;
    for (qsizetype i = 0; i < a.size(); ++i) {
        const int d = int(uchar(a[i])) - int(uchar(b[i]));
        squares += d * d;
    }
    return squares == 0 ? std::numeric_limits<double>::infinity() : 10 * std::log10(255.0 * 255.0 * double(a.size()) / squares);
}

} // namespace zaf::test
