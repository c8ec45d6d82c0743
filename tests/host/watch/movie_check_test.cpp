// The check a file passes before --watch offers it: real movies made by ffmpeg in the layouts
// recorders write (the index at the end, at the start, fragmented, QuickTime), cut-short copies of
// them, a Matroska movie, box layouts written by hand for the edges of the rule, and things that
// are not regular files.
#include "host/watch/movie_check.h"
#include "tests/support/child_process.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QHash>
#include <QStandardPaths>

#include <gtest/gtest.h>

#include <functional>
#include <optional>

#include <sys/stat.h>

namespace zaf::host::watch {
namespace {

ZAF_PRINT_CASES_AS_NAMES

// A box: its size field (by default the real size), its type, then `payload` zero bytes.
QByteArray box(const char *type, int payload, std::optional<quint32> sizeField = std::nullopt)
{
    const quint32 field = sizeField.value_or(quint32(8 + payload));
    QByteArray bytes;
    for (int shift = 24; shift >= 0; shift -= 8)
        bytes += char((field >> shift) & 0xff);
    return bytes + QByteArray(type, 4) + QByteArray(payload, '\0');
}

// A box whose size is in the 64-bit field.
QByteArray largeBox(const char *type, int payload)
{
    QByteArray bytes = box(type, 0, 1);
    const quint64 size = 16 + quint64(payload);
    for (int shift = 56; shift >= 0; shift -= 8)
        bytes += char((size >> shift) & 0xff);
    return bytes + QByteArray(payload, '\0');
}

// The test files, in a scratch folder of the test program's own; each movie is made when a case
// first asks for it (every case runs in a process of its own under ctest).
struct TestFiles {
    test::ScratchDir scratch;

