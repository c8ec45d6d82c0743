#include "bench/bench_recordings.h"

#include <QFile>
#include <QProcess>

#include <cstdio>
#include <cstdlib>

namespace zaf::bench {

bool runFfmpeg(const QStringList &args)
{
    QProcess p;
    p.start(QStringLiteral("ffmpeg"), QStringList{QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-y")} + args);
    if (!p.waitForFinished(-1) || p.exitStatus() != QProcess::NormalExit || p.exitCode() != 0) {
        std::fprintf(stderr, "ffmpeg failed: %s\n", p.readAllStandardError().constData());
        return false;
    }
    return true;
}

void makeFixtureMovie(const QString &plain, const zaf::fixture::FixtureSpec &spec)
{
    if (QFile::exists(plain))
        return;
    std::printf("generating %s ...\n", qPrintable(plain));
    std::fflush(stdout);
    if (const zaf::OptionalError e = zaf::fixture::writeFixtureMovie(plain, spec)) {
        std::fprintf(stderr, "cannot make the fixture movie: %s\n", qPrintable(e->message));
        std::exit(1);
    }
}

void encodeRecording(const QString &plain, const QString &recording, int groupFrames, bool fixedGroups)
{
    std::printf("generating %s ...\n", qPrintable(recording));
    std::fflush(stdout);
    const QString partial = recording + QStringLiteral(".part.mp4");
    const QString group = QString::number(groupFrames);
    QStringList args{QStringLiteral("-i"), plain};
    args += QStringLiteral("-map 0 -vf noise=alls=6:allf=t+u -c:v libx264 -preset veryfast -bf 3 -g %1 -crf 20 -c:a copy")
                .arg(group)
                .split(QLatin1Char(' '));
    if (fixedGroups)
        args += {QStringLiteral("-keyint_min"), group, QStringLiteral("-sc_threshold"), QStringLiteral("0")};
    args += partial;
    if (!runFfmpeg(args) || !QFile::rename(partial, recording)) {
        QFile::remove(partial);
        std::exit(1);
    }
}

} // namespace zaf::bench
