#include "tests/support/media/second_decoder.h"

#include "tests/support/media/fixture_movies.h"

#include <QStandardPaths>
#include <QStringList>

#include <gtest/gtest.h>

namespace zaf::test {

bool secondDecoderAvailable()
{
    return !QStandardPaths::findExecutable(QStringLiteral("gst-launch-1.0")).isEmpty();
}

int decodeVideoFramesWithSecondDecoder(const QString &path)
{
    // The sink reports every buffer it takes ("chain" lines with -v): one per decoded picture.
    const ToolRun run = runTool(QStringLiteral("gst-launch-1.0"), QStringList{QStringLiteral("-v"), QStringLiteral("filesrc"), QStringLiteral("location=") + path}
                                    + words("! qtdemux name=demux demux.video_0 ! queue ! avdec_h264 output-corrupt=false ! fakesink silent=false sync=false"));
    const QString out = QString::fromUtf8(run.out);
    const QString err = QString::fromUtf8(run.err);
    // A decoding error is a warning of the decoder, and the picture is dropped (output-corrupt=false).
    const bool complained = (out + err).contains(QLatin1String("ERROR")) || (out + err).contains(QLatin1String("WARNING"));
    if (!run.ok() || complained) {
        ADD_FAILURE() << "GStreamer could not decode " << path.toStdString() << ":\n" << err.toStdString() << out.right(2000).toStdString();
        return -1;
    }
    return int(out.count(QLatin1String("chain   ******* (fakesink")));
}

} // namespace zaf::test