    static const TestFiles &get()
    {
        static const TestFiles files;
        return files;
    }
    // One of the ffmpeg movies, made on first use; empty when ffmpeg cannot make it.
    QString movie(const char *name) const
    {
        static const QHash<QString, QStringList> layouts{
            {QStringLiteral("index-at-end.mp4"), {}},
            {QStringLiteral("index-first.mp4"), {"-movflags", "+faststart"}},
            {QStringLiteral("fragmented.mp4"), {"-movflags", "frag_keyframe+empty_moov"}},
            {QStringLiteral("quicktime.mov"), {"-f", "mov"}},
            {QStringLiteral("matroska.mp4"), {"-f", "matroska"}},
        };
        const QString path = scratch.file(QLatin1String(name));
        if (QFileInfo::exists(path))
            return path;
        const QStringList source{"-v", "error", "-f", "lavfi", "-i", "testsrc=size=64x48:rate=10", "-t", "1",
                                 "-c:v", "libx264", "-pix_fmt", "yuv420p"};
        const bool made = !QStandardPaths::findExecutable(QStringLiteral("ffmpeg")).isEmpty()
            && test::runChild(QStringLiteral("ffmpeg"), source + layouts.value(QLatin1String(name)) + QStringList{path}).ok();
        return made ? path : QString();
    }
    // A copy of a movie cut to `fraction` of its size.
    QString cut(const char *name, double fraction) const
    {
        const QByteArray bytes = test::fileContents(movie(name));
        if (bytes.isEmpty())
            return {};
        return write(QStringLiteral("cut-%1-%2").arg(fraction).arg(QLatin1String(name)), bytes.left(qsizetype(bytes.size() * fraction)));
    }
    QString write(const QString &name, const QByteArray &bytes) const
    {
        QFile file(scratch.file(name));
        if (file.open(QIODevice::WriteOnly))
            file.write(bytes);
        return file.fileName();
    }
};

struct CheckCase {
    const char *name;
    std::function<QString(const TestFiles &)> file;
    MovieVerdict verdict;
};

class MovieFileCheck : public ::testing::TestWithParam<CheckCase> {};

TEST_P(MovieFileCheck, TellsACompleteMovieFromEverythingElse)
{
    const QString file = GetParam().file(TestFiles::get());
    if (file.isEmpty())
        GTEST_SKIP() << "ffmpeg could not make the test movie";
    const MovieCheck check = checkMovieFile(file);
    EXPECT_EQ(check.verdict, GetParam().verdict) << check.reason.toStdString();
    EXPECT_EQ(check.reason.isEmpty(), GetParam().verdict == MovieVerdict::Movie) << check.reason.toStdString();
}

using V = MovieVerdict;
const QByteArray kFtyp = box("ftyp", 8);

INSTANTIATE_TEST_SUITE_P(
    Files, MovieFileCheck,
    ::testing::Values(
        CheckCase{"IndexAtTheEnd", [](const TestFiles &f) { return f.movie("index-at-end.mp4"); }, V::Movie},
        CheckCase{"IndexFirst", [](const TestFiles &f) { return f.movie("index-first.mp4"); }, V::Movie},
        CheckCase{"Fragmented", [](const TestFiles &f) { return f.movie("fragmented.mp4"); }, V::Movie},
        CheckCase{"QuickTime", [](const TestFiles &f) { return f.movie("quicktime.mov"); }, V::Movie},
        CheckCase{"IndexAtTheEndCutShort", [](const TestFiles &f) { return f.cut("index-at-end.mp4", 0.6); }, V::Incomplete},
        CheckCase{"IndexFirstCutShort", [](const TestFiles &f) { return f.cut("index-first.mp4", 0.6); }, V::Incomplete},
        CheckCase{"FragmentedCutShort", [](const TestFiles &f) { return f.cut("fragmented.mp4", 0.8); }, V::Incomplete},
        CheckCase{"OnlySixBytes", [](const TestFiles &f) { return f.write("six.mp4", kFtyp.left(6)); }, V::NotMpeg4},
        CheckCase{"Matroska", [](const TestFiles &f) { return f.movie("matroska.mp4"); }, V::NotMpeg4},
        CheckCase{"Empty", [](const TestFiles &f) { return f.write("empty.mp4", {}); }, V::Incomplete},
        CheckCase{"MediaStillOpenToTheEnd", [](const TestFiles &f) { return f.write("open.mp4", kFtyp + box("mdat", 64, 0)); }, V::Incomplete},
        CheckCase{"IndexThenMediaToTheEnd", [](const TestFiles &f) { return f.write("to-end.mp4", kFtyp + box("moov", 8) + box("mdat", 64, 0)); }, V::Movie},
        CheckCase{"LargeSizes", [](const TestFiles &f) { return f.write("large.mp4", kFtyp + largeBox("mdat", 64) + largeBox("moov", 8)); }, V::Movie},
        CheckCase{"BoxShorterThanItsHeader", [](const TestFiles &f) { return f.write("short.mp4", kFtyp + box("moov", 8) + box("free", 0, 4)); }, V::NotMpeg4},
        CheckCase{"NoIndex", [](const TestFiles &f) { return f.write("no-moov.mp4", kFtyp + box("mdat", 64)); }, V::Incomplete},
        CheckCase{"Missing", [](const TestFiles &f) { return f.scratch.file("missing.mp4"); }, V::NotAFile},
        CheckCase{"Fifo", [](const TestFiles &f) { ::mkfifo(QFile::encodeName(f.scratch.file("fifo.mp4")).constData(), 0600); return f.scratch.file("fifo.mp4"); }, V::NotAFile},
        CheckCase{"LinkToAMovie", [](const TestFiles &f) {
            const QString movie = f.movie("index-first.mp4");
            return !movie.isEmpty() && QFile::link(movie, f.scratch.file("link.mp4")) ? f.scratch.file("link.mp4") : QString(); }, V::NotAFile}),
    test::caseName);

struct NameCase {
    const char *name;
    const char *fileName;
    bool partial;
};

class PartialName : public ::testing::TestWithParam<NameCase> {};

TEST_P(PartialName, IsToldFromTheNameAlone)
{
    EXPECT_EQ(isPartialName(QLatin1String(GetParam().fileName)), GetParam().partial);
}

INSTANTIATE_TEST_SUITE_P(
    Names, PartialName,
    ::testing::Values(NameCase{"Movie", "Screencast from 2024-05-01 10-00-00.mp4", false},
                      NameCase{"NoExtension", "recording", false},
                      NameCase{"Hidden", ".recording.mp4", true},
                      NameCase{"OurOwnPartial", ".movie.mp4.partial-Ab12Cd", true},
                      NameCase{"SuffixInAnyCase", "movie.mp4.PART", true},
                      NameCase{"Tmp", "movie.tmp", true},
                      NameCase{"Crdownload", "movie.mp4.crdownload", true},
                      NameCase{"Backup", "movie.mp4~", true}),
    test::caseName);

} // namespace
} // namespace zaf::host::watch
